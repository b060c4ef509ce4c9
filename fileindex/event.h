#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

#include "common/export.h"

namespace quivra::fileindex {

/// What a queue line reports. The values are the queue's format: other programs write them.
enum : std::uint32_t {
    EVENT_MODIFY = 0x2,          ///< content modified
    EVENT_ATTR = 0x4,            ///< attributes or permissions changed
    EVENT_CREATE = 0x40,         ///< object created
    EVENT_DELETE = 0x80,         ///< object deleted
    EVENT_RENAME = 0x100,        ///< object moved from `path_old` to `path`
    EVENT_QUEUE_CRASH = 0x200,   ///< events were lost: the whole share must be indexed again
    EVENT_REINDEX = 0x10000,     ///< index `path` and everything below it again
    EVENT_UPDATE_CFG = 0x20000,  ///< the settings of `path` changed to `data`
};

/// One line of a share's queue: a change of the file system, or an instruction to the indexer.
///
/// A line is a JSON object: "event" (bit set, required), "path" (required), "is_dir" (default
/// false), "path_old" (for a rename), "data" (for changed settings). Members that may be missing
/// are ignored when they have the wrong type.
struct QUIVRA_EXPORT Event {
    /// Throws Error 906 ("Malformed event_raw: " and the line, logged) when the line is not JSON,
    /// is longer than 1 MiB (the beginning of the line is given then) or has a path of more than
    /// 64 KiB, and Error 120 when a required member is missing or has the wrong type.
    explicit Event(const std::string& event_raw);

    std::uint32_t event = 0;  ///< EVENT_* bits; each is acted upon separately
    bool is_dir = false;
    std::string path;      ///< full path; of a rename, the new one
    std::string path_old;  ///< of a rename, the old full path; else empty
    Json::Value data;      ///< of changed settings, the new ones; else null

  private:
    friend struct QueueLine;
    Event() = default;
};

}  // namespace quivra::fileindex
