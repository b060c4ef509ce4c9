#pragma once

#include <kesto/string_list.h>

#ifdef __cplusplus
extern "C" {
#endif

/// A user of the system.
struct KESTOUser {
    char szName[492];
    unsigned int uid;
    unsigned int gid;  ///< the primary group
};

/// Looks a user up by id. 0 and a record that the caller frees with KESTOUserFree; negative, and
/// *user null, when there is none.
int KESTOUserGetByUID(unsigned int uid, struct KESTOUser** user);

/// Frees a record; null is allowed.
void KESTOUserFree(struct KESTOUser* user);

/// Makes the process act as the user: supplementary groups, effective group, effective user, in an
/// order that works in both directions. With `switch_group` false the groups stay. On failure it is
/// false and the identity is the old one; a process that cannot be brought back is ended.
bool ResetCredentialsByName(const char* user, bool switch_group);

/// 1 when the user is an administrator, 0 when not, negative on failure. `flags` is 0.
int KLIBGroupIsAdminGroupMem(const char* user, int flags);

/// Kinds of users that may have homes.
#define KESTO_USER_HOME_LOCAL 1
#define KESTO_USER_HOME_DOMAIN 2
#define KESTO_USER_HOME_DIRECTORY 8

/// 1 when the user-home service is on for that kind of user, 0 when not. `flags` is 0.
int KESTOServiceUserHomeIsEnabled(int kind, int flags);

/// Appends the recycle directory of every user's home to the list. 0 on success.
int KESTORecycleHomeEnumRecyclePath(KLIBCSzList** list);

#ifdef __cplusplus
}
#endif
