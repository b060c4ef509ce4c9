#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace fileindexd {

/// Keeps one worker process running for every share that should have one. A worker that dies is
/// started again, later each time; one that is not wanted any more gets SIGTERM and, when it takes
/// too long, SIGKILL, which is safe because passes repeat. The workers die with the thread that
/// uses this object. Single-threaded; the caller hands in the time and tells of SIGCHLD.
class Supervisor {
  public:
    using Clock = std::chrono::steady_clock;
    /// The command line (program first) of a share's worker.
    using CommandOf = std::function<std::vector<std::string>(const std::string& share)>;

    static constexpr std::chrono::milliseconds kStopTimeout{2000};
    static constexpr std::chrono::seconds kFirstRestart{1};
    static constexpr std::chrono::seconds kLastRestart{300};
    /// A worker that lived that long starts from kFirstRestart again.
    static constexpr std::chrono::seconds kStable{60};

    /// Told when the last worker of a share that is not wanted any more has ended.
    using EndListener = std::function<void(const std::string& share)>;

    explicit Supervisor(CommandOf command_of) : command_of_(std::move(command_of)) {}
    /// Kills what still runs.
    ~Supervisor();
    Supervisor(const Supervisor&) = delete;
    Supervisor& operator=(const Supervisor&) = delete;

    void SetEndListener(EndListener listener) { on_end_ = std::move(listener); }

    /// Starts and stops workers so that exactly these shares have one.
    void SetWanted(const std::set<std::string>& shares, Clock::time_point now);

    /// Takes note of workers that have ended, and starts or kills those whose time has come.
    void Update(Clock::time_point now);

    /// When Update has to be called at the latest.
    std::optional<Clock::time_point> NextUpdate() const;

    bool IsWanted(const std::string& share) const;
    bool IsRunning(const std::string& share) const;
    bool IsAnyRunning() const;
    /// 0 when none runs.
    pid_t PidOf(const std::string& share) const;

  private:
    struct Worker {
        bool wanted = true;
        pid_t pid = 0;  ///< 0: none runs
        Clock::time_point started{};
        Clock::time_point next_start{};
        std::chrono::seconds wait = kFirstRestart;  ///< before the next start but one
        std::optional<Clock::time_point> kill_at;   ///< it has been told to stop
    };

    void Start(const std::string& share, Worker& worker, Clock::time_point now);
    static void Stop(Worker& worker, Clock::time_point now);
    void NoteEnd(const std::string& share, Worker& worker, int status, Clock::time_point now);

    CommandOf command_of_;
    EndListener on_end_;
    std::map<std::string, Worker> workers_;
};

}  // namespace fileindexd
