#include "programs/sqlite/vfs.h"

#include <sqlite3.h>

#include <cstring>

namespace sqlite {
namespace {

constexpr char kName[] = "quivra-private";

int KeepName(sqlite3_vfs* /*vfs*/, const char* name, int size, char* out) {
    const std::size_t length = std::strlen(name) + 1;
    if (length > static_cast<std::size_t>(size)) {
        return SQLITE_CANTOPEN;
    }
    std::memcpy(out, name, length);
    return SQLITE_OK;
}

/// A copy, because SQLite chains registered file systems through the structure itself. Everything
/// but the name works on the file's own data, so the original's functions serve the copy, too.
sqlite3_vfs MakeVfs() {
    sqlite3_initialize();
    sqlite3_vfs vfs = *sqlite3_vfs_find("unix");
    vfs.pNext = nullptr;
    vfs.zName = kName;
    vfs.xFullPathname = KeepName;
    return vfs;
}

}  // namespace

std::string NameInDirectory(int directory, const std::string& name) {
    return "/proc/self/fd/" + std::to_string(directory) + "/" + name;
}

const char* PrivateVfs() {
    static sqlite3_vfs vfs = MakeVfs();
    static const int registered = sqlite3_vfs_register(&vfs, 0);
    return registered == SQLITE_OK ? kName : "";
}

}  // namespace sqlite
