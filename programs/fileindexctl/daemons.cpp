#include "programs/fileindexctl/daemons.h"

#include <cerrno>

#include "base/frame.h"
#include "common/json.h"
#include "fileindex/communication.h"
#include "fileindex/elastic/protocol.h"

namespace quivra::ctl {

using Reach = DaemonState::Reach;

const Daemon kIndexer = {"fileindexd", fileindex::kFileIndexDaemonSocketPath,
                         "pkg-Quivra-fileindexd", "type", "changes wait in the queues"};
const Daemon kSearchDaemon = {"kestoelasticd", fileindex::elastic::kSearchDaemonSocketPath,
                              "kestoelasticd", "command", "nothing can be found or indexed"};
const Daemon kMonitor = {"kestotifyd", "/var/run/kestotifyd.sock", "kestotifyd", "type",
                         "changes of files are not noticed"};

namespace {

/// States are lists of shares and folders: some hundred bytes each.
constexpr std::size_t kMaxReply = std::size_t{64} << 20;

Reach ReachAfterFailure() {
    switch (errno) {
        case ENOENT:
        case ECONNREFUSED:
            return Reach::kNotRunning;
        case EACCES:
        case EPERM:
            return Reach::kDenied;
        default:
            return Reach::kSilent;
    }
}

DaemonState Refused(const Json::Value& error) {
    const bool has_reason = error.isObject() && error["msg"].isString();
    DaemonState state;
    state.reach = Reach::kRefused;
    state.refusal = has_reason ? error["msg"].asString() : "its reply makes no sense";
    return state;
}

}  // namespace

DaemonState AskDaemon(const Daemon& daemon, const std::string& request, const Json::Value& data) {
    Json::Value message(Json::objectValue);
    message[daemon.member] = request;
    message["data"] = data;
    // One deadline for the whole exchange: a daemon that sends a byte a second is silent, too.
    const base::Deadline deadline = std::chrono::steady_clock::now() + kReplyLimit;
    DaemonState state;
    const base::UniqueFd socket = base::ConnectUnix(daemon.socket, deadline);
    std::string reply;
    if (!socket.IsValid() || !base::SendFrame(socket.Get(), toString(message), deadline) ||
        !base::ReceiveFrame(socket.Get(), reply, kMaxReply, deadline)) {
        // A daemon that ends just now has closed the connection: it will not reply any more.
        state.reach =
            errno == ECONNRESET || errno == EPIPE ? Reach::kNotRunning : ReachAfterFailure();
        return state;
    }
    Json::Value parsed;
    if (!fromString(parsed, reply) || !parsed.isObject() || parsed["success"] != true) {
        return Refused(parsed.isObject() ? parsed["error"] : Json::Value());
    }
    state.reach = Reach::kReplied;
    state.data = parsed["data"];
    return state;
}

DaemonState AskState(const Daemon& daemon) {
    DaemonState state = AskDaemon(daemon, "state");
    if (state.reach == Reach::kReplied && !state.data.isObject()) {
        return Refused(Json::Value());
    }
    return state;
}

std::string DescribeProblem(const Daemon& daemon, const DaemonState& state) {
    const std::string name = daemon.name;
    const std::string service = std::string("'service ") + daemon.service;
    switch (state.reach) {
        case Reach::kNotRunning:
            return name + " is not running: " + daemon.without + "; " + service +
                   " start' starts it.";
        case Reach::kSilent:
            return name + " runs and does not reply: " + daemon.without + "; " + service +
                   " restart' helps.";
        case Reach::kDenied:
            return name + " serves root only: permission denied, run this as root.";
        case Reach::kRefused:
            return name + " does not tell how it is (" + state.refusal + "); " + service +
                   " restart' helps.";
        case Reach::kReplied:
            break;
    }
    return std::string();
}

}  // namespace quivra::ctl
