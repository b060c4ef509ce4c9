#include "programs/fileindexctl/path_rules.h"

#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <memory>

#include <kesto/filesystem.h>

#include "common/error.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

Finding Passed(const std::string& detail) {
    return {"", true, detail, ""};
}

Finding Failed(const std::string& detail, const std::string& remedy = std::string()) {
    return {"", false, detail, remedy};
}

/// No rule of the library, but what the others would report as something else.
Finding Exists(const Place& place) {
    struct stat status {};
    if (lstat(place.full_path.c_str(), &status) != 0) {
        return Failed("nothing there: " + SystemErrorText(errno), "check the spelling");
    }
    return Passed(S_ISDIR(status.st_mode) ? "a directory"
                  : S_ISREG(status.st_mode)
                      ? "a file of " + std::to_string(status.st_size) + " bytes"
                      : "neither file nor directory");
}

Finding NotInSnapshot(const Place& place) {
    int in_snapshot = 0;
    if (place.full_path.find("#snapshot") != std::string::npos &&
        KLIBFhsPathInSnapshot(place.full_path.c_str(), &in_snapshot) == 0 && in_snapshot == 1) {
        return Failed("it lies in a snapshot", "look for the present version of the file");
    }
    return Passed("no");
}

Finding OnIndexableFileSystem(const Place& place) {
    const int type = KESTOGetFSType(place.full_path.c_str(), 0);
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

Finding InIndexableShare(const Place& place) {
    if (sdk::SDKShare(place.share).CanBeIndexed()) {
        return Passed(place.share);
    }
    return Failed("share " + place.share + " is never indexed, locked or read-only",
                  "unlock it or make it writable, unless it is surveillance or NetBackup");
}

Finding NotInRecycleBin(const Place& place) {
    return fileindex::IsFullPathInRecycleBin(place.full_path)
               ? Failed("it lies in a recycle bin", "restore the file")
               : Passed("no");
}

/// Only an encrypted share is itself a mount point, once unlocked.
Finding NoStrayMountPoint(const Place& place) {
    if (!IsMountPoint(place.full_path)) {
        return Passed("no");
    }
    return sdk::SDKShare(place.share).IsEncryption()
               ? Passed("yes, of an encrypted share")
               : Failed("something else is mounted there", "index it as a share of its own");
}

/// The index knows each object by one path, the one without links.
Finding ReachedDirectly(const Place& place) {
    const std::unique_ptr<char, void (*)(void*)> resolved(
        realpath(place.full_path.c_str(), nullptr), std::free);
    if (resolved == nullptr) {
        return Failed("it cannot be resolved: " + SystemErrorText(errno));
    }
    if (place.full_path != resolved.get()) {
        return Failed("it leads through a symbolic link to " + std::string(resolved.get()),
                      "index the place that the link leads to");
    }
    return Passed("yes");
}

/// The indexer passes over these on its way down, with all they hold.
Finding NoPreservedName(const Place& place) {
    std::string rest = place.share_path.substr(1 + place.share.size());
    while (!rest.empty()) {
        const std::string name = Basename(rest);
        if (fileindex::IsSystemPreservedFileName(name)) {
            return Failed("'" + name + "' is one of the system's own names",
                          "rename it, if the file is yours");
        }
        rest = Dirname(rest);
    }
    return Passed("none");
}

struct Rule {
    const char* name;
    Finding (*examine)(const Place& place);
};

constexpr std::array kRules = {
    Rule{"exists", Exists},
    Rule{"in a snapshot", NotInSnapshot},
    Rule{"file system", OnIndexableFileSystem},
    Rule{"share", InIndexableShare},
    Rule{"in a recycle bin", NotInRecycleBin},
    Rule{"mount point", NoStrayMountPoint},
    Rule{"reached without links", ReachedDirectly},
    Rule{"system names", NoPreservedName},
};

}  // namespace

std::vector<Finding> ExaminePath(const Place& place) {
    std::vector<Finding> findings;
    for (const Rule& rule : kRules) {
        Finding finding;
        try {
            finding = rule.examine(place);
        } catch (const Error& error) {
            finding = Failed("it cannot be told: " + std::string(error.what()));
        }
        finding.rule = rule.name;
        findings.push_back(finding);
        if (!finding.passed) {
            break;
        }
    }
    return findings;
}

}  // namespace quivra::ctl
