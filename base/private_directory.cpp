#include "base/private_directory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/file.h"
#include "base/path.h"

namespace quivra::base {
namespace {

constexpr const char* kSystemDirectory = "@eaDir";
constexpr mode_t kSystemDirectoryMode = 0755;
constexpr mode_t kPrivateMode = 0700;

/// Where the components that are ours begin: behind the share's root.
std::size_t RootSize(const std::string& path) {
    const std::size_t found = (path + "/").find("/" + std::string(kSystemDirectory) + "/");
    return found != path.npos ? found : path.rfind('/');
}

}  // namespace

PrivateDirectory PrivateDirectory::Open(const std::string& path, Make make) {
    PrivateDirectory directory;
    directory.path_ = path;
    if (!IsCanonicalText(path) || path == "/") {
        errno = EINVAL;
        return directory;
    }
    std::size_t end = RootSize(path);
    UniqueFd at = OpenDirectory(AT_FDCWD, end == 0 ? "/" : path.substr(0, end));
    while (at.IsValid() && end < path.size()) {
        const std::size_t begin = end + 1;
        end = std::min(path.find('/', begin), path.size());
        if (!directory.Step(at, path.substr(begin, end - begin), path.substr(0, end), make)) {
            return directory;
        }
    }
    directory.fd_ = std::move(at);
    return directory;
}

/// Goes from the directory `at` to the one of that name in it.
bool PrivateDirectory::Step(UniqueFd& at, const std::string& name, const std::string& path,
                            Make make) {
    const mode_t mode = name == kSystemDirectory ? kSystemDirectoryMode : kPrivateMode;
    // Made and then opened like any other: somebody may exchange it in between.
    const bool made = make == Make::kMissing && mkdirat(at.Get(), name.c_str(), mode) == 0;
    UniqueFd next(openat(at.Get(), name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!next.IsValid()) {
        if (errno == ELOOP || errno == ENOTDIR) {
            problem_ = path + " is not a directory; remove it";
        }
        return false;
    }
    if (!CheckOurs(next.Get(), path)) {
        return false;
    }
    // By the descriptor that was checked, never by the name.
    if (made && fchmod(next.Get(), mode) != 0) {
        return false;
    }
    at = std::move(next);
    return true;
}

bool PrivateDirectory::CheckOurs(int fd, const std::string& path) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        return false;
    }
    // Root's is good for everybody: only the daemons' own tools run as somebody else.
    if (status.st_uid != 0 && status.st_uid != geteuid()) {
        problem_ =
            path + " belongs to user " + std::to_string(status.st_uid) + ", not to root; remove it";
    } else if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        problem_ = path + " can be written to by other users; remove it, or take their right away";
    }
    errno = problem_.empty() ? 0 : EPERM;
    return problem_.empty();
}

bool PrivateDirectory::IsStillThere() {
    PrivateDirectory now = Open(path_);
    if (!now.IsValid()) {
        problem_ = now.Problem();
        return false;
    }
    struct stat held {};
    struct stat found {};
    if (fstat(Fd(), &held) != 0 || fstat(now.Fd(), &found) != 0) {
        return false;
    }
    errno = ESTALE;
    return held.st_dev == found.st_dev && held.st_ino == found.st_ino;
}

}  // namespace quivra::base
