#include "programs/kestotifyd/fanotify_translation.h"

#include <sys/fanotify.h>

#include <array>
#include <utility>

#include "base/path.h"

namespace kestotifyd {
namespace {

using Kind = Change::Kind;

std::string PathOf(const FanotifyEvent::Place& place, const HandleLookup& lookup) {
    const std::string directory = place.directory.empty() ? "" : lookup(place.directory);
    if (directory.empty() || place.name == ".") {
        return directory;
    }
    return quivra::base::Join(directory, place.name);
}

std::vector<Change> TranslateRename(const FanotifyEvent& event, HandlePaths& paths,
                                    const HandleLookup& lookup) {
    const std::string from = PathOf(event.old_place, lookup);
    const std::string to = PathOf(event.new_place, lookup);
    const bool is_dir = (event.mask & FAN_ONDIR) != 0;
    std::vector<Change> changes;
    if (from.empty() && to.empty()) {
        return changes;  // in another mount of the file system, or both directories are gone
    }
    if (to.empty()) {  // out of sight, or into a directory that is gone already
        changes.push_back({Kind::kDeleted, is_dir, from});
        if (is_dir) {
            paths.EraseBelow(from);
        }
        return changes;
    }
    if (from.empty()) {
        changes.push_back({Kind::kCreated, is_dir, to});
        if (is_dir) {
            paths.Set(event.target, to);
        }
        return changes;
    }
    using quivra::base::IsAtOrBelow;
    if (is_dir && (IsAtOrBelow(to, from) || IsAtOrBelow(from, to))) {
        // No file system does that; merged events can look so. Every such rename would make the
        // paths below it longer, up to twice as long, without end.
        changes.push_back({Kind::kReindex, true, IsAtOrBelow(to, from) ? from : to});
        paths.BecomeAhead();
        return changes;
    }
    changes.push_back({Kind::kRenamed, is_dir, to, from});
    if (is_dir) {
        paths.Rename(event.target, from, to);
    }
    return changes;
}

}  // namespace

std::vector<Change> TranslateFanotify(const FanotifyEvent& event, HandlePaths& paths,
                                      const HandleLookup& lookup) {
    if ((event.mask & FAN_RENAME) != 0) {
        return TranslateRename(event, paths, lookup);
    }
    std::vector<Change> changes;
    const std::string path = PathOf(event.place, lookup);
    if (path.empty()) {
        return changes;
    }
    const bool is_dir = (event.mask & FAN_ONDIR) != 0;
    // A merged event's bits have no order of their own. The deletion first: the consumer looks at
    // the disk for the others.
    static constexpr std::array<std::pair<std::uint64_t, Kind>, 5> kOrder{
        {{FAN_DELETE, Kind::kDeleted},
         {FAN_CREATE, Kind::kCreated},
         {FAN_MODIFY, Kind::kWritten},
         {FAN_CLOSE_WRITE, Kind::kClosed},
         {FAN_ATTRIB, Kind::kAttributes}}};
    for (const auto& [bit, kind] : kOrder) {
        if ((event.mask & bit) != 0) {
            changes.push_back({kind, is_dir, path});
        }
    }
    // Created and deleted in one event, the object is another one than the target or is gone.
    if (is_dir && (event.mask & FAN_DELETE) != 0) {
        paths.Erase(event.target);
    } else if (is_dir && (event.mask & FAN_CREATE) != 0) {
        paths.Set(event.target, path);
    }
    return changes;
}

}  // namespace kestotifyd
