#pragma once

#include <cstddef>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/folder.h"

namespace quivra::fileindex {

/// The file of the set, and the LockFile of those who change it.
inline constexpr const char* kFileIndexFoldersCfgPath =
    "/var/packages/Quivra/etc/fileindex.folders";
inline constexpr const char* kFileIndexFoldersLockPath = "/tmp/quivra_cfg_folder.lock";

/// How many folders the set may hold.
inline constexpr std::size_t kFileIndexFoldersMax = 1000;

/// The set of indexed folders and its file, a JSON array of Folder::GetData in list order. Build
/// one for each use: it holds the file as it was when the object was made. It takes no lock; who
/// changes the file holds kFileIndexFoldersLockPath from before the load until after the save.
/// Not for use from several threads.
///
/// A folder covers a full path when it is that path or one of its ancestors. A folder whose share
/// the platform does not know covers nothing: the questions go on with the others, and each such
/// share is logged once per object. They throw Error 120 when a stored path does not begin with
/// "/".
///
/// MIND: Save takes root's identity and the process KEEPS it, see sdk/credentials.h. A program that
/// serves users saves from a process of its own.
class QUIVRA_EXPORT FolderMgr {
  public:
    using FolderPtr = std::shared_ptr<Folder>;

    /// Reads the file; a missing one is an empty set. Throws Error 504 when it is not JSON, and
    /// Error 120 when an element is not a folder. A file that holds null or {} has no elements, so
    /// it is an empty set, too; any other value that is not an array is Error 120, because the next
    /// Save would erase what somebody wrote there.
    FolderMgr();

    /// Writes the file as user root, mode 0644. Throws Error 503, 505 (the file is unchanged) or
    /// 502 (mode not set). Its directory must exist.
    void Save() const;

    /// The folders in stored order.
    const std::vector<FolderPtr>& GetFolders() const { return folders_; }

    /// The folder with exactly this share path. Throws Error 902 when there is none; `out` is left
    /// as it was.
    void Get(FolderPtr& out, const std::string& path) const;
    /// Whether there is a folder with exactly this share path.
    bool HasFolder(const std::string& path) const;

    /// Puts the folder at the end, in place of one of the same path. `diff` tells which kinds of
    /// content change state below it, see DiffCfg. Throws Error 900 when the set gets too large;
    /// drop this object then, for the folder is in it. Error 120 or 800 as Folder::GetFullPath.
    void Upsert(FolderPtr& diff, FolderPtr folder);

    /// Removes the folder with exactly this path. `diff` tells which kinds of content change state
    /// below it, now that an enclosing folder or none governs the place. Throws Error 902 when
    /// neither this folder nor an enclosing one exists, Error 120 or 800 as GetFullPath; the set is
    /// as it was then.
    void Delete(FolderPtr& diff, const std::string& path);

    /// Removes every folder of the share. Throws Error 120 as Folder::GetShare; nothing has changed
    /// then.
    void DeleteByShare(const std::string& share);

    /// One page of the folders: sorted by "document", "audio", "video" or "photo" (false first),
    /// by "path", or else by name; reversed when `sort_direction` is "desc"; `limit` of them from
    /// `offset` on (none beyond the end). `total` is the number of all folders.
    void List(std::vector<FolderPtr>& out, unsigned int& total, unsigned int offset,
              unsigned int limit, const std::string& sort_by,
              const std::string& sort_direction) const;

    /// A new folder with next's path and name whose switches tell which kinds of content change
    /// state when `previous` is replaced by `next`; all do where `previous` is null. `next` must
    /// not be null.
    static FolderPtr DiffCfg(FolderPtr next, FolderPtr previous);

    /// The full path of one of the folders. Null when the platform does not know its share.
    const std::string* FindFullPath(const Folder& folder) const;

    /// The folder that governs the path: the deepest that covers it, of two with the same path the
    /// earlier. Null when none does.
    FolderPtr GetMostSuitableCfg(const std::string& full_path) const;

    /// Whether a file at the path is to be indexed with content and metadata.
    bool IsFullPathNeedMeta(const std::string& full_path) const;

    /// Whether a folder of exactly this path is configured, and whether any covers the path.
    bool IsFullPathHasOwnCfg(const std::string& full_path) const;
    bool IsFullPathIndexed(const std::string& full_path) const;
    /// Whether the share has a folder, and all shares that have one, whether they exist or not.
    bool IsShareIndexed(const std::string& share) const;
    std::set<std::string> GetIndexedShares() const;

  private:
    void RemovePath(const std::string& path);

    std::vector<FolderPtr> folders_;
    mutable std::set<std::string> gone_shares_;
};

}  // namespace quivra::fileindex
