#include "platform/standalone/user_db.h"

#include <kesto/error.h>
#include <pwd.h>

#include <cerrno>

#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

constexpr std::size_t kMaxEntrySize = 16U << 20;  // a group of very many members

/// Calls one of the getpw*_r and getgr*_r functions with a buffer that grows until the entry fits,
/// and gives `use` the entry. False when there is none or, with errno set, when the lookup failed.
template <typename Entry, typename Lookup, typename Use>
bool WithEntry(const Lookup& lookup, const Use& use) {
    const int saved_errno = errno;
    std::vector<char> buffer(1024);
    while (true) {
        Entry entry{};
        Entry* found = nullptr;
        const int error = lookup(&entry, buffer.data(), buffer.size(), &found);
        if (error == ERANGE && buffer.size() < kMaxEntrySize) {
            buffer.resize(buffer.size() * 2);
        } else if (error != EINTR) {
            // Databases behind a network answer ENOENT, ESRCH, EBADF or EPERM for "no such user";
            // only the pointer tells.
            errno = error != 0 ? error : saved_errno;
            if (found != nullptr) {
                use(*found);
            }
            return found != nullptr;
        }
    }
}

template <typename Lookup>
std::optional<UserEntry> FindUserBy(const Lookup& lookup) {
    std::optional<UserEntry> user;
    if (!WithEntry<passwd>(lookup, [&](const passwd& entry) {
            user = {entry.pw_name, entry.pw_uid, entry.pw_gid};
        })) {
        SetError(KESTO_ERR_NO_SUCH_USER);
    }
    return user;
}

}  // namespace

std::optional<UserEntry> FindUser(const std::string& name) {
    return FindUserBy([&](passwd* entry, char* buffer, std::size_t size, passwd** found) {
        return getpwnam_r(name.c_str(), entry, buffer, size, found);
    });
}

std::optional<UserEntry> FindUser(uid_t uid) {
    return FindUserBy([&](passwd* entry, char* buffer, std::size_t size, passwd** found) {
        return getpwuid_r(uid, entry, buffer, size, found);
    });
}

std::vector<gid_t> GroupsOf(const UserEntry& user) {
    // The member may be in more groups than that: the call then says how many, and is repeated.
    int count = 32;
    std::vector<gid_t> groups(static_cast<std::size_t>(count));
    while (getgrouplist(user.name.c_str(), user.gid, groups.data(), &count) < 0) {
        groups.resize(static_cast<std::size_t>(count));
    }
    groups.resize(static_cast<std::size_t>(count));
    return groups;
}

std::optional<gid_t> FindGroup(const std::string& name) {
    std::optional<gid_t> gid;
    WithEntry<group>(
        [&](group* entry, char* buffer, std::size_t size, group** found) {
            return getgrnam_r(name.c_str(), entry, buffer, size, found);
        },
        [&](const group& entry) { gid = entry.gr_gid; });
    return gid;
}

}  // namespace kesto
