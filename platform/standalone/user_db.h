#pragma once

#include <grp.h>
#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace kesto {

struct UserEntry {
    std::string name;
    uid_t uid;
    gid_t gid;  ///< the primary group
};

/// Looks a user up in the system's database. Nothing, with the error set, when there is none.
std::optional<UserEntry> FindUser(const std::string& name);
std::optional<UserEntry> FindUser(uid_t uid);

/// The groups that the user belongs to, the primary one included.
std::vector<gid_t> GroupsOf(const UserEntry& user);

/// The id of a group; nothing when there is no such group.
std::optional<gid_t> FindGroup(const std::string& name);

}  // namespace kesto
