#include "programs/kestotifyd/mount_table.h"

#include <algorithm>
#include <iterator>
#include <optional>

#include "base/path.h"
#include "common/log.h"
#include "platform/standalone/mounts.h"

#include <kesto/filesystem.h>

namespace kestotifyd {
MountTable::MountTable() : fd_(kesto::WatchMounts()) {
    if (!fd_.IsValid()) {
        quivra::LogError({"mount_table", __LINE__}, "Changes of mounts cannot be noticed");
    }
    Reload();
    changes_ = {};
}

bool MountTable::Reload() {
    // Compared with what was known, and kept until somebody asks: a table is also read when a
    // folder disappears, and what it shows then must not be missed by the mount event that follows.
    std::optional<std::set<std::string>> points = kesto::ReadMountPoints();
    if (!points) {
        quivra::LogError({"mount_table", __LINE__}, "The mount table cannot be read");
        return false;
    }
    std::set_difference(points_.begin(), points_.end(), points->begin(), points->end(),
                        std::inserter(changes_.removed, changes_.removed.end()));
    std::set_difference(points->begin(), points->end(), points_.begin(), points_.end(),
                        std::inserter(changes_.added, changes_.added.end()));
    points_ = *std::move(points);
    return true;
}

/// By text, without asking the disk: the answer for a volume that is away has to be what it would
/// be if it were there.
std::string MountTable::Covering(const std::string& path) const {
    for (std::string at = path;; at = quivra::base::Directory(at)) {
        if (points_.contains(at)) {
            return at;
        }
        if (at == "/") {
            return std::string();
        }
    }
}

std::set<std::string> MountTable::Below(const std::string& path) const {
    std::set<std::string> below;
    for (const std::string& point : points_) {
        if (quivra::base::IsBelow(point, path) &&
            KESTOGetFSType(point.c_str(), 0) != KESTO_FS_VIRTUAL) {
            below.insert(point);
        }
    }
    return below;
}

}  // namespace kestotifyd
