#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <utility>
#include <vector>

#include "base/private_directory.h"
#include "base/unique_fd.h"

namespace kestotifyd {

/// Appends lines to one queue file, under the lock that its reader takes, too. It never waits for
/// that lock, so that one busy or broken queue holds up no other: what cannot be written now stays
/// in memory, and when that grows too large it gives way to one line that says that events were
/// lost.
///
/// The queue lies where users may exchange the directories above it. So each write opens the
/// queue's directory anew (a descriptor that is kept would forbid to unmount the volume) and works
/// through that descriptor. Nothing is written to a directory that is not private, and whenever
/// the one that was written to last is not the one that is there, the line about lost events
/// follows: what the consumer has not read yet may be in the other one.
class QueueWriter {
  public:
    static constexpr std::size_t kMaxPendingBytes = 16U << 20;

    enum class Result {
        kDone,    ///< nothing is left
        kBusy,    ///< another process holds the lock: try again soon
        kFailed,  ///< Problem() tells why: try again later
    };

    /// `path` is canonical. `crash_line` takes the place of lost lines. `max_pending` bounds the
    /// memory, in bytes.
    QueueWriter(const std::string& path, std::string crash_line,
                std::size_t max_pending = kMaxPendingBytes);

    /// Takes whole lines, each with its "\n".
    void Add(std::vector<std::string> lines);

    /// Whether the last Write that succeeded began a new file.
    bool HasBegunFile() const { return has_begun_file_; }

    bool IsEmpty() const { return pending_.empty(); }

    const std::string& Directory() const { return directory_; }

    /// Why the last Write failed, in one sentence, which has been logged; empty when it did not.
    const std::string& Problem() const { return problem_; }

    /// Appends what is pending, in order, to the file that is at the path now; it is made when
    /// missing, and its directory, too, with `make`. The directory is looked at even when nothing
    /// is pending.
    Result Write(
        quivra::base::PrivateDirectory::Make make = quivra::base::PrivateDirectory::Make::kNo);

  private:
    Result Fail(std::string problem);
    Result FailCall(const char* action);
    bool OpenDirectory(quivra::base::PrivateDirectory::Make make,
                       quivra::base::PrivateDirectory& directory);
    Result OpenLocked(int directory, quivra::base::UniqueFd& queue);
    Result Append(int fd);
    void DropWritten(std::size_t size);
    void LosePending();

    std::string directory_;
    std::string name_;
    std::string crash_line_;
    std::size_t max_pending_;
    std::deque<std::string> pending_;
    std::size_t pending_bytes_ = 0;
    std::pair<std::uint64_t, std::uint64_t> written_to_{};  ///< device and inode of the directory
    bool has_begun_file_ = false;
    std::string problem_;
};

}  // namespace kestotifyd
