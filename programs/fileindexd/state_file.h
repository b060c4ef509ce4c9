#pragma once

#include <json/json.h>

#include <chrono>
#include <cstdint>
#include <string>

#include "programs/fileindexd/batch.h"

namespace fileindexd {

/// Where workers and front ends meet; in memory, so that writing there wakes no disk.
inline constexpr const char* kRunDirectory = "/var/run/fileindexd";

/// Makes kRunDirectory. Throws Error 502.
void MakeRunDirectory();

/// The file through which a front end follows the work on one share: kRunDirectory/SHARE.json,
/// replaced atomically. Its members are described in docs/fileindexd.md. Failing to write it is
/// no reason to stop work, so nothing is thrown.
class StateFile {
  public:
    enum class State { kIdle, kSettling, kProcessing, kWaiting, kProblem, kPaused };

    /// What the backlog holds.
    struct Waiting {
        std::uint64_t files = 0;  ///< whose content is to be extracted
        std::uint64_t bytes = 0;
        std::uint64_t failed = 0;  ///< files that could not be read
        std::string phase;         ///< "names", "contents" or empty
        std::int64_t eta = -1;     ///< seconds; -1: not known

        bool operator==(const Waiting&) const = default;
    };

    explicit StateFile(std::string share);
    StateFile(const StateFile&) = delete;
    StateFile& operator=(const StateFile&) = delete;

    /// Shown with the next Set.
    void SetLastPass(std::int64_t seconds_since_epoch);
    /// Empty when the last pass succeeded.
    void SetLastError(const std::string& error);
    void SetWaiting(const Waiting& waiting);
    /// State kProblem, with a sentence for the user: what is in the way, and what to do.
    void SetProblem(const std::string& sentence);

    /// Writes at once, unless the file says so already.
    void Set(State state);
    /// State kProcessing; writes at most once a second.
    void SetProgress(const PassState& progress);
    void Remove();

    /// What the share's file says, for another process: null where there is none, or not of a
    /// process that still runs.
    static Json::Value Read(const std::string& share);

  private:
    void Write();

    const std::string share_;
    State state_ = State::kIdle;
    bool is_new_ = true;  ///< there is more to tell than the file does
    PassState progress_;
    Waiting waiting_;
    std::string problem_;
    std::int64_t last_pass_ = 0;
    std::string last_error_;
    std::chrono::steady_clock::time_point written_{};
};

}  // namespace fileindexd
