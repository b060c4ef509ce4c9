#pragma once

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <list>
#include <map>
#include <optional>
#include <set>
#include <string>

#include "programs/fileindexd/commands.h"
#include "programs/fileindexd/supervisor.h"

namespace fileindexd {

/// Decides which shares have a worker: those with a folder that is not paused, unless all indexing
/// is paused. A share whose worker a command created or deleted keeps to that until its settings
/// change, because the folders file is changed before or after the command. Single-threaded, and
/// takes no lock that a client may hold.
class Controller {
  public:
    using Clock = Supervisor::Clock;
    using Reply = std::function<void(const std::string& text)>;

    /// Reads the pause state and the folder set; throws what these do.
    explicit Controller(Supervisor& supervisor);

    /// Carries a command out and replies: at once, or, when a worker has to stop first, in an
    /// Update to come. kFailed is not this class's matter.
    void Execute(const Command& command, Reply reply, Clock::time_point now);

    /// Reads the pause state and the folder set again; throws what these do.
    void Reload(Clock::time_point now);

    /// To be called when Due says so, and when a child process has ended.
    void Update(Clock::time_point now);
    std::optional<Clock::time_point> Due(Clock::time_point now) const;

    /// Stops all workers; IsStopped tells when.
    void ShutDown(Clock::time_point now);
    bool IsStopped() const { return !supervisor_.IsAnyRunning(); }

  private:
    struct Waiting {
        std::string share;
        Reply reply;
        Clock::time_point until;
        bool is_dropped;  ///< the share has no folder left
    };

    bool IsPaused() const;
    std::set<std::string> ReadShares();
    void Reconcile(Clock::time_point now);
    /// Brings the state file of a share without a worker up to date.
    void ShowStopped(const std::string& share) const;
    void AnswerWaiting(Clock::time_point now);
    Json::Value DescribeShares() const;
    std::string Retry(const std::string& share) const;

    Supervisor& supervisor_;
    std::int64_t resume_time_;
    std::map<std::string, bool> commanded_;  ///< created or deleted by command
    std::set<std::string> indexed_;          ///< as the folder set said last
    std::set<std::string> known_;            ///< the same with shares whose folders are paused
    std::set<std::string> paused_;           ///< by the global pause
    std::list<Waiting> waiting_;
    bool was_paused_ = false;
    bool shut_down_ = false;
};

}  // namespace fileindexd
