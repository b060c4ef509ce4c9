#pragma once

#include <string>

namespace quivra::ctl {

/// The full path that the user means. An absolute path is taken as it stands; a relative one is
/// completed by the current directory, its "." and ".." resolved by text alone, so that links stay
/// what they are. Throws WrongCall for an absolute path that is not canonical (doubled or trailing
/// "/", "." or ".." in it): such a path names no document.
std::string CanonicalPath(const std::string& path);

/// A place that the user named by its full path (absolute or from here), or by its share path. Of
/// a path that could be both, the full path is meant. Not canonical paths are normalised by text.
struct Place {
    std::string share;
    std::string share_path;
    std::string full_path;
};

/// Throws Error 800, with the path as its reason, when no share holds it, and Failure for a share
/// path into a share that lies within the named one: what is there belongs to the inner share.
Place FindPlace(const std::string& path);

/// The share path of a folder of the set: the path itself when the set holds it, even if its share
/// is gone; else that of its place.
std::string FolderPath(const std::string& path);

}  // namespace quivra::ctl
