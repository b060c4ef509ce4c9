#pragma once

#include <string>
#include <vector>

#include "programs/kestotifyd/change.h"
#include "programs/kestotifyd/move_pairing.h"
#include "programs/kestotifyd/watch_tree.h"

namespace kestotifyd {

/// What follows from one inotify event.
struct InotifyOutcome {
    std::vector<Change> changes{};

    /// Directories to be watched. One that is not watched yet is watched and scanned first, then
    /// reported as created, so that the report covers whatever was in it by then. After a move this
    /// only makes sure: the object at the place may be another one by now.
    struct Appeared {
        NodeRef parent;
        std::string name;
    };
    std::vector<Appeared> appeared{};

    std::vector<int> unused_watches{};
    std::vector<std::string> lost_roots{};  ///< removed, moved away or unmounted
    bool is_overflow = false;
};

/// Translates one event, and updates the tree for it. Pure but for the tree: no system calls.
InotifyOutcome TranslateInotify(const MovePairing::Paired& paired, WatchTree& tree);

}  // namespace kestotifyd
