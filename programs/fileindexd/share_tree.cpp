#include "programs/fileindexd/share_tree.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <string_view>
#include <system_error>

#include "base/path.h"
#include "common/error.h"
#include "common/log.h"
#include "fileindex/util.h"

namespace fileindexd {

namespace {

constexpr const char* kUnit = "share_tree";

/// Whether the call failed because there is nothing (to be indexed) at the path.
bool MeansAbsent(int error) {
    switch (error) {
        case ENOENT:
        case ENOTDIR:
        case ELOOP:         // a symbolic link on the way
        case EXDEV:         // a mount on the way
        case ENAMETOOLONG:  // no path by which it could be indexed
            return true;
        default:
            return false;
    }
}

[[noreturn]] void Throw(int error, const std::string& path) {
    throw std::system_error(error, std::generic_category(), path);
}

/// Opens a path below a directory without leaving its file system or following a link.
quivra::base::UniqueFd OpenBelow(int directory, const std::string& path, unsigned long long flags) {
    open_how how{};
    how.flags = flags | O_CLOEXEC | O_NOFOLLOW;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_XDEV;
    int fd;
    do {
        fd = static_cast<int>(syscall(SYS_openat2, directory, path.c_str(), &how, sizeof(how)));
        // EAGAIN: something was renamed during the walk, and the kernel cannot vouch for it.
    } while (fd < 0 && (errno == EINTR || errno == EAGAIN));
    return quivra::base::UniqueFd(fd);
}

/// As documents hold it: a time that 64 bits cannot count wraps around.
std::int64_t Nanoseconds(const statx_timestamp& time) {
    return static_cast<std::int64_t>(static_cast<std::uint64_t>(time.tv_sec) * 1'000'000'000 +
                                     time.tv_nsec);
}

std::optional<Attributes> Stat(int directory, const char* name, int flags) {
    struct statx info {};
    if (statx(directory, name, flags | AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT,
              STATX_TYPE | STATX_SIZE | STATX_MTIME | STATX_CTIME | STATX_INO, &info) != 0) {
        if (MeansAbsent(errno)) {
            return std::nullopt;
        }
        Throw(errno, name);
    }
    const bool is_dir = S_ISDIR(info.stx_mode);
    if (!is_dir && !S_ISREG(info.stx_mode)) {
        return std::nullopt;
    }
    // The share's own root (AT_EMPTY_PATH on it) may be a mount point; nothing below it may.
    if ((info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0 && (flags & AT_EMPTY_PATH) == 0) {
        return std::nullopt;
    }
    return Attributes{is_dir, static_cast<std::int64_t>(info.stx_size), Nanoseconds(info.stx_mtime),
                      Nanoseconds(info.stx_ctime), info.stx_ino};
}

bool HasPreservedName(std::string_view relative) {
    while (!relative.empty()) {
        const std::size_t slash = relative.find('/');
        if (quivra::fileindex::IsSystemPreservedFileName(std::string(relative.substr(0, slash)))) {
            return true;
        }
        relative.remove_prefix(slash == std::string_view::npos ? relative.size() : slash + 1);
    }
    return false;
}

/// Null, with errno set, on failure.
DirectoryReader::Stream OpenStream(quivra::base::UniqueFd fd) {
    if (!fd.IsValid()) {
        return nullptr;
    }
    DirectoryReader::Stream stream(fdopendir(fd.Get()));
    if (stream != nullptr) {
        fd.Release();
    }
    return stream;
}

bool CanBeIndexed(const dirent& entry) {
    const std::string_view name = entry.d_name;
    return name != "." && name != ".." &&
           (entry.d_type == DT_DIR || entry.d_type == DT_REG || entry.d_type == DT_UNKNOWN) &&
           !quivra::fileindex::IsSystemPreservedFileName(entry.d_name);
}

}  // namespace

ShareTree::ShareTree(std::string root)
    : root_(std::move(root)), fd_(open(root_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC)) {
    if (!fd_.IsValid()) {
        quivra::Fail({kUnit, __LINE__}, "!fd_.IsValid()",
                     quivra::Error(quivra::Error::kSystemCallFailed,
                                   "The share's root cannot be opened, path=" + root_ + ": " +
                                       quivra::SystemErrorText(errno)));
    }
}

std::optional<std::string> ShareTree::Relative(const std::string& full_path) const {
    if (full_path == root_) {
        return ".";
    }
    if (!quivra::base::IsBelow(full_path, root_) || !quivra::base::IsCanonicalText(full_path)) {
        return std::nullopt;
    }
    std::string relative = full_path.substr(root_.size() + 1);
    if (HasPreservedName(relative)) {
        return std::nullopt;
    }
    return relative;
}

std::optional<Attributes> ShareTree::Look(const std::string& full_path) const {
    const std::optional<std::string> relative = Relative(full_path);
    if (!relative) {
        return std::nullopt;
    }
    const quivra::base::UniqueFd fd = OpenBelow(fd_.Get(), *relative, O_PATH);
    if (!fd.IsValid()) {
        if (MeansAbsent(errno)) {
            return std::nullopt;
        }
        Throw(errno, full_path);
    }
    return Stat(fd.Get(), "", AT_EMPTY_PATH);
}

DirectoryReader ShareTree::Read(const std::string& full_path) const {
    DirectoryReader reader;
    reader.path_ = full_path;
    const std::optional<std::string> relative = Relative(full_path);
    if (relative) {
        reader.stream_ = OpenStream(OpenBelow(fd_.Get(), *relative, O_RDONLY | O_DIRECTORY));
        if (reader.stream_ == nullptr && !MeansAbsent(errno)) {
            Throw(errno, full_path);
        }
    }
    return reader;
}

std::optional<DirectoryReader::Entry> DirectoryReader::Next() {
    while (stream_ != nullptr) {
        errno = 0;
        const dirent* entry = readdir(stream_.get());
        if (entry == nullptr) {
            const int error = errno;
            stream_.reset();
            if (error != 0) {
                Throw(error, path_);
            }
        } else if (CanBeIndexed(*entry)) {
            if (const auto attributes = Stat(dirfd(stream_.get()), entry->d_name, 0)) {
                return Entry{path_ + "/" + entry->d_name, *attributes};
            }
        }
    }
    return std::nullopt;
}

void ShareTree::CheckMounted() const {
    struct stat opened {};
    struct stat present {};
    const bool same = fstat(fd_.Get(), &opened) == 0 && stat(root_.c_str(), &present) == 0 &&
                      opened.st_dev == present.st_dev && opened.st_ino == present.st_ino;
    if (!same) {
        quivra::Fail({kUnit, __LINE__}, "!same",
                     quivra::Error(quivra::Error::kSystemCallFailed,
                                   "The share's root has gone or was replaced; is its volume "
                                   "mounted? path=" +
                                       root_));
    }
}

bool ShareTree::IsEmpty() const {
    const DirectoryReader::Stream directory =
        OpenStream(OpenBelow(fd_.Get(), ".", O_RDONLY | O_DIRECTORY));
    if (directory == nullptr) {
        return false;
    }
    while (const dirent* entry = readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") {
            return false;
        }
    }
    return true;
}

}  // namespace fileindexd
