#include "fileindex/event.h"

#include <rapidjson/reader.h>

#include <string_view>

#include "common/json.h"
#include "common/log.h"

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

/// Reads a plain line several times as fast as the JSON library, which decides on every line that
/// is refused here. A refused event is unspecified.
bool ReadPlainLine(Event& event, const std::string& line) {
    if (line.find('\\') != std::string::npos) {
        return false;  // only one library interprets escapes
    }
    static thread_local rapidjson::Reader reader;
    rapidjson::StringStream stream(line.c_str());
    PlainLine handler(event);
    return !reader.Parse(stream, handler).IsError() && handler.IsComplete() &&
           stream.Tell() == line.size();  // a NUL byte does not end the line
}

}  // namespace

Event::Event(const std::string& event_raw) {
    if (ReadPlainLine(*this, event_raw)) {
        return;
    }
    Json::Value json;
    if (!fromString(json, event_raw)) {
        Fail({"optree", 50}, "!data.fromString(event_raw)",
             Error(Error::kMalformedEvent, "Malformed event_raw: " + event_raw));
    }
    is_dir = false;
    path_old.clear();
    GetJsonValue(event, json, "event", true);
    GetJsonValue(is_dir, json, "is_dir", false);
    GetJsonValue(path, json, "path", true);
    GetJsonValue(path_old, json, "path_old", false);
    GetJsonValue(data, json, "data", false);
}

}  // namespace quivra::fileindex
