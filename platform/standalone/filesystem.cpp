#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

#include "base/file.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/fs_types.h"
#include "platform/standalone/mounts.h"

int KESTOGetFSType(const char* path, int /*flags*/) {
    struct statfs status {};
    if (statfs(path, &status) != 0) {
        return kesto::SetError(KESTO_ERR_SYSTEM);
    }
    const auto magic = static_cast<unsigned long>(status.f_type);
    // One number for all of FUSE: a USB disk with NTFS is local, sshfs is not.
    if (magic == kesto::kFuseMagic) {
        return kesto::FuseTypeCode(kesto::FileSystemNameOf(path));
    }
    return kesto::TypeCode(magic);
}

int KESTOFSIsRemoteFS(int type) {
    return type == KESTO_FS_REMOTE;
}

int KESTOFSIsImageFS(int type) {
    return type == KESTO_FS_IMAGE;
}

int KESTOFSDirIsMntPoint(const char* path) {
    const int is_mount_root = kesto::IsMountRoot(path);
    return is_mount_root < 0 ? kesto::SetError(KESTO_ERR_SYSTEM) : is_mount_root;
}

int KESTOACLPermGet(const char* path) {
    if (faccessat(AT_FDCWD, path, F_OK, AT_EACCESS) != 0) {
        return kesto::SetError(KESTO_ERR_SYSTEM);
    }
    const quivra::base::KeepErrno keep_errno;
    // The kernel weighs POSIX ACLs, capabilities and read-only mounts in.
    int mask = 0;
    mask |= faccessat(AT_FDCWD, path, R_OK, AT_EACCESS) == 0 ? KESTO_ACL_PERM_READ : 0;
    mask |= faccessat(AT_FDCWD, path, W_OK, AT_EACCESS) == 0 ? KESTO_ACL_PERM_WRITE : 0;
    mask |= faccessat(AT_FDCWD, path, X_OK, AT_EACCESS) == 0 ? KESTO_ACL_PERM_EXEC : 0;
    return mask;
}
