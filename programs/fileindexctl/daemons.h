#pragma once

#include <json/json.h>

#include <chrono>
#include <string>

namespace quivra::ctl {

/// One of the daemons that indexing needs, and how a front end reaches it.
struct Daemon {
    const char* name;     ///< "kestotifyd"
    const char* socket;   ///< where it listens
    const char* service;  ///< what service managers call it
    const char* member;   ///< of a request: what holds its name, "type" or "command"
    const char* without;  ///< what does not happen while it is down
};

extern const Daemon kIndexer;
extern const Daemon kSearchDaemon;
extern const Daemon kMonitor;

/// How long a daemon may take to say how it is. One whose main loop turns takes milliseconds.
inline constexpr std::chrono::seconds kReplyLimit{2};

/// How a daemon is, as it says itself.
struct DaemonState {
    enum class Reach {
        kReplied,     ///< `data` is what it says
        kRefused,     ///< it runs, but refuses the question, or its reply makes no sense
        kSilent,      ///< it runs, and does not reply in time
        kNotRunning,  ///< nobody listens at its socket
        kDenied,      ///< it serves root only
    };

    Reach reach = Reach::kNotRunning;
    Json::Value data{Json::objectValue};
    std::string refusal{};  ///< of kRefused: its reason

    /// It takes requests.
    bool IsUp() const { return reach == Reach::kReplied || reach == Reach::kRefused; }
};

/// Sends one request of this name to the daemon and waits for the reply, kReplyLimit at most. The
/// request's data is `data`; a reply that is not as agreed on counts as kRefused.
DaemonState AskDaemon(const Daemon& daemon, const std::string& request,
                      const Json::Value& data = Json::Value(Json::objectValue));

/// Its "state": an object, which is empty unless the daemon told it.
DaemonState AskState(const Daemon& daemon);

/// What is wrong with the daemon and what to do, as one sentence with its full stop; empty when it
/// replied.
std::string DescribeProblem(const Daemon& daemon, const DaemonState& state);

}  // namespace quivra::ctl
