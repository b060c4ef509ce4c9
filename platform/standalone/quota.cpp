#include "platform/standalone/quota.h"
#include "base/file.h"

#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "base/unique_fd.h"
#include "platform/standalone/error_state.h"

namespace kesto {

bool LeavesRoom(const dqblk& quota, unsigned long long bytes) {
    constexpr unsigned long long kBlock = 1024;  // whatever the file system's own block size
    const unsigned long long blocks =
        quota.dqb_bhardlimit != 0 ? quota.dqb_bhardlimit : quota.dqb_bsoftlimit;
    const unsigned long long limit = blocks * kBlock;
    return limit == 0 || (quota.dqb_curspace <= limit && limit - quota.dqb_curspace >= bytes);
}

namespace {

/// Whether the effective user's quota on the file system leaves that much. It does where no quota
/// is set or none can be asked for (a kernel before 5.14 included).
bool IsWithinQuota(int fd, unsigned long long bytes) {
    const quivra::base::KeepErrno keep_errno;
    dqblk quota{};
    return syscall(SYS_quotactl_fd, fd, QCMD(Q_GETQUOTA, USRQUOTA), geteuid(), &quota) != 0 ||
           LeavesRoom(quota, bytes);
}

}  // namespace
}  // namespace kesto

int KESTOQuotaIsEnough(int /*kind*/, const char* path, unsigned long long bytes) {
    const quivra::base::UniqueFd fd(open(path, O_PATH | O_CLOEXEC));
    struct statvfs status {};
    if (!fd.IsValid() || fstatvfs(fd.Get(), &status) != 0) {
        kesto::SetError(KESTO_ERR_SYSTEM);
        return 0;
    }
    // A file system without a size (an unlimited tmpfs, some network ones) has no known end.
    const unsigned long long available = 1ULL * status.f_bavail * status.f_frsize;
    if (status.f_blocks != 0 && available < bytes) {
        kesto::SetError(KESTO_ERR_VOLUME_FULL);
        return 0;
    }
    if (!kesto::IsWithinQuota(fd.Get(), bytes)) {
        kesto::SetError(KESTO_ERR_QUOTA_EXCEEDED);
        return 0;
    }
    return 1;
}
