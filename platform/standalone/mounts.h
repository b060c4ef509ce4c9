#pragma once

#include <optional>
#include <set>
#include <string>

#include "base/unique_fd.h"

/// The mount table as this process sees it, read with libmount: the library kesto_mounts, for the
/// platform and for the programs that belong to it.
namespace kesto {

/// Every path that something is mounted at, bind mounts included, as the kernel writes it. Nothing,
/// with errno set, when the table cannot be read.
std::optional<std::set<std::string>> ReadMountPoints();

/// A descriptor that polls as exceptional (POLLPRI, EPOLLPRI) once for any number of changes of the
/// table since it was opened or last polled. It need not be read. Not valid, with errno set, on
/// failure.
quivra::base::UniqueFd WatchMounts();

/// 1 when the path is the root of a mount (bind mounts count, links do not), 0 when not, -1 with
/// errno set on failure. Mounts nothing on demand.
int IsMountRoot(const char* path);

/// The same from the mount table, which is all that kernels before 5.8 offer. Slower.
int IsMountRootByTable(const char* path);

/// The file system's name in the mount table ("ext4", "fuse.sshfs"); empty when that cannot be
/// told.
std::string FileSystemNameOf(const char* path);

}  // namespace kesto
