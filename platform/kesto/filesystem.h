#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Bits of the mask that KESTOACLPermGet returns.
#define KESTO_ACL_PERM_EXEC 0x1
#define KESTO_ACL_PERM_WRITE 0x2
#define KESTO_ACL_PERM_READ 0x4

/// Type codes of file systems. KESTO_FS_VIRTUAL is that of the kernel's own (proc, sysfs and their
/// like).
#define KESTO_FS_LOCAL 1
#define KESTO_FS_VIRTUAL 12
#define KESTO_FS_REMOTE 64
#define KESTO_FS_IMAGE 128

/// Non-zero when at least `bytes` more can be written below `path` by the effective user. 0 when
/// not, or when that cannot be told; KLIBCErrGet is then KESTO_ERR_VOLUME_FULL,
/// KESTO_ERR_QUOTA_EXCEEDED, or another code. `kind` is 0.
int KESTOQuotaIsEnough(int kind, const char* path, unsigned long long bytes);

/// The type code of the file system that holds the path; negative on failure. `flags` is 0.
int KESTOGetFSType(const char* path, int flags);

/// Non-zero for a type code of a network file system, or of a mounted image.
int KESTOFSIsRemoteFS(int type);
int KESTOFSIsImageFS(int type);

/// 1 when something is mounted at the directory (bind mounts count), 0 when not, negative on
/// failure.
int KESTOFSDirIsMntPoint(const char* path);

/// Sets *flag to 1 when the path is, or lies in, the snapshot directory of a share, else to 0.
/// Negative on failure.
int KLIBFhsPathInSnapshot(const char* path, int* flag);

/// 1 when the base name is one of the platform's own hidden directories, else 0.
int KESTOEAIsHiddenDir(const char* name);

/// The permission bits (KESTO_ACL_PERM_*) that the calling user holds on the path; negative on
/// failure.
int KESTOACLPermGet(const char* path);

#ifdef __cplusplus
}
#endif
