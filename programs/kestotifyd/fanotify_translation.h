#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "programs/kestotifyd/change.h"
#include "programs/kestotifyd/handle_paths.h"

namespace kestotifyd {

/// An event as fanotify delivers it, with opaque file handles.
struct FanotifyEvent {
    struct Place {
        std::string directory{};  ///< handle; empty when the event does not tell
        std::string name{};       ///< "." for the directory itself
    };

    std::uint64_t mask = 0;
    int pid = 0;  ///< of the process that did it
    std::string file_system{};
    Place place{};      ///< of everything but a rename
    Place old_place{};  ///< of a rename
    Place new_place{};
    std::string target{};  ///< handle of the object
};

/// The path of a directory's handle, from `paths` or else from the disk; empty when the directory
/// is gone, or cannot be seen through the mount that `paths` stands for.
using HandleLookup = std::function<std::string(const std::string& handle)>;

/// Translates one event as it is seen through one mount, and updates `paths` for it. Pure but for
/// the lookup.
///
/// The kernel merges events of one object and name, so one event can say that it was created and
/// deleted, and not in which order. Then the deletion is told first: whoever handles the creation
/// looks at the disk, and finds nothing if it was the other way round.
std::vector<Change> TranslateFanotify(const FanotifyEvent& event, HandlePaths& paths,
                                      const HandleLookup& lookup);

}  // namespace kestotifyd
