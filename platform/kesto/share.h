#pragma once

#include <kesto/string_list.h>

#ifdef __cplusplus
extern "C" {
#endif

/// A shared folder. Names and paths are NUL-terminated.
struct KESTOShare {
    char szName[492];
    char szPath[4096];  ///< full path of the share's root; its last component is the name
    unsigned int ftp_privilege;
    int read_only;
    int hide_unreadable;
    int encryption;      ///< the share is of the encrypted kind
    int encrypted;       ///< it is so and locked at the moment
    int recycle;         ///< its recycle bin is switched on
    char szUsers[4096];  ///< rights as "NAME:rw NAME:ro"
};

/// Rights that KESTOShareUserPrivGet returns.
enum KESTOSharePrivilege {
    KESTO_SHARE_PRIV_NONE = 0,
    KESTO_SHARE_PRIV_READ = 1,
    KESTO_SHARE_PRIV_WRITE = 2,
};

/// Looks a share up by its exact name. 0 and a record that the caller frees with KESTOShareFree;
/// negative, and *share null, when there is no such share.
int KESTOShareGet(const char* name, struct KESTOShare** share);

/// Frees a record; null is allowed.
void KESTOShareFree(struct KESTOShare* share);

/// Appends the names of all shares to the list. Negative on failure.
int KESTOShareEnum(KLIBCSzList** list);

/// Appends a sentence for each mistake in the configuration of the shares, with its place
/// ("/etc/kesto/shares.conf:12: unknown key \"pth\""), for administrators to read. What is wrong is
/// left out of the shares; a mistake costs no other share. An addition of the stand-alone platform
/// that the library does not call. Negative on failure.
int KESTOShareEnumProblems(KLIBCSzList** list);

/// The share that a full path lies in: the one with the longest root that is a component-wise
/// prefix of the path. Fills its name and its root path; negative when there is none or a buffer
/// is too small.
int KESTOShareNamePathGet(const char* full_path, char* name, int name_size, char* path,
                          int path_size);

/// The right of a user on the share, a KESTOSharePrivilege; administrators always may write.
/// Negative on failure.
int KESTOShareUserPrivGet(const char* user, const struct KESTOShare* share);

/// 1 when the path is, or lies in, the recycle directory of a share; else 0. Negative on failure.
int KESTOShareIsShareRecycle(const char* path);

/// Read one flag of a share into *flag (0 or 1). Negative on failure.
int KLIBShareHideUnreadableGet(const struct KESTOShare* share, int* flag);
int KLIBShareIsEncryptionGet(const struct KESTOShare* share, int* flag);
int KLIBShareIsEncryptedGet(const struct KESTOShare* share, int* flag);
int KLIBShareIsReadOnlyGet(const struct KESTOShare* share, int* flag);
int KLIBShareRecycleStatusGet(const struct KESTOShare* share, int* flag);

#ifdef __cplusplus
}
#endif
