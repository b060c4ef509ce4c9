#pragma once

#include <set>
#include <string>
#include <utility>

#include "base/unique_fd.h"

namespace kestotifyd {

/// Where file systems are mounted, as this process sees it.
class MountTable {
  public:
    MountTable();

    /// Polls as exceptional (EPOLLPRI) when the table has changed since the last Reload.
    int Fd() const { return fd_.Get(); }

    /// Reads the table again. False when that is not possible; what was known is kept then, for
    /// without its mount point a volume would look empty.
    bool Reload();

    /// The mount points that have come and gone since the last call.
    struct Changes {
        std::set<std::string> added{};
        std::set<std::string> removed{};
    };
    Changes TakeChanges() { return std::exchange(changes_, {}); }

    bool IsMountPoint(const std::string& path) const { return points_.contains(path); }

    /// The mount point of the file system that holds the path; empty when the table is unreadable.
    std::string Covering(const std::string& path) const;

    /// The mount points strictly below the path, sorted. The kernel's own virtual file systems are
    /// left out: nothing in them is a document.
    std::set<std::string> Below(const std::string& path) const;

  private:
    quivra::base::UniqueFd fd_;
    std::set<std::string> points_;
    Changes changes_;
};

}  // namespace kestotifyd
