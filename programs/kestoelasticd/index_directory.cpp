#include "programs/kestoelasticd/index_directory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>

#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/util.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

namespace fs = std::filesystem;
using quivra::Error;

constexpr char kMarkerName[] = "/kestoelasticd.index";
constexpr char kCopySuffix[] = ".moving";
constexpr int kFormat = 1;
constexpr std::size_t kMaxPath = 3800;  ///< leaves room for the names of the files below

[[noreturn]] void FailFile(const std::string& what) {
    const int code = errno == ENOSPC || errno == EDQUOT ? kNoSpace : kEngineFailed;
    throw Error(code, what + ": " + quivra::SystemErrorText(errno));
}

[[noreturn]] void Refuse(const std::string& path, const std::string& why) {
    throw Error(kPathRefused, path + " cannot hold an index: " + why);
}

void SyncPath(const std::string& path) {
    const quivra::base::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    if (!fd.IsValid() || fsync(fd.Get()) != 0) {
        FailFile("cannot sync " + path);
    }
}

std::string Parent(const std::string& path) {
    const std::string parent = quivra::Dirname(path);
    return parent.empty() ? "/" : parent;
}

bool IsTrusted(uid_t owner) {
    return owner == 0 || owner == geteuid();
}

bool Exists(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0;
}

void RemoveTree(const std::string& path) {
    std::error_code error;
    fs::remove_all(path, error);  // does not follow links
    if (error) {
        errno = error.value();
        FailFile("cannot remove " + path);
    }
}

void Copy(const std::string& from, const std::string& to) {
    std::error_code error;
    fs::copy(from, to, fs::copy_options::recursive | fs::copy_options::skip_existing, error);
    if (error) {
        errno = error.value();
        FailFile("cannot copy " + from + " to " + to);
    }
}

/// Copies an index, durably. The marker comes first: half a copy is known for what it is.
void CopyIndex(const std::string& from, const std::string& to) {
    if (mkdir(to.c_str(), 0700) != 0) {
        FailFile("cannot make " + to);
    }
    Copy(from + kMarkerName, to + kMarkerName);
    SyncPath(to + kMarkerName);
    Copy(from, to);
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(to)) {
        SyncPath(entry.path().string());
    }
    SyncPath(to);
}

/// Makes room at a path: an empty directory or an index that nobody owns goes.
void ClearPath(const std::string& directory) {
    if (!Exists(directory) || rmdir(directory.c_str()) == 0) {
        return;
    }
    if (!IsIndexDirectory(directory, std::string())) {
        Refuse(directory, "something else is there");
    }
    RemoveTree(directory);
}

}  // namespace

std::string DatabasePath(const std::string& directory) {
    return directory + "/glass";
}

void CheckIndexPath(const std::string& directory) {
    const fs::path path(directory);
    if (!path.is_absolute() || path.lexically_normal() != path || directory.size() > kMaxPath ||
        directory.find('\0') != std::string::npos || quivra::Basename(directory).empty()) {
        Refuse(directory, "it is no plain absolute path");
    }
    std::string part;
    for (const fs::path& component : path) {
        part = part.empty()  ? component.string()
               : part == "/" ? part + component.string()
                             : part + "/" + component.string();
        struct stat status {};
        if (lstat(part.c_str(), &status) != 0) {
            if (part == directory && errno == ENOENT) {
                break;
            }
            Refuse(directory, quivra::SystemErrorText(errno));
        }
        const bool is_last = part == directory;
        if (S_ISLNK(status.st_mode) && (is_last || !IsTrusted(status.st_uid))) {
            Refuse(directory, part + " is a symbolic link");
        }
        if (is_last && (!S_ISDIR(status.st_mode) || !IsTrusted(status.st_uid))) {
            Refuse(directory, "something else is there");
        }
    }
    struct stat parent {};
    if (stat(Parent(directory).c_str(), &parent) != 0 || !S_ISDIR(parent.st_mode)) {
        Refuse(directory, "its parent is no directory");
    }
}

void MakeIndexDirectory(const std::string& directory, const std::string& uuid) {
    CheckIndexPath(directory);
    ClearPath(directory);
    if (mkdir(directory.c_str(), 0700) != 0) {
        FailFile("cannot make " + directory);
    }
    Json::Value marker;
    marker["format"] = kFormat;
    marker["uuid"] = uuid;
    if (!quivra::toFile(marker, directory + kMarkerName)) {
        const int saved_errno = errno;
        rmdir(directory.c_str());
        errno = saved_errno;
        FailFile("cannot mark " + directory);
    }
    SyncPath(Parent(directory));
}

bool IsIndexDirectory(const std::string& directory, const std::string& uuid) {
    struct stat status {};
    Json::Value marker;
    return lstat(directory.c_str(), &status) == 0 && S_ISDIR(status.st_mode) &&
           quivra::IsFileExist(directory + kMarkerName) &&
           quivra::fromFile(marker, directory + kMarkerName) && marker.isObject() &&
           marker["uuid"].isString() && (uuid.empty() || marker["uuid"].asString() == uuid);
}

bool RemoveIndexDirectory(const std::string& directory, const std::string& uuid) {
    if (!IsIndexDirectory(directory, uuid)) {
        return !Exists(directory);
    }
    // The marker goes last: what is interrupted can be done again.
    RemoveTree(DatabasePath(directory));
    RemoveTree(directory);
    return true;
}

Moved MoveIndexDirectory(const std::string& from, const std::string& to, const std::string& uuid) {
    CheckIndexPath(to);
    if (!IsIndexDirectory(from, uuid)) {
        if (IsIndexDirectory(to, uuid)) {
            return Moved::kWhole;
        }
        throw Error(kIndexUnavailable, "The index is neither in " + from + " nor in " + to);
    }
    ClearPath(to);
    if (rename(from.c_str(), to.c_str()) == 0) {
        SyncPath(Parent(to));
        SyncPath(Parent(from));
        return Moved::kWhole;
    }
    if (errno != EXDEV) {
        FailFile("cannot move " + from + " to " + to);
    }
    const std::string aside = to + kCopySuffix;
    ClearPath(aside);
    CopyIndex(from, aside);
    if (rename(aside.c_str(), to.c_str()) != 0) {
        FailFile("cannot rename " + aside);
    }
    SyncPath(Parent(to));
    return Moved::kCopied;
}

void UndoMove(const std::string& from, const std::string& to, const std::string& uuid) {
    if (from == to || !IsIndexDirectory(from, uuid)) {
        return;
    }
    RemoveIndexDirectory(to, uuid);
    const std::string aside = to + kCopySuffix;
    if (rmdir(aside.c_str()) != 0) {
        RemoveIndexDirectory(aside, uuid);
    }
}

}  // namespace elasticd
