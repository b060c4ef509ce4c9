#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "common/log.h"

namespace quivra {
namespace {

constexpr int kMaxAttempts = 64;
constexpr int kSleepSteps = 10;
constexpr useconds_t kSleepStepMicroseconds = 100000;

}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive) : path_(path) {
    for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
        Open();
        if (TryLock(exclusive)) {
            if (IsStillAtPath()) {
                return;
            }
            Close();  // replaced between open and lock: no need to wait for anybody
            continue;
        }
        Close();
        usleep(static_cast<useconds_t>(std::rand() % kSleepSteps) * kSleepStepMicroseconds);
    }
    Fail({"lock_file", __LINE__}, "attempt < kMaxAttempts",
         Error(Error::kLockFailed, "Exceed max retry"));
}

LockFile::~LockFile() {
    if (fd_ >= 0) {
        flock(fd_, LOCK_UN);
        Close();
    }
}

void LockFile::Open() {
    fd_ = open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    if (fd_ < 0) {
        const std::string reason = "open failed, reason=" + SystemErrorText(errno);
        Fail({"lock_file", __LINE__}, "0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))",
             Error(Error::kLockFailed, reason));
    }
}

bool LockFile::TryLock(bool exclusive) {
    if (flock(fd_, (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB) == 0) {
        return true;
    }
    if (errno == EINTR || errno == EAGAIN) {
        return false;
    }
    const std::string reason = SystemErrorText(errno);
    Close();
    Fail({"lock_file", __LINE__}, "0 > flock(fd_, operation | LOCK_NB)",
         Error(Error::kLockFailed, reason));
}

void LockFile::Close() {
    const int saved_errno = errno;
    close(fd_);
    errno = saved_errno;
    fd_ = -1;
}

bool LockFile::IsStillAtPath() const {
    struct stat held {};
    struct stat named {};
    return fstat(fd_, &held) == 0 && stat(path_.c_str(), &named) == 0 &&
           held.st_dev == named.st_dev && held.st_ino == named.st_ino;
}

}  // namespace quivra
