#include "programs/kestotifyd/queue_writer.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "base/file.h"
#include "base/path.h"
#include "base/queue_file.h"
#include "common/log.h"

namespace kestotifyd {
namespace {

using quivra::base::LockAttempt;
using quivra::base::PrivateDirectory;

/// A reader that waits for the lock gets it between two chunks' worth of lines at the latest.
constexpr std::size_t kMaxChunk = 1U << 20;
/// How often in a row the reader may take the queue away between our opening and locking it.
constexpr int kMaxOpenAttempts = 8;

}  // namespace

QueueWriter::QueueWriter(const std::string& path, std::string crash_line, std::size_t max_pending)
    : directory_(quivra::base::Directory(path)),
      name_(quivra::base::Name(path)),
      crash_line_(std::move(crash_line)),
      max_pending_(max_pending) {}

void QueueWriter::Add(std::vector<std::string> lines) {
    for (std::string& line : lines) {
        pending_bytes_ += line.size();
        pending_.push_back(std::move(line));
    }
    if (pending_bytes_ > max_pending_) {
        errno = 0;
        quivra::LogError({"queue_writer", __LINE__},
                         "%zu event lines for %s/%s were dropped, for they could not be written: "
                         "its share will be indexed again as a whole",
                         pending_.size(), directory_.c_str(), name_.c_str());
        LosePending();
    }
}

void QueueWriter::LosePending() {
    pending_.assign(1, crash_line_);
    pending_bytes_ = crash_line_.size();
}

QueueWriter::Result QueueWriter::Write(PrivateDirectory::Make make) {
    has_begun_file_ = false;
    PrivateDirectory directory;
    if (!OpenDirectory(make, directory)) {
        return Result::kFailed;
    }
    if (pending_.empty()) {
        problem_.clear();
        return Result::kDone;
    }
    quivra::base::UniqueFd queue;
    const Result opened = OpenLocked(directory.Fd(), queue);
    if (opened != Result::kDone) {
        return opened;
    }
    struct stat status {};
    has_begun_file_ = fstat(queue.Get(), &status) == 0 && status.st_size == 0;
    while (!pending_.empty()) {
        if (Append(queue.Get()) != Result::kDone) {
            return FailCall("write to");
        }
    }
    problem_.clear();
    return Result::kDone;
}

/// The lines that wait for a directory that somebody has exchanged are given up: nobody knows for
/// how long, and the whole share has to be looked at again in any case.
bool QueueWriter::OpenDirectory(PrivateDirectory::Make make, PrivateDirectory& directory) {
    directory = PrivateDirectory::Open(directory_, make);
    if (!directory.IsValid()) {
        if (directory.Problem().empty()) {
            FailCall("open the directory of");
        } else {
            LosePending();
            Fail(directory.Problem());
        }
        return false;
    }
    struct stat status {};
    if (fstat(directory.Fd(), &status) != 0) {
        FailCall("open the directory of");
        return false;
    }
    const std::pair<std::uint64_t, std::uint64_t> found(status.st_dev, status.st_ino);
    if (written_to_.second != 0 && written_to_ != found) {
        LosePending();
    }
    written_to_ = found;
    return true;
}

QueueWriter::Result QueueWriter::OpenLocked(int directory, quivra::base::UniqueFd& queue) {
    for (int attempt = 0; attempt < kMaxOpenAttempts; ++attempt) {
        switch (quivra::base::TryLock(directory, name_, true, quivra::base::kQueueMode, queue)) {
            case LockAttempt::kTaken:
                return Result::kDone;
            case LockAttempt::kBusy:
                return Result::kBusy;
            case LockAttempt::kReplaced:
                continue;
            case LockAttempt::kOpenFailed:
                if (errno == ELOOP || errno == EINVAL || errno == EISDIR || errno == ENXIO) {
                    return Fail(directory_ + "/" + name_ + " is not a regular file; remove it");
                }
                return FailCall("open");
            case LockAttempt::kLockFailed:
                return FailCall("lock");
        }
    }
    return Result::kBusy;
}

QueueWriter::Result QueueWriter::FailCall(const char* action) {
    const std::string cause = quivra::SystemErrorText(errno);
    return Fail(std::string("Cannot ") + action + " the queue " + directory_ + "/" + name_ + ": " +
                cause);
}

/// One line for each cause, not one for each attempt.
QueueWriter::Result QueueWriter::Fail(std::string problem) {
    if (problem_ != problem) {
        problem_ = std::move(problem);
        errno = 0;
        quivra::LogError({"queue_writer", __LINE__}, "%s", problem_.c_str());
    }
    return Result::kFailed;
}

QueueWriter::Result QueueWriter::Append(int fd) {
    std::string chunk;
    for (auto it = pending_.begin(); it != pending_.end() && chunk.size() < kMaxChunk; ++it) {
        chunk += *it;
    }
    const std::size_t written = quivra::base::AppendLines(fd, chunk);
    DropWritten(written);
    return written == chunk.size() ? Result::kDone : Result::kFailed;
}

void QueueWriter::DropWritten(std::size_t size) {
    while (size > 0) {
        size -= pending_.front().size();
        pending_bytes_ -= pending_.front().size();
        pending_.pop_front();
    }
}

}  // namespace kestotifyd
