#pragma once

#include <string>

namespace kesto {

/// 1 when the path is the root of a mount (bind mounts count, links do not), 0 when not, -1 with
/// errno set on failure. Mounts nothing on demand.
int IsMountRoot(const char* path);

/// The same from the mount table, which is all that kernels before 5.8 offer. Slower.
int IsMountRootByTable(const char* path);

/// The file system's name in the mount table ("ext4", "fuse.sshfs"); empty when that cannot be
/// told.
std::string FileSystemNameOf(const char* path);

}  // namespace kesto
