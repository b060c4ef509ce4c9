#pragma once

#include <json/json.h>

#include <cstdint>
#include <map>
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

/// All registrations of the directory, by file name: every "*.json" file is one. A malformed or
/// unreadable file is logged and left out. Of several files for one queue, the first counts.
std::map<std::string, Registration> ReadRegistrations(const std::string& directory);

}  // namespace kestotifyd
