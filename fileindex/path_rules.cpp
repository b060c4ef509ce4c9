#include "fileindex/path_rules.h"

#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <string_view>

#include <kesto/filesystem.h>

#include "base/path.h"
#include "common/error.h"
#include "common/log.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

PathFinding Passed(const std::string& detail) {
    return {"", true, detail, ""};
}

PathFinding Failed(const std::string& detail, const std::string& remedy = std::string()) {
    return {"", false, detail, remedy};
}

bool Contains(std::string_view text, std::string_view part) {
    return text.find(part) != std::string_view::npos;
}

/// The share is looked up by each rule that needs it: nearly all paths need it once, and a rule
/// that holds nothing can be read alone.
std::string ShareOf(const std::string& full_path) {
    std::string share_name;
    std::string share_path;
    GetShareNamePathByFullPath(share_name, share_path, full_path);
    return share_name;
}

/// Asked first, because the others would report a missing object as something else.
PathFinding Exists(const std::string& full_path) {
    struct stat status {};
    if (lstat(full_path.c_str(), &status) != 0) {
        return Failed("nothing there: " + SystemErrorText(errno), "check the spelling");
    }
    return Passed(S_ISDIR(status.st_mode) ? "a directory"
                  : S_ISREG(status.st_mode)
                      ? "a file of " + std::to_string(status.st_size) + " bytes"
                      : "neither file nor directory");
}

/// A snapshot that the platform cannot tell about is taken for an ordinary directory.
PathFinding NotInSnapshot(const std::string& full_path) {
    int in_snapshot = 0;
    if (Contains(full_path, "#snapshot") &&
        KLIBFhsPathInSnapshot(full_path.c_str(), &in_snapshot) == 0 && in_snapshot == 1) {
        return Failed("it lies in a snapshot", "look for the present version of the file");
    }
    return Passed("no");
}

PathFinding OnIndexableFileSystem(const std::string& full_path) {
    const int type = KESTOGetFSType(full_path.c_str(), 0);
    const std::string remedy = "copy what you want to find to a local volume";
    if (type < 0) {
        return Failed("its type cannot be told", "check that the volume is mounted");
    }
    if (KESTOFSIsRemoteFS(type) != 0) {
        return Failed("it is on another machine (type " + std::to_string(type) + ")", remedy);
    }
    if (KESTOFSIsImageFS(type) != 0) {
        return Failed("it is a mounted image (type " + std::to_string(type) + ")", remedy);
    }
    if (type == KESTO_FS_VIRTUAL) {
        return Failed("it is one of the kernel's own");
    }
    return Passed("local (type " + std::to_string(type) + ")");
}

PathFinding InIndexableShare(const std::string& full_path) {
    const std::string share = ShareOf(full_path);
    if (sdk::SDKShare(share).CanBeIndexed()) {
        return Passed(share);
    }
    return Failed("share " + share + " is never indexed, locked or read-only",
                  "unlock it or make it writable, unless it is surveillance or NetBackup");
}

PathFinding NotInRecycleBin(const std::string& full_path) {
    return IsFullPathInRecycleBin(full_path)
               ? Failed("it lies in a recycle bin", "restore the file")
               : Passed("no");
}

/// Only an encrypted share is itself a mount point, once it is unlocked.
PathFinding NoStrayMountPoint(const std::string& full_path) {
    if (KESTOFSDirIsMntPoint(full_path.c_str()) != 1) {
        return Passed("no");
    }
    return sdk::SDKShare(ShareOf(full_path)).IsEncryption()
               ? Passed("yes, of an encrypted share")
               : Failed("something else is mounted there", "index it as a share of its own");
}

/// The index knows each object by one path: the one without links, "." and "..", and without a
/// "/" at its end. Asked last, because realpath looks at every component.
PathFinding ReachedDirectly(const std::string& full_path) {
    std::array<char, PATH_MAX> resolved{};
    if (realpath(full_path.c_str(), resolved.data()) == nullptr) {
        return Failed("it cannot be resolved: " + SystemErrorText(errno));
    }
    if (full_path != resolved.data()) {
        return Failed("it leads through a symbolic link to " + std::string(resolved.data()),
                      "index the place that the link leads to");
    }
    return Passed("yes");
}

/// An indexer passes over these on its way down, with all they hold.
PathFinding NoPreservedName(const std::string& full_path) {
    std::string share_name;
    std::string share_path;
    GetShareNamePathByFullPath(share_name, share_path, full_path);
    for (std::string_view path = full_path; base::IsBelow(path, share_path);
         path = base::Directory(path)) {
        const std::string name(base::Name(path));
        if (IsSystemPreservedFileName(name)) {
            return Failed("'" + name + "' is one of the system's own names",
                          "rename it, if the file is yours");
        }
    }
    return Passed("none");
}

struct Rule {
    const char* name;
    bool decides;  ///< CanFullPathBeIndexed asks it
    PathFinding (*examine)(const std::string& full_path);
};

/// The order is fixed: it settles which error a path outside all shares gets, and that nothing is
/// asked of a share on a file system that hangs.
constexpr std::array kRules = {
    Rule{"exists", false, Exists},
    Rule{"in a snapshot", true, NotInSnapshot},
    Rule{"file system", true, OnIndexableFileSystem},
    Rule{"share", true, InIndexableShare},
    Rule{"in a recycle bin", true, NotInRecycleBin},
    Rule{"mount point", true, NoStrayMountPoint},
    Rule{"reached without links", true, ReachedDirectly},
    Rule{"system names", false, NoPreservedName},
};

PathFinding Examine(const Rule& rule, const std::string& full_path) {
    try {
        return rule.examine(full_path);
    } catch (const Error& error) {
        return Failed("it cannot be told: " + error.reason);
    }
}

}  // namespace

bool CanFullPathBeIndexed(const std::string& full_path) {
    for (const Rule& rule : kRules) {
        if (rule.decides && !rule.examine(full_path).passed) {
            return false;
        }
    }
    return true;
}

std::vector<PathFinding> ExaminePath(const std::string& full_path) {
    std::vector<PathFinding> findings;
    for (const Rule& rule : kRules) {
        PathFinding& finding = findings.emplace_back(Examine(rule, full_path));
        finding.rule = rule.name;
        if (!finding.passed) {
            break;
        }
    }
    return findings;
}

}  // namespace quivra::fileindex
