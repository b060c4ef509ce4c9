#pragma once

#include <string>
#include <string_view>

namespace fileindexd {

/// Whether `path` lies below `directory`, component by component.
inline bool IsBelow(std::string_view path, std::string_view directory) {
    return path.size() > directory.size() && path.substr(0, directory.size()) == directory &&
           path[directory.size()] == '/';
}

inline bool IsAtOrBelow(std::string_view path, std::string_view directory) {
    return path == directory || IsBelow(path, directory);
}

/// `path`, which is at or below `from`, moved along with it.
inline std::string Moved(const std::string& path, const std::string& from, const std::string& to) {
    return to + path.substr(from.size());
}

}  // namespace fileindexd
