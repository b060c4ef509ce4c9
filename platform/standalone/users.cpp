#include <dirent.h>
#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/user.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>

#include "platform/standalone/error_state.h"
#include "platform/standalone/shares_conf.h"
#include "platform/standalone/user_db.h"

namespace {

constexpr const char* kHomesShare = "homes";
constexpr const char* kAdministrators = "administrators";

}  // namespace

int KESTOUserGetByUID(unsigned int uid, KESTOUser** user) {
    *user = nullptr;
    const auto entry = kesto::FindUser(uid);
    if (!entry) {
        return -1;
    }
    if (entry->name.size() >= sizeof((*user)->szName)) {
        return kesto::SetError(KESTO_ERR_BUFFER_TOO_SMALL);
    }
    *user = new KESTOUser{"", entry->uid, entry->gid};
    entry->name.copy((*user)->szName, entry->name.size());
    return 0;
}

void KESTOUserFree(KESTOUser* user) {
    delete user;
}

int KLIBGroupIsAdminGroupMem(const char* user, int /*flags*/) {
    const auto entry = kesto::FindUser(std::string(user));
    if (!entry) {
        return -1;
    }
    if (entry->uid == 0) {
        return 1;
    }
    // An ordinary machine need not have the group; then only root is one.
    const auto administrators = kesto::FindGroup(kAdministrators);
    if (!administrators) {
        return 0;
    }
    const auto groups = kesto::GroupsOf(*entry);
    return std::find(groups.begin(), groups.end(), *administrators) != groups.end();
}

int KESTOServiceUserHomeIsEnabled(int kind, int /*flags*/) {
    // Homes are on by sharing them; users of a domain or directory are not told apart here.
    const auto shares = kesto::LoadShares();
    return kind == KESTO_USER_HOME_LOCAL && shares != nullptr &&
           kesto::FindShare(*shares, kHomesShare) != nullptr;
}

int KESTORecycleHomeEnumRecyclePath(KLIBCSzList** list) {
    const auto shares = kesto::LoadShares();
    if (shares == nullptr) {
        return -1;
    }
    const kesto::ShareConf* homes = kesto::FindShare(*shares, kHomesShare);
    if (homes == nullptr) {
        return kesto::SetError(KESTO_ERR_NO_SUCH_SHARE);
    }
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(opendir(homes->path.c_str()), closedir);
    if (directory == nullptr) {
        return kesto::SetError(KESTO_ERR_SYSTEM);
    }
    errno = 0;  // readdir's null is the end or a failure
    while (const dirent* entry = readdir(directory.get())) {
        const std::string recycle = std::string(entry->d_name) + "/#recycle";
        struct stat status {};
        // A home's owner could put a link there: no directory behind one is a recycle bin.
        if (entry->d_name[0] != '.' &&
            fstatat(dirfd(directory.get()), recycle.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
            S_ISDIR(status.st_mode) &&
            KLIBCSzListPush(list, (homes->path + "/" + recycle).c_str()) < 0) {
            return -1;
        }
        errno = 0;
    }
    return errno == 0 ? 0 : kesto::SetError(KESTO_ERR_SYSTEM);
}
