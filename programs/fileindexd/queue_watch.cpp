#include "programs/fileindexd/queue_watch.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string_view>

#include "base/file.h"
#include "common/error.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/event.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexd/backlog.h"

namespace fileindexd {

namespace {

constexpr const char* kUnit = "queue_watch";

/// More new lines than this are a burst that is no busy file's alone.
constexpr std::size_t kReadAtMost = 64 * 1024;

/// A queue that cannot be read may hold lines: the pass will find out.
constexpr std::chrono::seconds kLookAgain{1};

std::string NewText(int fd, off_t offset) {
    std::string text(kReadAtMost, '\0');
    ssize_t size;
    do {
        size = pread(fd, text.data(), text.size(), offset);
    } while (size < 0 && errno == EINTR);
    text.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
    return text;
}

/// From when on the line is to be processed: at once, unless it is about a busy file's content.
Clock::time_point NotBefore(const std::string& line, const ChangeRates& rates,
                            Clock::time_point now) {
    using namespace quivra::fileindex;
    try {
        const Event event(line);
        const bool is_content = (event.event & ~(EVENT_CREATE | EVENT_MODIFY | EVENT_ATTR)) == 0;
        return is_content && !event.is_dir ? rates.NotBefore(event.path, now) : now;
    } catch (const quivra::Error&) {
        return now;  // the pass will log it
    }
}

}  // namespace

QueueWatch::QueueWatch(const quivra::base::PrivateDirectory& directory, std::string queue)
    : directory_(directory),
      queue_(std::move(queue)),
      inotify_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
    // By the descriptor: another directory may stand at the path by now.
    const std::string opened = "/proc/self/fd/" + std::to_string(directory_.Fd());
    queue_watch_ = inotify_add_watch(inotify_.Get(), opened.c_str(),
                                     IN_MODIFY | IN_MOVED_TO | IN_CREATE | IN_DELETE |
                                         IN_MOVED_FROM | IN_MOVE_SELF | IN_ONLYDIR);
    if (queue_watch_ < 0) {
        quivra::Fail({kUnit, __LINE__}, "queue_watch_ < 0",
                     quivra::Error(quivra::Error::kSystemCallFailed,
                                   "Cannot watch " + directory_.Path() + ": " +
                                       quivra::SystemErrorText(errno)));
    }
    const std::string status = quivra::Dirname(quivra::fileindex::kFileIndexStatusCfgPath);
    status_watch_ = inotify_add_watch(inotify_.Get(), status.c_str(), IN_MOVED_TO | IN_CLOSE_WRITE);
    if (status_watch_ < 0) {
        quivra::LogError({kUnit, __LINE__}, "Cannot watch %s: reindex requests wait for a restart",
                         status.c_str());
    }
}

QueueWatch::News QueueWatch::Read() {
    alignas(inotify_event) char buffer[16384];
    News news;
    for (;;) {
        const ssize_t size = read(inotify_.Get(), buffer, sizeof(buffer));
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size <= 0) {
            return news;
        }
        for (ssize_t at = 0; at < size;) {
            inotify_event event;
            std::memcpy(&event, buffer + at, sizeof(event));
            HandleEvent(news, event.wd, event.mask,
                        event.len > 0 ? buffer + at + sizeof(event) : "");
            at += static_cast<ssize_t>(sizeof(event) + event.len);
        }
    }
}

void QueueWatch::HandleEvent(News& news, int watch, unsigned int mask, const char* name) const {
    if ((mask & IN_Q_OVERFLOW) != 0) {
        news.queue = news.status = true;
    } else if (watch == queue_watch_) {
        // While it is held open, no event tells that the directory itself was removed.
        const bool is_lost = (mask & (IN_DELETE | IN_MOVED_FROM)) != 0;
        news.gone |= (mask & (IN_MOVE_SELF | IN_UNMOUNT | IN_IGNORED)) != 0 ||
                     (is_lost && std::strcmp(name, Backlog::kFileName) == 0);
        news.queue |= !is_lost && queue_ == name;
    } else if (watch == status_watch_) {
        news.status |= quivra::Basename(quivra::fileindex::kFileIndexStatusCfgPath) == name;
    }
}

void QueueWatch::ReadNewLines(Schedule& schedule, const ChangeRates& rates, Clock::time_point now) {
    const quivra::base::UniqueFd fd = quivra::base::OpenRegular(directory_.Fd(), queue_, O_RDONLY);
    struct stat info {};
    if (!fd.IsValid() || fstat(fd.Get(), &info) != 0) {
        if (errno != ENOENT) {
            schedule.QueueChangedLater(now + kLookAgain);  // out of descriptors, for instance
        }
        return;  // else a pass, perhaps of another process, has taken it
    }
    if (info.st_ino != inode_ || info.st_size < offset_) {
        inode_ = info.st_ino;
        offset_ = 0;
    }
    const std::string text = NewText(fd.Get(), offset_);
    std::size_t begin = 0;
    Clock::time_point due = Clock::time_point::max();
    for (std::size_t end; (end = text.find('\n', begin)) != std::string::npos; begin = end + 1) {
        due = std::min(due, NotBefore(text.substr(begin, end - begin), rates, now));
    }
    offset_ += static_cast<off_t>(begin);
    if (text.size() == kReadAtMost) {
        offset_ = info.st_size;
        due = now;
    }
    if (due <= now) {
        schedule.QueueChanged(now);
    } else if (due != Clock::time_point::max()) {
        schedule.QueueChangedLater(due);
    }
}

}  // namespace fileindexd
