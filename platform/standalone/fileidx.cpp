#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "base/unique_fd.h"
#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

using quivra::base::UniqueFd;

enum class Place { kReady, kUnreachable, kUnsafe };

/// Anybody who may write to the share can put a directory there before we do. What is not ours is
/// not used: its owner could exchange what lies in it for links at any time.
Place CheckOwner(const UniqueFd& directory, const std::string& path) {
    struct stat status {};
    if (fstat(directory.Get(), &status) != 0) {
        return Place::kUnreachable;
    }
    if (status.st_uid != 0 && status.st_uid != geteuid()) {
        syslog(LOG_ERR, "%s is owned by user %u, not by root. Remove it to have the share indexed",
               path.c_str(), status.st_uid);
        return Place::kUnsafe;
    }
    return Place::kReady;
}

/// Opens the directory `name`, making it first where it is missing.
Place OpenDirectory(const UniqueFd& parent, const char* name, mode_t mode, const std::string& path,
                    UniqueFd& directory) {
    const bool made = mkdirat(parent.Get(), name, mode) == 0;
    if (!made && errno != EEXIST) {
        return Place::kUnreachable;
    }
    directory.Reset(openat(parent.Get(), name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory.IsValid()) {
        if (errno != ELOOP && errno != ENOTDIR) {
            return Place::kUnreachable;
        }
        syslog(LOG_ERR, "%s is not a directory. Remove it to have the share indexed", path.c_str());
        return Place::kUnsafe;
    }
    if (made) {
        fchmod(directory.Get(), mode);  // whatever the umask and default ACLs say
    }
    return CheckOwner(directory, path);
}

Place PrepareDirectory(const std::string& share_path) {
    const UniqueFd root(open(share_path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!root.IsValid()) {
        return Place::kUnreachable;
    }
    UniqueFd ea_dir;
    UniqueFd directory;
    Place place = OpenDirectory(root, "@eaDir", 0755, share_path + "/@eaDir", ea_dir);
    if (place == Place::kReady) {
        place =
            OpenDirectory(ea_dir, "fileindex", 0700, share_path + "/@eaDir/fileindex", directory);
    }
    struct stat status {};
    if (place == Place::kReady && fstat(directory.Get(), &status) == 0 &&
        (status.st_mode & 0777) != 0700) {
        fchmod(directory.Get(), 0700);
    }
    return place;
}

int Compose(const char* share_path, const char* name, char* out, int out_size) {
    if (share_path == nullptr || share_path[0] != '/') {
        return SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    const std::string path = std::string(share_path) + "/@eaDir/fileindex/" + name;
    if (out_size <= 0 || path.size() >= static_cast<std::size_t>(out_size)) {
        return SetError(KESTO_ERR_BUFFER_TOO_SMALL);
    }
    const KeepErrno keep_errno;
    if (PrepareDirectory(share_path) == Place::kUnsafe) {
        return SetError(KESTO_ERR_UNSAFE_PLACE);
    }
    path.copy(out, path.size());
    out[path.size()] = '\0';
    return 0;
}

}  // namespace
}  // namespace kesto

int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size) {
    return kesto::Compose(share_path, "queue", out, out_size);
}

int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size) {
    return kesto::Compose(share_path, "db", out, out_size);
}
