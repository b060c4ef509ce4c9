#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/share.h>
#include <sys/stat.h>
#include <syslog.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <mutex>
#include <optional>

#include "base/file.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/shares_conf.h"

namespace kesto {
namespace {

constexpr std::size_t kMaxFileSize = 4U << 20;

/// What tells one state of the file from another. The change time cannot be set back.
struct FileState {
    explicit FileState(const struct stat& status)
        : device(status.st_dev),
          inode(status.st_ino),
          size(status.st_size),
          modified(status.st_mtim),
          changed(status.st_ctim) {}
    bool operator==(const FileState& other) const {
        return device == other.device && inode == other.inode && size == other.size &&
               IsSame(modified, other.modified) && IsSame(changed, other.changed);
    }
    static bool IsSame(const timespec& one, const timespec& other) {
        return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
    }

    dev_t device;
    ino_t inode;
    off_t size;
    timespec modified;
    timespec changed;
};

/// Whether the file could change once more without a new time: many kernels stamp with the time of
/// their last tick.
bool IsTooFresh(const FileState& state) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return now.tv_sec - state.changed.tv_sec <= 1;
}

struct Cache {
    std::mutex mutex;
    std::optional<FileState> state;  ///< of the file that `conf` was read from
    std::shared_ptr<const SharesConf> conf;
    std::vector<std::string> logged;  ///< the problems that were logged last
};

/// Reads the file anew; null with errno set on failure.
std::shared_ptr<const SharesConf> ReadShares(Cache& cache) {
    const quivra::base::UniqueFd fd(
        open(kSharesPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!fd.IsValid() || fstat(fd.Get(), &status) != 0) {
        return nullptr;
    }
    std::string text;
    errno = EINVAL;  // what is not a file
    if (!S_ISREG(status.st_mode) || !quivra::base::ReadUpTo(fd.Get(), kMaxFileSize + 1, text)) {
        return nullptr;
    }
    if (text.size() > kMaxFileSize) {
        errno = EFBIG;
        return nullptr;
    }
    // As the file was before it was read: a change meanwhile shows in the next look.
    const FileState state(status);
    if (!IsTooFresh(state)) {
        cache.state = state;
    }
    return std::make_shared<const SharesConf>(ParseShares(text));
}

/// Logs the problems once for each state of the file, however often it is read.
void LogProblems(const std::vector<std::string>& problems, Cache& cache) {
    if (problems != cache.logged) {
        for (const std::string& problem : problems) {
            syslog(LOG_WARNING, "%s", problem.c_str());
        }
        cache.logged = problems;
    }
}

/// What the file says now. Its shares count as unknown where IsReadable is false.
std::shared_ptr<const SharesConf> Load() {
    static auto* cache = new Cache;  // outlives threads that are left at exit
    const std::lock_guard lock(cache->mutex);
    const quivra::base::KeepErrno keep_errno;
    struct stat status {};
    if (stat(kSharesPath, &status) == 0 && cache->state == FileState(status)) {
        return cache->conf;
    }
    cache->state.reset();
    cache->conf = ReadShares(*cache);
    if (cache->conf == nullptr) {
        SharesConf none;
        if (errno != ENOENT && errno != ENOTDIR) {
            none.is_readable = false;
            none.problems.push_back(std::string(kSharesPath) + ": " + strerrordesc_np(errno));
        }
        cache->conf = std::make_shared<const SharesConf>(std::move(none));
    }
    LogProblems(cache->conf->problems, *cache);
    return cache->conf;
}

}  // namespace

std::shared_ptr<const ShareList> LoadShares() {
    const std::shared_ptr<const SharesConf> conf = Load();
    if (!conf->is_readable) {
        SetError(KESTO_ERR_SYSTEM);
        return nullptr;
    }
    return {conf, &conf->shares};
}

}  // namespace kesto

int KESTOShareEnumProblems(KLIBCSzList** list) {
    const auto conf = kesto::Load();
    for (const std::string& problem : conf->problems) {
        if (KLIBCSzListPush(list, problem.c_str()) < 0) {
            return -1;
        }
    }
    return 0;
}
