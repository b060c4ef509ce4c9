#include "programs/fileindexctl/paths.h"

#include <filesystem>

#include "common/error.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexctl/session.h"

namespace quivra::ctl {
namespace {

/// By text alone, without "." and "..", doubled or trailing "/".
std::string Normalised(const std::string& path) {
    std::string normal = std::filesystem::path(path).lexically_normal().native();
    while (normal.size() > 1 && normal.back() == '/') {
        normal.pop_back();
    }
    return normal;
}

std::string MadeAbsolute(const std::string& path) {
    if (path.empty()) {
        throw WrongCall("the path is empty");
    }
    return path[0] == '/' ? path : std::filesystem::current_path().native() + "/" + path;
}

/// False for a path that lies in no share.
bool FindFullPath(Place& place, const std::string& path) {
    std::string root;
    try {
        fileindex::GetShareNamePathByFullPath(place.share, root, path);
    } catch (const Error&) {
        return false;
    }
    place.share_path = "/" + place.share + path.substr(root.size());
    place.full_path = path;
    return true;
}

}  // namespace

std::string CanonicalPath(const std::string& path) {
    const std::string absolute = MadeAbsolute(path);
    std::string normal = Normalised(absolute);
    if (path[0] == '/' && normal != path) {
        throw WrongCall("the path " + path + " is not canonical; did you mean " + normal + "?");
    }
    return normal;
}

Place FindPlace(const std::string& path) {
    const std::string absolute = Normalised(MadeAbsolute(path));
    Place place;
    if (FindFullPath(place, absolute)) {
        return place;
    }
    if (path[0] != '/') {
        throw Error(Error::kNoSuchShare, absolute);
    }
    // A full path goes first: a share may be called like a directory at the top.
    // Not below any root, so its first component can only be the name of a share.
    place.share_path = absolute;
    fileindex::GetShareNameByPath(place.share, absolute);
    fileindex::GetFullPath(place.full_path, absolute);
    Place inner;
    if (FindFullPath(inner, place.full_path) && inner.share != place.share) {
        throw Failure(absolute + " lies in share " + inner.share + ", which lies within share " +
                      place.share + "; use " + inner.share_path);
    }
    return place;
}

std::string FolderPath(const std::string& path) {
    const std::string normal = Normalised(MadeAbsolute(path));
    if (fileindex::FolderMgr().HasFolder(normal)) {
        return normal;
    }
    return FindPlace(path).share_path;
}

}  // namespace quivra::ctl
