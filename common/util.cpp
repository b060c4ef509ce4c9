#include "common/util.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <set>
#include <utility>

namespace quivra {

bool IsFileExist(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

bool IsDirExist(const std::string& path, bool follow_link) {
    std::set<std::pair<dev_t, ino_t>> links_seen;
    std::string current = path;
    while (true) {
        struct stat status {};
        if (lstat(current.c_str(), &status) != 0) {
            return false;
        }
        if (S_ISDIR(status.st_mode)) {
            return true;
        }
        if (!S_ISLNK(status.st_mode) || !follow_link ||
            !links_seen.emplace(status.st_dev, status.st_ino).second) {
            return false;
        }
        // Zeroed and one byte short, because readlink ends its text by nothing.
        std::array<char, 4096> target{};
        if (readlink(current.c_str(), target.data(), target.size() - 1) < 0) {
            return false;
        }
        current = target.data();  // as it is stored, so from the current directory where relative
    }
}

bool IsDirentDir(const dirent& entry, const std::string& /*full_path*/) {
    // An entry of unknown type never counts, whether its status can be read or not.
    return entry.d_type == DT_DIR;
}

bool StringStartWith(const std::string& s, const std::string& prefix) {
    return s.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
    return path.substr(path.rfind('/') + 1);  // npos + 1 is 0: the whole string
}

std::string Dirname(const std::string& path) {
    // Never ".": a parent is stored and compared as text, and joined by "/" again.
    return path.substr(0, path.rfind('/'));
}

std::string GetFileExtension(const std::string& path, bool to_lower) {
    const std::string name = Basename(path);
    const std::size_t dot = name.rfind('.');
    if (dot == std::string::npos) {
        return std::string();
    }
    std::string extension = name.substr(dot + 1);
    if (to_lower) {
        std::transform(extension.begin(), extension.end(), extension.begin(),
                       [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    }
    return extension;
}

}  // namespace quivra
