#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

namespace kestotifyd {

/// Which folders' changes go to which queue file.
struct Registration {
    std::string queue;                 ///< full path of the queue file
    std::vector<std::string> folders;  ///< full paths, canonical, none twice
    std::uint32_t mask = 0;            ///< event bits that the consumer wants
    std::vector<std::string> ignore;   ///< names that are not reported, nor what lies below them

    bool operator==(const Registration&) const = default;
};

/// Reads {"queue": PATH, "config": {"path": [PATH...], "mask": N, "ignore": [NAME...]}}. Throws
/// Error 120 when something is missing, has the wrong type, or a path is not canonical and
/// absolute (one leading "/", no doubled or trailing one, no "." or ".." component).
Registration ParseRegistration(const Json::Value& description);

struct Registrations {
    std::vector<Registration> list{};
    std::string problem{};  ///< about a file that was left out, in one sentence
    bool is_whole = true;   ///< false: the directory or a file could not be read for now
};

/// All registrations of the directory, in the order of the file names: every "*.json" file is one.
/// A malformed file is logged and left out. Of several files for one queue, the first counts.
Registrations ReadRegistrations(const std::string& directory);

}  // namespace kestotifyd
