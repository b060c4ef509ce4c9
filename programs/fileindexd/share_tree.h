#pragma once

#include <functional>
#include <optional>
#include <string>

#include "base/unique_fd.h"
#include "programs/fileindexd/index.h"

namespace fileindexd {

/// What stands below a share's root, as far as it can be indexed: regular files and directories
/// that are reached without symbolic links and without leaving the root's file system (a mount
/// inside a share is another matter's content), and no names that the system keeps for itself.
///
/// It holds the root open, so that a volume that is unmounted meanwhile is noticed and never looks
/// like a share whose files were deleted.
class ShareTree {
  public:
    /// Throws Error 502 when the root cannot be opened.
    explicit ShareTree(std::string root);

    const std::string& Root() const { return root_; }

    /// What stands at a full path: nothing when there is no such object, or none that can be
    /// indexed. Throws std::system_error when that cannot be told.
    std::optional<Attributes> Look(const std::string& full_path) const;

    /// Calls `visit` with the name of every entry of a directory that can be indexed. A directory
    /// that is gone has no entries. Throws std::system_error when it cannot be read.
    using Visitor = std::function<void(const std::string& name, const Attributes& attributes)>;
    void ReadDirectory(const std::string& full_path, const Visitor& visit) const;

    /// Throws Error 502 unless the root's path still leads to the directory that was opened.
    void CheckMounted() const;

    /// Whether the root holds nothing at all, as an empty mount point does.
    bool IsEmpty() const;

  private:
    std::optional<std::string> Relative(const std::string& full_path) const;

    std::string root_;
    quivra::base::UniqueFd fd_;
};

}  // namespace fileindexd
