#include "programs/kestotifyd/file_handle.h"

#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace kestotifyd {
namespace {

/// Room for a handle; its type and length come first, as the kernel lays it out.
union HandleBuffer {
    file_handle header;
    char bytes[sizeof(file_handle) + MAX_HANDLE_SZ];
};

/// A directory that is being renamed while it is asked for is asked for again.
constexpr int kMaxAttempts = 5;

}  // namespace

std::optional<DirectoryHandle> HandleOf(int directory) {
    HandleBuffer buffer{};
    buffer.header.handle_bytes = MAX_HANDLE_SZ;
    DirectoryHandle result{};
    if (name_to_handle_at(directory, "", &buffer.header, &result.mount_id, AT_EMPTY_PATH) != 0) {
        return std::nullopt;
    }
    result.handle.assign(buffer.bytes, sizeof(file_handle) + buffer.header.handle_bytes);
    return result;
}

quivra::base::UniqueFd OpenHandle(int mount, const std::string& handle) {
    HandleBuffer buffer{};
    if (handle.size() > sizeof(buffer.bytes)) {
        errno = EINVAL;
        return quivra::base::UniqueFd();
    }
    std::memcpy(buffer.bytes, handle.data(), handle.size());
    return quivra::base::UniqueFd(
        open_by_handle_at(mount, &buffer.header, O_PATH | O_DIRECTORY | O_CLOEXEC));
}

std::string PathOfDescriptor(int directory) {
    struct stat held {};
    if (fstat(directory, &held) != 0) {
        return std::string();
    }
    for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
        std::array<char, PATH_MAX + 16> text{};
        const std::string link = "/proc/self/fd/" + std::to_string(directory);
        const ssize_t size = readlink(link.c_str(), text.data(), text.size());
        if (size <= 0 || static_cast<std::size_t>(size) == text.size()) {
            return std::string();
        }
        const std::string path(text.data(), static_cast<std::size_t>(size));
        // What is removed, or outside of the mount, has a text too, but no such path.
        struct stat named {};
        if (lstat(path.c_str(), &named) == 0 && named.st_dev == held.st_dev &&
            named.st_ino == held.st_ino) {
            return path;
        }
    }
    return std::string();
}

}  // namespace kestotifyd
