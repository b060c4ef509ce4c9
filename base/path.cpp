#include "base/path.h"

#include <algorithm>

namespace quivra::base {

bool IsBelow(std::string_view path, std::string_view top) {
    if (top == "/") {
        top = {};  // the only directory whose path ends in the separator
    }
    return path.size() > top.size() + 1 && path.starts_with(top) && path[top.size()] == '/';
}

bool IsAtOrBelow(std::string_view path, std::string_view top) {
    // Without this "/" would be above nothing: what lies below it does not begin with "//".
    if (top.empty() || top == "/") {
        return path.empty() || path.front() == '/';
    }
    return path == top || IsBelow(path, top);
}

bool IsCanonicalText(std::string_view path) {
    if (path.empty() || path.front() != '/' || path.find('\0') != path.npos) {
        return false;
    }
    for (std::size_t begin = 1; path.size() > 1 && begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string_view component = path.substr(begin, end - begin);
        if (component.empty() || component == "." || component == "..") {
            return false;
        }
        begin = end + 1;
    }
    return true;
}

std::string_view Name(std::string_view path) {
    return path.substr(path.rfind('/') + 1);  // npos + 1 is 0: the whole text
}

std::string_view Directory(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    if (slash == path.npos) {
        return ".";
    }
    return path.substr(0, slash == 0 ? 1 : slash);
}

std::string_view Extension(std::string_view path) {
    const std::string_view name = Name(path);
    const std::size_t dot = name.rfind('.');
    return dot == name.npos ? std::string_view() : name.substr(dot + 1);
}

std::string Join(std::string_view directory, std::string_view name) {
    std::string path(directory);
    if (!path.ends_with('/')) {
        path += '/';
    }
    return path.append(name);
}

std::string Moved(std::string_view path, std::string_view from, std::string_view to) {
    return std::string(to).append(path.substr(from.size()));
}

}  // namespace quivra::base
