#include "fileindex/event.h"

#include <rapidjson/reader.h>

#include <string_view>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/queue_line.h"

namespace quivra::fileindex {
namespace {

/// Takes the members of a line as monitors write it: one object of known members that have the
/// usual type. It refuses everything else.
class PlainLine : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, PlainLine> {
  public:
    explicit PlainLine(Event& event) : event_(event) {}

    bool IsComplete() const { return has_event_ && has_path_; }

    bool Default() { return false; }
    bool StartObject() { return ++objects_ == 1; }
    bool EndObject(rapidjson::SizeType) { return true; }
    bool Key(const char* text, rapidjson::SizeType length, bool) {
        const std::string_view key(text, length);
        member_ = key == "event"      ? Member::kEvent
                  : key == "path"     ? Member::kPath
                  : key == "is_dir"   ? Member::kIsDir
                  : key == "path_old" ? Member::kPathOld
                                      : Member::kOther;
        return member_ != Member::kOther;
    }
    bool Uint(unsigned int value) {
        event_.event = value;
        has_event_ = true;
        return member_ == Member::kEvent;
    }
    bool Bool(bool value) {
        event_.is_dir = value;
        return member_ == Member::kIsDir;
    }
    bool String(const char* text, rapidjson::SizeType length, bool) {
        has_path_ = has_path_ || member_ == Member::kPath;
        (member_ == Member::kPath ? event_.path : event_.path_old).assign(text, length);
        return member_ == Member::kPath || member_ == Member::kPathOld;
    }

  private:
    enum class Member { kEvent, kIsDir, kPath, kPathOld, kOther };

    Event& event_;
    Member member_ = Member::kOther;
    int objects_ = 0;
    bool has_event_ = false;
    bool has_path_ = false;
};

/// How much of a line beyond the limit is told.
constexpr std::size_t kShownSize = 1024;

[[noreturn]] void FailMalformed(const char* condition, const std::string& text) {
    Fail({"optree", 50}, condition,
         Error(Error::kMalformedEvent, "Malformed event_raw: " + ShownLine(text)));
}

bool IsWithinLimits(const Event& event) {
    return event.path.size() <= kMaxPathSize && event.path_old.size() <= kMaxPathSize;
}

void ClearOptional(Event& event) {
    event.is_dir = false;
    event.path_old.clear();
    if (!event.data.isNull()) {
        event.data = Json::Value();
    }
}

}  // namespace

// Several times as fast as the JSON library, which decides on every line that is refused here.
bool ParsePlainLine(Event& event, const std::string& text) {
    // Only one library interprets escapes.
    if (text.size() > kMaxLineSize || text.find('\\') != std::string::npos) {
        return false;
    }
    ClearOptional(event);
    // It keeps a stack as large as the longest line, which the limit bounds.
    static thread_local rapidjson::Reader reader;
    rapidjson::StringStream stream(text.c_str());
    PlainLine handler(event);
    return !reader.Parse(stream, handler).IsError() && handler.IsComplete() &&
           stream.Tell() == text.size() &&  // a NUL byte does not end the line
           IsWithinLimits(event);
}

void ParseLine(Event& event, const std::string& text) {
    event.event = 0;
    ClearOptional(event);
    Json::Value json;
    if (text.size() > kMaxLineSize || !fromString(json, text)) {
        FailMalformed("!data.fromString(event_raw)", text);
    }
    GetJsonValue(event.event, json, "event", true);
    GetJsonValue(event.is_dir, json, "is_dir", false);
    GetJsonValue(event.path, json, "path", true);
    GetJsonValue(event.path_old, json, "path_old", false);
    GetJsonValue(event.data, json, "data", false);
    if (!IsWithinLimits(event)) {
        FailMalformed("!IsWithinLimits(event)", text);
    }
}

std::string ShownLine(const std::string& text) {
    return text.size() <= kMaxLineSize ? text : text.substr(0, kShownSize) + "...";
}

Event::Event(const std::string& event_raw) {
    if (!ParsePlainLine(*this, event_raw)) {
        ParseLine(*this, event_raw);
    }
}

}  // namespace quivra::fileindex
