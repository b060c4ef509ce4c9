#include "platform/standalone/file_io.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "base/unique_fd.h"

namespace kesto {
namespace {

constexpr std::size_t kReadChunk = 64U << 10;

bool WriteWhole(int fd, const std::string& content) {
    for (std::size_t written = 0; written < content.size();) {
        const ssize_t count = write(fd, content.data() + written, content.size() - written);
        if (count < 0 && errno != EINTR) {
            return false;
        }
        written += static_cast<std::size_t>(std::max<ssize_t>(count, 0));
    }
    return true;
}

bool SyncDirectoryOf(const std::string& path) {
    const std::string directory = path.substr(0, path.rfind('/') + 1);
    const quivra::base::UniqueFd fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return fd.IsValid() && fsync(fd.Get()) == 0;
}

}  // namespace

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

bool ReplaceFile(const std::string& path, const std::string& content, unsigned int mode) {
    std::string aside = path + ".XXXXXX";
    const quivra::base::UniqueFd fd(mkostemp(aside.data(), O_CLOEXEC));
    if (!fd.IsValid()) {
        return false;
    }
    if (fchmod(fd.Get(), mode) != 0 || !WriteWhole(fd.Get(), content) || fsync(fd.Get()) != 0 ||
        rename(aside.c_str(), path.c_str()) != 0) {
        const int saved_errno = errno;
        unlink(aside.c_str());
        errno = saved_errno;
        return false;
    }
    return SyncDirectoryOf(path);
}

}  // namespace kesto
