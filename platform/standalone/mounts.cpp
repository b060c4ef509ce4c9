#include "platform/standalone/mounts.h"

#include <fcntl.h>
#include <libmount/libmount.h>
#include <sys/stat.h>

#include <cstdlib>
#include <memory>

namespace kesto {
namespace {

constexpr const char* kMountTable = "/proc/self/mountinfo";

using Table = std::unique_ptr<libmnt_table, void (*)(libmnt_table*)>;

using Iterator = std::unique_ptr<libmnt_iter, void (*)(libmnt_iter*)>;

Table ReadTable() {
    return {mnt_new_table_from_file(kMountTable), mnt_unref_table};
}

/// Backward, because the last mount at a place hides those before it.
Iterator Backward() {
    return {mnt_new_iter(MNT_ITER_BACKWARD), mnt_free_iter};
}

/// The mount that holds the path, from the table; null when it is not found.
libmnt_fs* FindMount(const Table& table, const struct statx& status) {
    libmnt_fs* found = nullptr;
    const Iterator iterator = Backward();
    const auto id = static_cast<int>(status.stx_mnt_id);
    while (mnt_table_next_fs(table.get(), iterator.get(), &found) == 0) {
        if (mnt_fs_get_id(found) == id) {
            return found;
        }
    }
    return nullptr;
}

}  // namespace

std::optional<std::set<std::string>> ReadMountPoints() {
    const Table table = ReadTable();
    if (table == nullptr) {
        return std::nullopt;
    }
    std::set<std::string> points;
    const Iterator iterator = Backward();
    libmnt_fs* mount = nullptr;
    while (mnt_table_next_fs(table.get(), iterator.get(), &mount) == 0) {
        if (const char* point = mnt_fs_get_target(mount)) {
            points.insert(point);
        }
    }
    return points;
}

quivra::base::UniqueFd WatchMounts() {
    return quivra::base::UniqueFd(open(kMountTable, O_RDONLY | O_CLOEXEC));
}

int IsMountRoot(const char* path) {
    struct statx status {};
    if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, 0, &status) != 0) {
        return -1;
    }
    // One call where the kernel tells; the table takes some microseconds for each of its lines.
    if ((status.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) == 0) {
        return IsMountRootByTable(path);
    }
    return (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

int IsMountRootByTable(const char* path) {
    struct stat status {};
    if (lstat(path, &status) != 0) {
        return -1;
    }
    const std::unique_ptr<char, void (*)(void*)> resolved(realpath(path, nullptr), std::free);
    const Table table = ReadTable();
    if (table == nullptr || resolved == nullptr) {
        return -1;
    }
    return !S_ISLNK(status.st_mode) &&
           mnt_table_find_target(table.get(), resolved.get(), MNT_ITER_BACKWARD) != nullptr;
}

std::string FileSystemNameOf(const char* path) {
    struct statx status {};
    // Asked for nothing, the kernel need not ask the file system, which may be a dead server's.
    if (statx(AT_FDCWD, path, AT_NO_AUTOMOUNT, 0, &status) != 0 ||
        (status.stx_mask & STATX_MNT_ID) == 0) {
        return {};
    }
    const Table table = ReadTable();
    libmnt_fs* mount = table == nullptr ? nullptr : FindMount(table, status);
    const char* name = mount == nullptr ? nullptr : mnt_fs_get_fstype(mount);
    return name == nullptr ? std::string() : name;
}

}  // namespace kesto
