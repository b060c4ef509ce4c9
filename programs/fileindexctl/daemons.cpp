#include "programs/fileindexctl/daemons.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "base/file.h"
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

/// A monitor of a version that has no socket yet.
bool IsOldMonitorUp() {
    constexpr const char* kLock = "/var/lib/kesto/monitor-state/lock";
    base::UniqueFd fd;
    return access(kLock, F_OK) == 0 &&
           base::TryLock(AT_FDCWD, kLock, true, 0600, fd) == base::LockAttempt::kBusy;
}

}  // namespace

DaemonState AskDaemon(const Daemon& daemon, const std::string& request, const Json::Value& data) {
    Json::Value message(Json::objectValue);
    message[daemon.member] = request;
    message["data"] = data;
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
        state.reach = Reach::kRefused;
        return state;
    }
    state.reach = Reach::kReplied;
    state.data = parsed["data"];
    return state;
}

DaemonState AskState(const Daemon& daemon) {
    DaemonState state = AskDaemon(daemon, "state");
    if (state.reach == Reach::kNotRunning && daemon.name == kMonitor.name && IsOldMonitorUp()) {
        state.reach = Reach::kRefused;
    }
    if (state.reach == Reach::kReplied && !state.data.isObject()) {
        state = {Reach::kRefused, Json::Value(Json::objectValue)};
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
        case Reach::kReplied:
            break;
    }
    return std::string();
}

}  // namespace quivra::ctl
