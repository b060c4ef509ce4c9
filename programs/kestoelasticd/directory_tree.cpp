#include "programs/kestoelasticd/directory_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>

#include "base/file.h"
#include "common/error.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

using quivra::base::UniqueFd;

constexpr std::size_t kCopyChunk = 256 * 1024;

void CopyFile(int from, int to, const std::string& name) {
    const UniqueFd in = quivra::base::OpenRegular(from, name, O_RDONLY);
    const UniqueFd out(
        openat(to, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!in.IsValid() || !out.IsValid()) {
        FailFile("cannot copy " + name);
    }
    std::string chunk;
    for (;;) {
        chunk.clear();
        if (!quivra::base::ReadUpTo(in.Get(), kCopyChunk, chunk) ||
            !quivra::base::WriteAll(out.Get(), chunk)) {
            FailFile("cannot copy " + name);
        }
        if (chunk.empty()) {
            break;
        }
    }
    if (fsync(out.Get()) != 0) {
        FailFile("cannot sync " + name);
    }
}

}  // namespace

void FailFile(const std::string& what) {
    const int code = errno == ENOSPC || errno == EDQUOT ? kNoSpace : kEngineFailed;
    throw quivra::Error(code, what + ": " + quivra::SystemErrorText(errno));
}

std::vector<std::string> NamesIn(int directory) {
    // A descriptor of its own: closedir closes it, and reading moves its place.
    UniqueFd copy(openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::unique_ptr<DIR, int (*)(DIR*)> stream(
        copy.IsValid() ? fdopendir(copy.Get()) : nullptr, closedir);
    if (!stream) {
        FailFile("cannot list a directory");
    }
    copy.Release();
    std::vector<std::string> names;
    while (const dirent* entry = readdir(stream.get())) {
        const std::string name = entry->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    return names;
}

void RemoveTree(int parent, const std::string& name) {
    if (unlinkat(parent, name.c_str(), 0) == 0 || errno == ENOENT) {
        return;
    }
    const UniqueFd directory(
        openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory.IsValid()) {
        FailFile("cannot remove " + name);
    }
    for (const std::string& child : NamesIn(directory.Get())) {
        RemoveTree(directory.Get(), child);
    }
    if (unlinkat(parent, name.c_str(), AT_REMOVEDIR) != 0) {
        FailFile("cannot remove " + name);
    }
}

void CopyFiles(int from, int to, const std::string& first) {
    CopyFile(from, to, first);
    for (const std::string& name : NamesIn(from)) {
        struct stat status {};
        if (name != first && fstatat(from, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
            S_ISREG(status.st_mode)) {
            CopyFile(from, to, name);
        }
    }
    SyncDirectory(to);
}

void SyncDirectory(int directory) {
    if (fsync(directory) != 0) {
        FailFile("cannot sync a directory");
    }
}

}  // namespace elasticd
