#pragma once

#include <optional>
#include <string>

#include "base/unique_fd.h"

namespace kestotifyd {

/// A directory's file handle as a string (type and bytes), comparable and usable as a key.
struct DirectoryHandle {
    std::string handle;
    int mount_id;
};

/// The handle of an open directory; none, with errno set, when its file system has none.
std::optional<DirectoryHandle> HandleOf(int directory);

/// Opens the directory of a handle, in the mount that `mount` lies in. Invalid, with errno set,
/// when it is gone or the file system cannot find it.
quivra::base::UniqueFd OpenHandle(int mount, const std::string& handle);

/// The path of an open directory; empty when it has been removed or is not visible from here.
std::string PathOfDescriptor(int directory);

}  // namespace kestotifyd
