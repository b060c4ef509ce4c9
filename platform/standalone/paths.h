#pragma once

#include <string_view>

namespace kesto {

/// Whether the path is `top` or lies below it. Whole components count: /a/b is not above /a/bc.
inline bool IsAtOrBelow(std::string_view path, std::string_view top) {
    return path.starts_with(top) && (path.size() == top.size() || path[top.size()] == '/');
}

inline std::string_view LastComponent(std::string_view path) {
    return path.substr(path.rfind('/') + 1);  // npos + 1 is 0: the whole path
}

}  // namespace kesto
