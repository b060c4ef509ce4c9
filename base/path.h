#pragma once

#include <string>
#include <string_view>
#include <utility>

/// Absolute paths as text. Nothing here asks the file system, and whole components count: /a/b is
/// above /a/b/c and not above /a/bc. "/" and the empty text both stand for the root directory.
namespace quivra::base {

/// Whether `path` is `top` or lies below it.
bool IsAtOrBelow(std::string_view path, std::string_view top);

/// Whether `path` lies below `top`, `top` itself left out.
bool IsBelow(std::string_view path, std::string_view top);

/// Whether the text is one that the kernel itself would give: one leading "/", no empty component,
/// no trailing "/", no "." or "..", no NUL byte. "/" is.
bool IsCanonicalText(std::string_view path);

/// The last component; the whole text when it has no "/".
std::string_view Name(std::string_view path);

/// The path of the directory that holds the object: "/" for "/a"; "." for a text without "/".
std::string_view Directory(std::string_view path);

/// What stands behind the last "." of the last component, as it is written; empty when there is no
/// ".".
std::string_view Extension(std::string_view path);

/// `directory` and `name` joined by one "/".
std::string Join(std::string_view directory, std::string_view name);

/// `path`, which is at or below `from`, once `from` has become `to`.
std::string Moved(std::string_view path, std::string_view from, std::string_view to);

/// The half-open range of a map's or set's entries strictly below `top`. The container is sorted
/// byte by byte (std::less) and its key is a path. The entry of `top` itself does not lie next to
/// them ("/a-b" comes between "/a" and "/a/b"), so look it up apart.
template <typename Sorted>
auto Subtree(Sorted& sorted, std::string_view top) {
    std::string bound(top == "/" ? std::string_view() : top);
    bound += '/';
    // For the root the range begins behind "/" itself.
    const auto begin = bound == "/" ? sorted.upper_bound(bound) : sorted.lower_bound(bound);
    bound.back() = '/' + 1;
    return std::pair(begin, sorted.lower_bound(bound));
}

}  // namespace quivra::base
