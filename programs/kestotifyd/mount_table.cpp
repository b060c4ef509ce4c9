#include "programs/kestotifyd/mount_table.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <sstream>

#include "base/path.h"
#include "common/log.h"

#include <kesto/filesystem.h>

namespace kestotifyd {
namespace {

constexpr char kMountInfo[] = "/proc/self/mountinfo";

/// The table writes blanks, tabs, line ends and backslashes as three octal digits.
std::string Unescape(const std::string& text) {
    std::string plain;
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] == '\\' && at + 3 < text.size()) {
            plain += static_cast<char>(std::stoi(text.substr(at + 1, 3), nullptr, 8));
            at += 3;
        } else {
            plain += text[at];
        }
    }
    return plain;
}

std::string ReadWhole(int fd) {
    std::string text;
    char buffer[16384];
    if (lseek(fd, 0, SEEK_SET) != 0) {
        return text;
    }
    ssize_t size = 0;
    while ((size = read(fd, buffer, sizeof(buffer))) > 0 || (size < 0 && errno == EINTR)) {
        text.append(buffer, size > 0 ? static_cast<std::size_t>(size) : 0);
    }
    return text;
}

}  // namespace

MountTable::MountTable() : fd_(open(kMountInfo, O_RDONLY | O_CLOEXEC)) {
    if (!fd_.IsValid()) {
        quivra::LogError({"mount_table", __LINE__}, "Cannot read %s", kMountInfo);
    }
    Reload();
    changes_ = {};
}

void MountTable::Reload() {
    std::set<std::string> points;
    std::istringstream lines(ReadWhole(fd_.Get()));
    for (std::string line; std::getline(lines, line);) {
        std::istringstream fields(line);
        std::string skipped;
        std::string point;
        // ID, parent, device, root within the file system, mount point
        if (fields >> skipped >> skipped >> skipped >> skipped >> point) {
            points.insert(Unescape(point));
        }
    }
    std::set_difference(points_.begin(), points_.end(), points.begin(), points.end(),
                        std::inserter(changes_.removed, changes_.removed.end()));
    std::set_difference(points.begin(), points.end(), points_.begin(), points_.end(),
                        std::inserter(changes_.added, changes_.added.end()));
    points_ = std::move(points);
}

std::string MountTable::Covering(const std::string& path) const {
    for (std::string at = path; at.size() > 1; at.resize(at.rfind('/'))) {
        if (points_.contains(at)) {
            return at;
        }
        if (at.rfind('/') == 0) {
            break;
        }
    }
    return points_.contains("/") ? "/" : "";
}

std::set<std::string> MountTable::Below(const std::string& path) const {
    std::set<std::string> below;
    for (const std::string& point : points_) {
        if (point != path && quivra::base::IsAtOrBelow(point, path) &&
            KESTOGetFSType(point.c_str(), 0) != KESTO_FS_VIRTUAL) {
            below.insert(point);
        }
    }
    return below;
}

}  // namespace kestotifyd
