#include "programs/daemon/instance_lock.h"

#include <fcntl.h>

#include <cerrno>

#include "base/file.h"
#include "common/error.h"
#include "common/log.h"

namespace quivra::daemon {

base::UniqueFd TakeInstanceLock(const std::string& path) {
    base::UniqueFd fd;
    base::LockAttempt attempt;
    do {
        attempt = base::TryLock(AT_FDCWD, path, true, 0600, fd);
    } while (attempt == base::LockAttempt::kReplaced);
    if (attempt != base::LockAttempt::kTaken) {
        const std::string reason = attempt == base::LockAttempt::kBusy
                                       ? "another process holds " + path
                                       : "cannot lock " + path + ": " + SystemErrorText(errno);
        Fail({"instance_lock", __LINE__}, "attempt != LockAttempt::kTaken",
             Error(Error::kLockFailed, reason));
    }
    return fd;
}

}  // namespace quivra::daemon
