#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace fileindexd {

/// Tells one working copy of a queue from another.
struct WorkingCopy {
    std::uint64_t inode = 0;
    std::uint64_t size = 0;
    std::int64_t modified = 0;  ///< nanoseconds since the epoch
    /// When the queue file was begun, in seconds since the epoch; unset where the file system does
    /// not keep it.
    std::optional<std::int64_t> created;

    /// None when there is no file at the path.
    static std::optional<WorkingCopy> At(const std::string& path);
};

/// How many steps of a pass the committed index holds, in a file beside the working copy. An
/// interrupted pass goes on behind them: repeating a rename after later steps could move newer
/// documents. A lost or torn file costs work, not correctness.
class Progress {
  public:
    /// Reads the file; it counts only if it was written for this working copy.
    Progress(std::string path, const WorkingCopy& copy);

    std::size_t Steps() const { return steps_; }

    /// Replaces the file. Throws Error 505.
    void Store(std::size_t steps);
    void Remove();

  private:
    std::string path_;
    WorkingCopy copy_;
    std::size_t steps_ = 0;
};

}  // namespace fileindexd
