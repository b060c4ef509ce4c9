#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace kestotifyd {

enum class BackendChoice { kAuto, kFanotify, kInotify };

struct Options {
    BackendChoice backend = BackendChoice::kAuto;
    bool is_verbose = false;  ///< debug lines in the system log, and all lines on standard error
    std::string registrations = "/var/lib/kesto/monitor";
    std::string state = "/var/lib/kesto/monitor-state";
    std::size_t max_watches = 0;  ///< of the inotify back end; 0: 80 % of the system's limit
};

/// Reads the command line. When it asks for help, or is wrong, the text has been printed and the
/// exit status is in `status`.
std::optional<Options> ParseOptions(int argc, const char* const* argv, int& status);

}  // namespace kestotifyd
