#include "programs/support/instance_lock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>

#include "common/error.h"
#include "common/log.h"

namespace support {

quivra::base::UniqueFd TakeInstanceLock(const std::string& path) {
    quivra::base::UniqueFd fd(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!fd.IsValid() || flock(fd.Get(), LOCK_EX | LOCK_NB) != 0) {
        const std::string reason =
            errno == EWOULDBLOCK ? "another process holds " + path
                                 : "cannot lock " + path + ": " + quivra::SystemErrorText(errno);
        quivra::Fail({"instance_lock", __LINE__}, "flock(fd, LOCK_EX | LOCK_NB) != 0",
                     quivra::Error(quivra::Error::kLockFailed, reason));
    }
    return fd;
}

}  // namespace support
