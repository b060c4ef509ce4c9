#pragma once

#include <chrono>
#include <string>

namespace kestotifyd {

using Clock = std::chrono::steady_clock;
using Time = Clock::time_point;

/// One thing that happened below a watched folder, as told by either back end: already paired,
/// already with full paths, not yet filtered.
struct Change {
    enum class Kind {
        kCreated,     ///< made, linked or moved in from elsewhere
        kWritten,     ///< content changed through a file that is still open
        kClosed,      ///< a file that was open for writing has been closed
        kAttributes,  ///< owner, mode, times, extended attributes
        kDeleted,     ///< removed or moved out
        kRenamed,     ///< moved from path_old to path
        kReindex,     ///< the path's changes were not watched for a while
        kCrashed,     ///< events below the path were lost
    };

    Kind kind;
    bool is_dir;
    std::string path;
    std::string path_old{};  ///< for kRenamed
};

}  // namespace kestotifyd
