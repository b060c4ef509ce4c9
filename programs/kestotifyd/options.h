#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "programs/daemon/program.h"

namespace kestotifyd {

enum class BackendChoice { kAuto, kFanotify, kInotify };

struct Options {
    BackendChoice backend = BackendChoice::kAuto;
    quivra::daemon::CommonOptions common{.state_directory = "/var/lib/kesto/monitor-state"};
    std::string registrations = "/var/lib/kesto/monitor";
    std::size_t max_watches = 0;  ///< of the inotify back end; 0: 80 % of the system's limit
};

/// Reads the command line. When it asks for help, or is wrong, the text has been printed and the
/// exit status is in `status`.
std::optional<Options> ParseOptions(int argc, const char* const* argv, int& status);

}  // namespace kestotifyd
