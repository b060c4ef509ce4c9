#include <grp.h>
#include <kesto/error.h>
#include <kesto/user.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "platform/standalone/error_state.h"
#include "platform/standalone/user_db.h"

namespace kesto {
namespace {

std::vector<gid_t> CurrentGroups() {
    std::vector<gid_t> groups;
    int count = 0;
    do {  // another thread may change the list between the two calls
        groups.resize(static_cast<std::size_t>(getgroups(0, nullptr)));
        count = getgroups(static_cast<int>(groups.size()), groups.data());
    } while (count < 0 && errno == EINVAL);
    groups.resize(static_cast<std::size_t>(count));
    return groups;
}

/// A switch of the effective identity that is undone unless it was completed. Only the super-user
/// may change groups, so it becomes that in between.
class IdentitySwitch {
  public:
    IdentitySwitch() : uid_(geteuid()), gid_(getegid()), groups_(CurrentGroups()) {}
    IdentitySwitch(const IdentitySwitch&) = delete;
    IdentitySwitch& operator=(const IdentitySwitch&) = delete;

    bool To(const UserEntry& user, bool switch_group) {
        completed_ =
            seteuid(0) == 0 && (!switch_group || SwitchGroups(user)) && seteuid(user.uid) == 0;
        return completed_;
    }

    ~IdentitySwitch() {
        if (completed_) {
            return;
        }
        const int saved_errno = errno;
        if ((groups_changed_ && setgroups(groups_.size(), groups_.data()) != 0) ||
            (gid_changed_ && setegid(gid_) != 0) || (geteuid() != uid_ && seteuid(uid_) != 0)) {
            syslog(LOG_CRIT, "Cannot return to user %u, group %u: %s. Ending the process", uid_,
                   gid_, std::strerror(errno));
            std::abort();
        }
        errno = saved_errno;
    }

  private:
    bool SwitchGroups(const UserEntry& user) {
        const std::vector<gid_t> groups = GroupsOf(user);
        groups_changed_ = setgroups(groups.size(), groups.data()) == 0;
        gid_changed_ = groups_changed_ && setegid(user.gid) == 0;
        return gid_changed_;
    }

    const uid_t uid_;
    const gid_t gid_;
    const std::vector<gid_t> groups_;
    bool groups_changed_ = false;
    bool gid_changed_ = false;
    bool completed_ = false;
};

/// The super-user's rights do not depend on its supplementary groups, which a user namespace does
/// not even let it set.
bool IsSuperUserAlready(const UserEntry& user, bool switch_group) {
    return user.uid == 0 && geteuid() == 0 && (!switch_group || getegid() == user.gid);
}

}  // namespace
}  // namespace kesto

bool ResetCredentialsByName(const char* user, bool switch_group) {
    const auto entry = kesto::FindUser(std::string(user));
    if (!entry) {
        return false;
    }
    if (kesto::IsSuperUserAlready(*entry, switch_group)) {
        return true;
    }
    if (!kesto::IdentitySwitch().To(*entry, switch_group)) {
        kesto::SetError(KESTO_ERR_SYSTEM);
        return false;
    }
    return true;
}
