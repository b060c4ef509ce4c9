#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "base/file.h"
#include "common/log.h"

namespace quivra {
namespace {

constexpr LogUnit kLog{"lock_file", 0};

constexpr int kMaxAttempts = 64;
constexpr int kSleepSteps = 10;
constexpr useconds_t kSleepStepMicroseconds = 100000;
constexpr unsigned int kMode = 0644;

}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive)
    : LockFile(AT_FDCWD, path, exclusive, kMode) {}

LockFile::LockFile(int directory, const std::string& name, bool exclusive, unsigned int mode) {
    int attempt = 0;
    for (; attempt < kMaxAttempts; ++attempt) {
        base::UniqueFd fd;
        switch (base::TryLock(directory, name, exclusive, mode, fd)) {
            case base::LockAttempt::kTaken:
                fd_ = fd.Release();
                return;
            case base::LockAttempt::kReplaced:
                break;  // nobody to wait for
            case base::LockAttempt::kBusy:
                usleep(static_cast<useconds_t>(std::rand() % kSleepSteps) * kSleepStepMicroseconds);
                break;
            case base::LockAttempt::kOpenFailed: {
                const std::string reason = "open failed, reason=" + SystemErrorText(errno);
                // Support tools know this text. O_CREAT is left out where the file exists: kernels
                // refuse it to root for other users' files in /tmp.
                Fail(kLog.Here(), "0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))",
                     Error(Error::kLockFailed, reason));
            }
            case base::LockAttempt::kLockFailed: {
                const std::string reason = SystemErrorText(errno);
                Fail(kLog.Here(), "0 > flock(fd_, operation | LOCK_NB)",
                     Error(Error::kLockFailed, reason));
            }
        }
    }
    QUIVRA_FAIL_IF(kLog, attempt >= kMaxAttempts, Error(Error::kLockFailed, "Exceed max retry"));
}

LockFile::~LockFile() {
    if (fd_ >= 0) {
        flock(fd_, LOCK_UN);
        close(fd_);
    }
}

}  // namespace quivra
