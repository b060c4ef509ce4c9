#include "programs/kestotifyd/queue_writer.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "common/log.h"

namespace kestotifyd {
namespace {

constexpr std::size_t kMaxChunk = 1U << 20;
constexpr int kMaxOpenAttempts = 8;

bool IsStillAtPath(int fd, const std::string& path) {
    struct stat held {};
    struct stat named {};
    return fstat(fd, &held) == 0 && lstat(path.c_str(), &named) == 0 &&
           held.st_dev == named.st_dev && held.st_ino == named.st_ino;
}

}  // namespace

QueueWriter::QueueWriter(std::string path, std::string crash_line, std::size_t max_pending)
    : path_(std::move(path)), crash_line_(std::move(crash_line)), max_pending_(max_pending) {}

void QueueWriter::Add(std::vector<std::string> lines) {
    for (std::string& line : lines) {
        pending_bytes_ += line.size();
        pending_.push_back(std::move(line));
    }
    if (pending_bytes_ > max_pending_) {
        errno = 0;
        quivra::LogError({"queue_writer", __LINE__},
                         "%zu event lines for %s were dropped, for they could not be written: its "
                         "share will be indexed again as a whole",
                         pending_.size(), path_.c_str());
        pending_.assign(1, crash_line_);
        pending_bytes_ = crash_line_.size();
    }
}

QueueWriter::Result QueueWriter::Write() {
    has_begun_file_ = false;
    if (pending_.empty()) {
        return Result::kDone;
    }
    quivra::base::UniqueFd queue;
    const Result opened = OpenLocked(queue);
    if (opened == Result::kFailed) {
        return Fail("open or lock");
    }
    if (opened == Result::kBusy) {
        return opened;
    }
    if (!EndTornLine(queue.Get())) {
        return Fail("repair");
    }
    while (!pending_.empty()) {
        if (Append(queue.Get()) != Result::kDone) {
            return Fail("append to");
        }
    }
    is_failure_logged_ = false;
    return Result::kDone;
}

QueueWriter::Result QueueWriter::Fail(const char* action) {
    if (!std::exchange(is_failure_logged_, true)) {
        quivra::LogError({"queue_writer", __LINE__},
                         "Cannot %s the queue %s, its events wait in memory", action,
                         path_.c_str());
    }
    return Result::kFailed;
}

QueueWriter::Result QueueWriter::OpenLocked(quivra::base::UniqueFd& queue) const {
    for (int attempt = 0; attempt < kMaxOpenAttempts; ++attempt) {
        queue.Reset(open(path_.c_str(),
                         O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
        struct stat status {};
        if (!queue.IsValid() || fstat(queue.Get(), &status) != 0) {
            return Result::kFailed;
        }
        if (!S_ISREG(status.st_mode)) {
            errno = EINVAL;
            return Result::kFailed;
        }
        if (flock(queue.Get(), LOCK_EX | LOCK_NB) != 0) {
            return errno == EWOULDBLOCK || errno == EINTR ? Result::kBusy : Result::kFailed;
        }
        // The reader renames the queue away while it holds the lock.
        if (IsStillAtPath(queue.Get(), path_)) {
            return Result::kDone;
        }
    }
    return Result::kBusy;
}

bool QueueWriter::EndTornLine(int fd) {
    const off_t size = lseek(fd, 0, SEEK_END);
    has_begun_file_ = size == 0;
    char last = '\n';
    if (size < 0 || (size > 0 && pread(fd, &last, 1, size - 1) != 1)) {
        return false;
    }
    return last == '\n' || write(fd, "\n", 1) == 1;
}

QueueWriter::Result QueueWriter::Append(int fd) {
    std::string chunk;
    for (auto it = pending_.begin(); it != pending_.end() && chunk.size() < kMaxChunk; ++it) {
        chunk += *it;
    }
    std::size_t written = 0;
    while (written < chunk.size()) {
        const ssize_t size = write(fd, chunk.data() + written, chunk.size() - written);
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size <= 0) {
            break;
        }
        written += static_cast<std::size_t>(size);
    }
    const int saved_errno = errno;
    const std::size_t whole = chunk.rfind('\n', written - 1) + 1;
    const std::size_t kept = written == 0 ? 0 : whole;
    DropWritten(kept);
    if (written == chunk.size()) {
        return Result::kDone;
    }
    const off_t end = lseek(fd, 0, SEEK_END);
    if (end >= 0 && ftruncate(fd, end - static_cast<off_t>(written - kept)) != 0) {
        // The next append ends the line instead.
    }
    errno = saved_errno;
    return Result::kFailed;
}

void QueueWriter::DropWritten(std::size_t size) {
    while (size > 0) {
        size -= pending_.front().size();
        pending_bytes_ -= pending_.front().size();
        pending_.pop_front();
    }
}

}  // namespace kestotifyd
