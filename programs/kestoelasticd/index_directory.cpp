#include "programs/kestoelasticd/index_directory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <ctime>

#include "base/file.h"
#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/directory_tree.h"
#include "programs/kestoelasticd/engine/sqlite/layout.h"

namespace elasticd {
namespace {

using quivra::Error;
using quivra::base::PrivateDirectory;
using quivra::base::UniqueFd;

constexpr char kMarkerName[] = "kestoelasticd.index";
constexpr char kCopySuffix[] = ".moving";
constexpr char kAsideSuffix[] = ".set-aside-";
constexpr int kFormat = 2;  ///< 1 was the format of the former engine
constexpr std::size_t kMaxPath = 3800;
constexpr std::size_t kMaxMarker = 4096;

[[noreturn]] void Refuse(const std::string& path, const std::string& why) {
    throw Error(kPathRefused, path + " cannot hold an index: " + why);
}

std::string Name(const std::string& path) {
    return std::string(quivra::base::Name(path));
}

/// The directory above. It is one of ours, too, unless it is the root that the index lies in.
UniqueFd OpenParent(const std::string& path) {
    const std::string parent(quivra::base::Directory(path));
    if ((parent + "/").find("/@eaDir/") == std::string::npos) {
        return quivra::base::OpenDirectory(AT_FDCWD, parent);
    }
    const PrivateDirectory directory = PrivateDirectory::Open(parent);
    return UniqueFd(directory.IsValid() ? fcntl(directory.Fd(), F_DUPFD_CLOEXEC, 0) : -1);
}

struct Marker {
    int format = 0;
    std::string uuid;
};

/// Format 0 where there is no marker.
Marker ReadMarker(int directory) {
    Marker marker;
    std::string text;
    Json::Value json;
    const UniqueFd file = quivra::base::OpenRegular(directory, kMarkerName, O_RDONLY);
    if (file.IsValid() && quivra::base::ReadUpTo(file.Get(), kMaxMarker, text) &&
        quivra::fromString(json, text) && json.isObject() && json["uuid"].isString() &&
        json["format"].isInt()) {
        marker.format = json["format"].asInt();
        marker.uuid = json["uuid"].asString();
    }
    return marker;
}

Found Judge(int directory, const std::string& uuid) {
    const Marker marker = ReadMarker(directory);
    if (marker.format != 0 && (uuid.empty() || marker.uuid == uuid)) {
        return marker.format == kFormat ? Found::kIndex : Found::kOldFormat;
    }
    const std::vector<std::string> names = NamesIn(directory);
    const bool ours = std::any_of(names.begin(), names.end(), [](const std::string& name) {
        return name == kMarkerName || name == engine::sqlite::kFileName || name == "glass";
    });
    return names.empty() ? Found::kNothing : ours ? Found::kRemains : Found::kForeign;
}

/// Makes room at a path: an empty directory or an index that nobody owns goes.
void ClearPath(const std::string& path) {
    const Look look = LookAt(path, std::string());
    if (look.found == Found::kForeign || look.found == Found::kRefused) {
        Refuse(path, look.problem);
    }
    if (look.directory.IsValid()) {
        RemoveTree(OpenParent(path).Get(), Name(path));
    }
}

}  // namespace

Look LookAt(const std::string& path, const std::string& uuid) {
    Look look;
    look.directory = PrivateDirectory::Open(path);
    if (look.directory.IsValid()) {
        look.found = Judge(look.directory.Fd(), uuid);
        look.problem = look.found == Found::kForeign ? "something else is at " + path
                                                     : "the index is not at " + path;
        return look;
    }
    const int cause = errno;
    if (!look.directory.Problem().empty()) {
        look.found = Found::kRefused;
        look.problem = look.directory.Problem();
        return look;
    }
    look.problem = path + ": " + quivra::SystemErrorText(cause);
    if (cause == ENOENT) {
        const std::size_t system = (path + "/").find("/@eaDir/");
        const std::string root = system != std::string::npos
                                     ? path.substr(0, system)
                                     : std::string(quivra::base::Directory(path));
        const UniqueFd fd = quivra::base::OpenDirectory(AT_FDCWD, root.empty() ? "/" : root);
        look.found = fd.IsValid() ? Found::kNothing : Found::kNoRoot;
    }
    return look;
}

PrivateDirectory MakeIndexDirectory(const std::string& path, const std::string& uuid) {
    if (path.size() > kMaxPath) {
        Refuse(path.substr(0, kMaxPath) + "...", "it is too long");
    }
    ClearPath(path);
    PrivateDirectory made = PrivateDirectory::Open(path, PrivateDirectory::Make::kMissing);
    if (!made.IsValid()) {
        if (errno == ENOSPC || errno == EDQUOT) {
            FailFile("cannot make " + path);
        }
        Refuse(path, made.Problem().empty() ? quivra::SystemErrorText(errno) : made.Problem());
    }
    Json::Value marker;
    marker["format"] = kFormat;
    marker["uuid"] = uuid;
    if (quivra::base::ReplaceFile(made.Fd(), kMarkerName, quivra::toString(marker), 0600) !=
        quivra::base::Replaced::kYes) {
        const int cause = errno;
        RemoveTree(OpenParent(path).Get(), Name(path));
        errno = cause;
        FailFile("cannot mark " + path);
    }
    SyncDirectory(OpenParent(path).Get());
    return made;
}

std::string SetAside(const std::string& path) {
    const Look look = LookAt(path, std::string());
    const bool something = look.found == Found::kIndex || look.found == Found::kOldFormat ||
                           look.found == Found::kRemains;
    if (!something) {
        return {};
    }
    const UniqueFd parent = OpenParent(path);
    const std::string name = Name(path);
    for (const std::string& other : NamesIn(parent.Get())) {
        if (other.starts_with(name + kAsideSuffix)) {
            RemoveTree(parent.Get(), other);
        }
    }
    char when[32];
    const std::time_t now = std::time(nullptr);
    std::tm parts{};
    std::strftime(when, sizeof(when), "%Y%m%d-%H%M%S", localtime_r(&now, &parts));
    const std::string aside = name + kAsideSuffix + when;
    if (renameat(parent.Get(), name.c_str(), parent.Get(), aside.c_str()) != 0) {
        FailFile("cannot set " + path + " aside");
    }
    SyncDirectory(parent.Get());
    return aside;
}

bool IsIndexDirectory(const std::string& path, const std::string& uuid) {
    const Found found = LookAt(path, uuid).found;
    return found == Found::kIndex || found == Found::kOldFormat;
}

bool RemoveIndexDirectory(const std::string& path, const std::string& uuid) {
    if (!IsIndexDirectory(path, uuid)) {
        const Found found = LookAt(path, uuid).found;
        return found == Found::kNoRoot || found == Found::kNothing;
    }
    const UniqueFd parent = OpenParent(path);
    const UniqueFd directory = quivra::base::OpenDirectory(parent.Get(), Name(path));
    // The marker goes last: what is interrupted can be done again.
    for (const std::string& name : NamesIn(directory.Get())) {
        if (name != kMarkerName) {
            RemoveTree(directory.Get(), name);
        }
    }
    RemoveTree(parent.Get(), Name(path));
    return true;
}

Moved MoveIndexDirectory(const std::string& from, const std::string& to, const std::string& uuid) {
    if (!IsIndexDirectory(from, uuid)) {
        if (IsIndexDirectory(to, uuid)) {
            return Moved::kWhole;
        }
        throw Error(kIndexUnavailable, "The index is neither in " + from + " nor in " + to);
    }
    ClearPath(to);
    const UniqueFd source = OpenParent(from);
    const UniqueFd target = OpenParent(to);
    if (!target.IsValid() || !quivra::base::IsCanonicalText(to) || to.size() > kMaxPath) {
        Refuse(to, "its parent is not a directory of ours");
    }
    if (renameat(source.Get(), Name(from).c_str(), target.Get(), Name(to).c_str()) == 0) {
        SyncDirectory(target.Get());
        SyncDirectory(source.Get());
        return Moved::kWhole;
    }
    if (errno != EXDEV) {
        FailFile("cannot move " + from + " to " + to);
    }
    // Half a copy is known for what it is by its name, and by the marker, which comes first.
    const std::string aside = to + kCopySuffix;
    ClearPath(aside);
    const PrivateDirectory copy = PrivateDirectory::Open(aside, PrivateDirectory::Make::kMissing);
    const PrivateDirectory original = PrivateDirectory::Open(from);
    if (!copy.IsValid() || !original.IsValid()) {
        FailFile("cannot copy " + from + " to " + aside);
    }
    CopyFiles(original.Fd(), copy.Fd(), kMarkerName);
    if (renameat(target.Get(), Name(aside).c_str(), target.Get(), Name(to).c_str()) != 0) {
        FailFile("cannot rename " + aside);
    }
    SyncDirectory(target.Get());
    return Moved::kCopied;
}

void UndoMove(const std::string& from, const std::string& to, const std::string& uuid) {
    if (from == to || !IsIndexDirectory(from, uuid)) {
        return;
    }
    RemoveIndexDirectory(to, uuid);
    const std::string aside = to + kCopySuffix;
    if (!RemoveIndexDirectory(aside, uuid) && LookAt(aside, uuid).found == Found::kNothing) {
        unlinkat(OpenParent(aside).Get(), Name(aside).c_str(), AT_REMOVEDIR);
    }
}

}  // namespace elasticd
