#include "fileindex/event.h"

#include <string_view>

#include "common/json.h"
#include "common/log.h"

namespace quivra::fileindex {
namespace {

/// The members of a line. One walk over the object finds them all: a queue holds a million lines.
struct Members {
    explicit Members(const Json::Value& json) {
        if (!json.isObject()) {
            return;
        }
        for (auto member = json.begin(); member != json.end(); ++member) {
            const char* end = nullptr;
            const char* begin = member.memberName(&end);
            if (const Json::Value** place = Place({begin, end})) {
                *place = &*member;
            }
        }
    }

    const Json::Value** Place(std::string_view key) {
        return key == "event"      ? &event
               : key == "path"     ? &path
               : key == "is_dir"   ? &is_dir
               : key == "path_old" ? &path_old
               : key == "data"     ? &data
                                   : nullptr;
    }

    const Json::Value* event = nullptr;
    const Json::Value* is_dir = nullptr;
    const Json::Value* path = nullptr;
    const Json::Value* path_old = nullptr;
    const Json::Value* data = nullptr;
};

/// As GetJsonValue, for a member that was found already.
template <typename T>
void Read(T& out, const Json::Value& json, const Json::Value* member, const char* required_key) {
    if (member != nullptr && isJsonType<T>(*member)) {
        out = asJsonType<T>(*member);
    } else if (required_key != nullptr) {
        GetJsonValue(out, json, required_key, true);  // says what is wrong
    }
}

}  // namespace

Event::Event(const std::string& event_raw) {
    Json::Value json;
    if (!fromString(json, event_raw)) {
        Fail({"optree", 50}, "!data.fromString(event_raw)",
             Error(Error::kMalformedEvent, "Malformed event_raw: " + event_raw));
    }
    const Members members(json);
    Read(event, json, members.event, "event");
    Read(is_dir, json, members.is_dir, nullptr);
    Read(path, json, members.path, "path");
    Read(path_old, json, members.path_old, nullptr);
    if (members.data != nullptr) {
        data = *members.data;
    }
}

}  // namespace quivra::fileindex
