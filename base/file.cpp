#include "base/file.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/path.h"

namespace quivra::base {
namespace {

constexpr std::size_t kReadChunk = 64U << 10;

/// What openat2 does in one call, for kernels before 5.6 and sandboxes that do not know it.
UniqueFd WalkTo(int parent, const std::string& path, int flags) {
    // O_PATH: to pass through a directory takes no right to list it.
    constexpr int kStep = O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    UniqueFd fd(openat(parent, path.starts_with('/') ? "/" : ".", kStep));
    for (std::size_t begin = 0; fd.IsValid() && begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string component = path.substr(begin, end - begin);
        if (component == "..") {
            errno = EXDEV;
            return UniqueFd();
        }
        // The last component may be empty: behind a final "/", or of "/" itself.
        if (!component.empty() || end == path.size()) {
            fd = UniqueFd(openat(fd.Get(), component.empty() ? "." : component.c_str(),
                                 end == path.size() ? flags | O_NOFOLLOW : kStep));
        }
        begin = end + 1;
    }
    return fd;
}

/// Opens what is at the path when no component of it is a link.
UniqueFd OpenWithoutLinks(int parent, const std::string& path, int flags) {
    open_how how{};
    how.flags = static_cast<unsigned int>(flags);
    how.resolve = RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    if (!path.starts_with('/')) {
        how.resolve |= RESOLVE_BENEATH;
    }
    UniqueFd fd(static_cast<int>(syscall(SYS_openat2, parent, path.c_str(), &how, sizeof(how))));
    // EPERM is what seccomp filters return for calls that they do not know.
    return fd.IsValid() || (errno != ENOSYS && errno != EPERM) ? std::move(fd)
                                                               : WalkTo(parent, path, flags);
}

/// Opens and locks the file that a replacement is written to. It is kept under one name, so that a
/// process that is killed in between leaves one file at most, for the next one to use.
UniqueFd OpenAside(int directory, const std::string& name) {
    while (true) {
        UniqueFd fd = OpenRegular(directory, name, O_WRONLY | O_CREAT, 0600);
        if (!fd.IsValid()) {
            return fd;
        }
        int result = 0;
        do {
            result = flock(fd.Get(), LOCK_EX);
        } while (result != 0 && errno == EINTR);
        if (result != 0) {
            return UniqueFd();
        }
        if (IsStillAt(fd.Get(), directory, name)) {
            return fd;
        }
    }
}

bool Fill(int fd, std::string_view content, mode_t mode) {
    return ftruncate(fd, 0) == 0 && WriteAll(fd, content) && fchmod(fd, mode) == 0 &&
           fsync(fd) == 0;
}

}  // namespace

bool WriteAll(int fd, std::string_view data) {
    while (!data.empty()) {
        const ssize_t written = write(fd, data.data(), data.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        data.remove_prefix(static_cast<std::size_t>(std::max<ssize_t>(written, 0)));
    }
    return true;
}

bool ReadUpTo(int fd, std::size_t limit, std::string& out) {
    const std::size_t end = out.size() + limit;
    while (out.size() < end) {
        const std::size_t have = out.size();
        out.resize(std::min(have + kReadChunk, end));
        const ssize_t count = read(fd, out.data() + have, out.size() - have);
        out.resize(have + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        if (count == 0) {
            break;
        }
        if (count < 0 && errno != EINTR) {
            return false;
        }
    }
    return true;
}

UniqueFd OpenDirectory(int parent, const std::string& path) {
    return OpenWithoutLinks(parent, path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

UniqueFd FindObject(int parent, const std::string& path) {
    return OpenWithoutLinks(parent, path, O_PATH | O_NOFOLLOW | O_CLOEXEC);
}

UniqueFd OpenFound(int object, int flags) {
    struct stat status {};
    if (fstat(object, &status) != 0) {
        return UniqueFd();
    }
    if (!S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode)) {
        errno = EINVAL;
        return UniqueFd();
    }
    // The kernel opens the object itself here; no path is looked up.
    return UniqueFd(open(("/proc/self/fd/" + std::to_string(object)).c_str(),
                         flags | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
}

UniqueFd OpenRegular(int directory, const std::string& name, int flags, mode_t mode) {
    // O_NONBLOCK: to open a FIFO for reading would wait for its other end.
    UniqueFd fd(openat(directory, name.c_str(), flags | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, mode));
    struct stat status {};
    if (fd.IsValid() && (fstat(fd.Get(), &status) != 0 || !S_ISREG(status.st_mode))) {
        fd.Reset();
        errno = EINVAL;
    }
    return fd;
}

bool IsStillAt(int fd, int directory, const std::string& name) {
    struct stat held {};
    struct stat named {};
    return fstat(fd, &held) == 0 &&
           fstatat(directory, name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 &&
           held.st_dev == named.st_dev && held.st_ino == named.st_ino;
}

bool SyncDirectory(int directory) {
    return fsync(directory) == 0;
}

Replaced ReplaceFile(int directory, const std::string& name, std::string_view content,
                     mode_t mode) {
    const std::string aside = name + ".new";
    const UniqueFd fd = OpenAside(directory, aside);
    if (!fd.IsValid()) {
        return Replaced::kNo;
    }
    if (!Fill(fd.Get(), content, mode) ||
        renameat(directory, aside.c_str(), directory, name.c_str()) != 0) {
        const KeepErrno keep_errno;
        unlinkat(directory, aside.c_str(), 0);
        return Replaced::kNo;
    }
    return SyncDirectory(directory) ? Replaced::kYes : Replaced::kNotSure;
}

Replaced ReplaceFile(const std::string& path, std::string_view content, mode_t mode) {
    // Opened first: with one descriptor left, it would be missing after the rename.
    const UniqueFd directory(
        open(std::string(Directory(path)).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory.IsValid()) {
        return Replaced::kNo;
    }
    return ReplaceFile(directory.Get(), std::string(Name(path)), content, mode);
}

LockAttempt TryLock(int directory, const std::string& name, bool exclusive, mode_t mode,
                    UniqueFd& fd) {
    fd = OpenRegular(directory, name, O_RDWR);
    if (!fd.IsValid() && errno == ENOENT) {
        fd = OpenRegular(directory, name, O_RDWR | O_CREAT | O_EXCL, mode);
        if (!fd.IsValid() && errno == EEXIST) {
            return LockAttempt::kReplaced;  // made by another process in this moment
        }
    }
    if (!fd.IsValid()) {
        return LockAttempt::kOpenFailed;
    }
    LockAttempt result = LockAttempt::kTaken;
    if (flock(fd.Get(), (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB) != 0) {
        result = errno == EINTR || errno == EAGAIN ? LockAttempt::kBusy : LockAttempt::kLockFailed;
    } else if (!IsStillAt(fd.Get(), directory, name)) {
        result = LockAttempt::kReplaced;
    }
    if (result != LockAttempt::kTaken) {
        const KeepErrno keep_errno;
        fd.Reset();
    }
    return result;
}

}  // namespace quivra::base
