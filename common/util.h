#pragma once

#include <dirent.h>

#include <string>

#include "common/export.h"

/// File-system and string helpers. None throws: they return false or an empty string.
namespace quivra {

/// Whether the path is a regular file. A symbolic link, even to a regular file, is not.
QUIVRA_EXPORT bool IsFileExist(const std::string& path);

/// Whether the path is a directory or, with `follow_link`, a symbolic link that ends at one. A
/// relative link target is looked up from the process's current directory. False on a loop.
QUIVRA_EXPORT bool IsDirExist(const std::string& path, bool follow_link);

/// Whether a directory entry is itself a directory. An entry of unknown type never counts as one.
QUIVRA_EXPORT bool IsDirentDir(const dirent& entry, const std::string& full_path);

/// Whether the calling user holds at least one of the permission bits `perm` on the path, as the
/// platform sees it (sdk/filesystem.cpp).
QUIVRA_EXPORT bool CheckACLPerm(const std::string& path, int perm);

/// Whether a file system is mounted at the path, as the platform sees it (sdk/filesystem.cpp).
QUIVRA_EXPORT bool IsMountPoint(const std::string& path);

/// A plain prefix test: no component boundary. Every string starts with the empty prefix.
QUIVRA_EXPORT bool StringStartWith(const std::string& s, const std::string& prefix);

/// The part behind the last "/"; the whole string when there is none.
QUIVRA_EXPORT std::string Basename(const std::string& path);

/// The part before the last "/"; the whole string when there is none. Never ".".
QUIVRA_EXPORT std::string Dirname(const std::string& path);

/// What stands behind the last "." of the base name, lower-cased byte by byte with `to_lower`.
QUIVRA_EXPORT std::string GetFileExtension(const std::string& path, bool to_lower);

}  // namespace quivra
