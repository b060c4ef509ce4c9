#include "fileindex/event.h"

#include "common/json.h"
#include "common/log.h"

namespace quivra::fileindex {
namespace {

// Built once: a queue holds a million lines.
const std::string kEvent = "event";
const std::string kIsDir = "is_dir";
const std::string kPath = "path";
const std::string kPathOld = "path_old";
const std::string kData = "data";

}  // namespace

Event::Event(const std::string& event_raw) {
    Json::Value json;
    if (!fromString(json, event_raw)) {
        Fail({"optree", 50}, "!data.fromString(event_raw)",
             Error(Error::kMalformedEvent, "Malformed event_raw: " + event_raw));
    }
    GetJsonValue(event, json, kEvent, true);
    GetJsonValue(is_dir, json, kIsDir, false);
    GetJsonValue(path, json, kPath, true);
    GetJsonValue(path_old, json, kPathOld, false);
    GetJsonValue(data, json, kData, false);
}

}  // namespace quivra::fileindex
