#pragma once

#include <cstddef>
#include <deque>
#include <string>
#include <vector>

#include "base/unique_fd.h"

namespace kestotifyd {

/// Appends lines to one queue file. It takes the same lock as LockFile, but never waits for it, so
/// that one busy or broken queue holds up no other: what cannot be written now stays in memory, and
/// when that grows too large it gives way to one line that says that events were lost.
class QueueWriter {
  public:
    static constexpr std::size_t kMaxPendingBytes = 16U << 20;

    enum class Result {
        kDone,    ///< nothing is left
        kBusy,    ///< another process holds the lock: try again soon
        kFailed,  ///< no directory, no space, ...: try again later; logged once until it works
                  ///< again
    };

    /// `crash_line` takes the place of lost lines. `max_pending` bounds the memory, in bytes.
    QueueWriter(std::string path, std::string crash_line,
                std::size_t max_pending = kMaxPendingBytes);

    /// Takes whole lines, each with its "\n".
    void Add(std::vector<std::string> lines);

    /// Whether the last Write that succeeded began a new file.
    bool HasBegunFile() const { return has_begun_file_; }

    bool IsEmpty() const { return pending_.empty(); }

    /// Appends what is pending, in order, to the file that is at the path now; it is made with mode
    /// 0600 when missing. A line that somebody left without its end is ended first; what a full
    /// disk leaves of a line of ours is taken back.
    Result Write();

  private:
    Result Fail(const char* action);
    Result OpenLocked(quivra::base::UniqueFd& queue) const;
    bool EndTornLine(int fd);
    Result Append(int fd);
    void DropWritten(std::size_t size);

    std::string path_;
    std::string crash_line_;
    std::size_t max_pending_;
    std::deque<std::string> pending_;
    std::size_t pending_bytes_ = 0;
    bool has_begun_file_ = false;
    bool is_failure_logged_ = false;
};

}  // namespace kestotifyd
