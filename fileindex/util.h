#pragma once

#include <string>

#include "common/export.h"
#include "fileindex/file_types.h"

/// The two kinds of path, and what may be indexed. A share path begins with "/" and the name of a
/// share (/photo/2019); a full path is absolute in the file system (/volume1/photo/2019).
namespace quivra::fileindex {

/// The share's name: what stands between the leading "/" and the next. Throws Error 120 (reason:
/// the path) for a path that does not begin with "/".
QUIVRA_EXPORT void GetShareNameByPath(std::string& share_name, const std::string& share_path);

/// The full path of a share path. Throws Error 120 as above and Error 800 when the platform does
/// not know the share.
QUIVRA_EXPORT void GetFullPath(std::string& full_path, const std::string& share_path);

/// The share that a full path lies in, and the full path of that share's root. Throws Error 502
/// when there is none.
QUIVRA_EXPORT void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                                              const std::string& full_path);

/// Whether the path lies in the recycle bin of its share, or is the recycle directory of a user's
/// home. Throws as GetShareNamePathByFullPath, and Error 800 or 502 when the share's record or its
/// recycle flag cannot be read.
QUIVRA_EXPORT bool IsFullPathInRecycleBin(const std::string& full_path);

/// Whether the path may be indexed: it is not in a snapshot, not on a remote, image or virtual file
/// system, in a share that may be indexed, not in a recycle bin, not a stray mount point, and
/// reached without symbolic links, "." or "..". The rules are those of fileindex/path_rules.h.
/// Throws as IsFullPathInRecycleBin.
QUIVRA_EXPORT bool CanFullPathBeIndexed(const std::string& full_path);

/// The same for a share path. Throws as GetFullPath, too.
QUIVRA_EXPORT bool CanPathBeIndexed(const std::string& share_path);

/// `path` with the first component that is exactly `old_share` replaced by `new_share`. Throws
/// Error 120 ("Cannot find share: ...") when there is none.
QUIVRA_EXPORT std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                                           const std::string& old_share);

/// Whether the base name is one that the system keeps for itself, never a user's file.
QUIVRA_EXPORT bool IsSystemPreservedFileName(const std::string& name);

/// The class of a file by the extension of its base name, in any letter case.
QUIVRA_EXPORT FileType GetFileTypeByFullPath(const std::string& full_path);

}  // namespace quivra::fileindex
