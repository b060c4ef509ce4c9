#pragma once

#include <dirent.h>

#include <memory>
#include <optional>
#include <string>

#include "base/unique_fd.h"
#include "programs/fileindexd/index.h"

namespace fileindexd {

/// The entries of one directory that can be indexed, one after the other: no directory is too large
/// for the memory, and reading may pause. It stays the directory that was opened, whatever is
/// renamed meanwhile.
class DirectoryReader {
  public:
    struct CloseStream {
        void operator()(DIR* stream) const { closedir(stream); }
    };
    using Stream = std::unique_ptr<DIR, CloseStream>;
    struct Entry {
        std::string path;  ///< below the path by which the directory was opened
        Attributes attributes;
    };

    const std::string& Path() const { return path_; }
    /// None at the end. Throws std::system_error when reading fails; the end is reached then.
    std::optional<Entry> Next();

  private:
    friend class ShareTree;

    std::string path_;
    Stream stream_;
};

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

    /// Opens a directory to read its entries. A directory that is gone has none. Throws
    /// std::system_error when it cannot be read.
    DirectoryReader Read(const std::string& full_path) const;

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
