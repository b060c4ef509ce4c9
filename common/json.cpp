#include "common/json.h"

#include <fcntl.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>
#include <sys/stat.h>

#include <cerrno>
#include <charconv>
#include <cmath>
#include <string_view>
#include <vector>

#include "base/file.h"
#include "base/unique_fd.h"
#include "common/log.h"

// Texts are read and written by RapidJSON, values are JsonCpp's. JsonCpp's own reader takes
// trailing commas, comments, "007" and whatever follows a NUL byte, and its numbers depend on the
// locale of the host program.
namespace quivra {
namespace {

/// Whoever frees a value recurses as deep as it nests.
constexpr std::size_t kMaxDepth = 1000;

/// Far above what a thousand folders can take; a larger file is none of ours.
constexpr std::size_t kMaxFileSize = std::size_t{1} << 28;

/// Builds a value from what the parser reports.
class Builder {
  public:
    explicit Builder(Json::Value& root) : root_(root) {}

    bool Null() { return Put(Json::Value()); }
    bool Bool(bool value) { return Put(value); }
    // Numbers come as their text (RawNumber).
    bool Int(int) { return false; }
    bool Int64(std::int64_t) { return false; }
    bool Uint(unsigned int) { return false; }
    bool Uint64(std::uint64_t) { return false; }
    bool Double(double) { return false; }
    bool RawNumber(const char* text, rapidjson::SizeType size, bool) {
        const std::string_view number(text, size);
        if (number.find_first_of(".eE") == number.npos) {
            // Signed where it fits, as the values' own reader does: equality looks at the type.
            Json::Int64 value = 0;
            if (std::from_chars(text, text + size, value).ec == std::errc()) {
                return Put(value);
            }
            Json::UInt64 large = 0;
            if (std::from_chars(text, text + size, large).ec == std::errc()) {
                return Put(large);
            }
        }
        double value = 0;
        if (std::from_chars(text, text + size, value).ec == std::errc()) {
            return Put(value);
        }
        // Out of range: what is too small is zero, what is too large is refused.
        const bool is_small = number.find("e-") != number.npos ||
                              number.find("E-") != number.npos || number.starts_with("0.") ||
                              number.starts_with("-0.");
        return is_small && Put(0.0);
    }
    bool String(const char* text, rapidjson::SizeType size, bool) {
        return Put(Json::Value(text, text + size));
    }
    bool StartObject() { return Open(Json::objectValue); }
    bool Key(const char* text, rapidjson::SizeType size, bool) {
        key_.assign(text, size);
        return true;
    }
    bool EndObject(rapidjson::SizeType) { return Close(); }
    bool StartArray() { return Open(Json::arrayValue); }
    bool EndArray(rapidjson::SizeType) { return Close(); }

  private:
    Json::Value& Place() {
        if (open_.empty()) {
            return root_;
        }
        Json::Value& container = *open_.back();
        return container.isArray() ? container.append(Json::Value()) : container[key_];
    }
    bool Put(Json::Value value) {
        Place().swap(value);
        return true;
    }
    bool Open(Json::ValueType type) {
        if (open_.size() == kMaxDepth) {
            return false;
        }
        Json::Value& place = Place();
        place = Json::Value(type);
        open_.push_back(&place);  // stays where it is while its container grows
        return true;
    }
    bool Close() {
        open_.pop_back();
        return true;
    }

    Json::Value& root_;
    std::vector<Json::Value*> open_;
    std::string key_;
};

using Writer = rapidjson::Writer<rapidjson::StringBuffer>;

void Write(Writer& writer, const Json::Value& value);

void WriteText(Writer& writer, const Json::Value& value) {
    const char* begin = nullptr;
    const char* end = nullptr;
    value.getString(&begin, &end);
    writer.String(begin, static_cast<rapidjson::SizeType>(end - begin));
}

void WriteObject(Writer& writer, const Json::Value& value) {
    writer.StartObject();
    for (auto it = value.begin(); it != value.end(); ++it) {
        const char* end = nullptr;
        const char* begin = it.memberName(&end);
        writer.Key(begin, static_cast<rapidjson::SizeType>(end - begin));
        Write(writer, *it);
    }
    writer.EndObject();
}

void WriteArray(Writer& writer, const Json::Value& value) {
    writer.StartArray();
    for (const Json::Value& element : value) {
        Write(writer, element);
    }
    writer.EndArray();
}

void Write(Writer& writer, const Json::Value& value) {
    switch (value.type()) {
        case Json::nullValue:
            writer.Null();
            break;
        case Json::booleanValue:
            writer.Bool(value.asBool());
            break;
        case Json::intValue:
            writer.Int64(value.asInt64());
            break;
        case Json::uintValue:
            writer.Uint64(value.asUInt64());
            break;
        case Json::realValue:
            // JSON has no text for what is not finite.
            std::isfinite(value.asDouble()) ? writer.Double(value.asDouble()) : writer.Null();
            break;
        case Json::stringValue:
            WriteText(writer, value);
            break;
        case Json::objectValue:
            WriteObject(writer, value);
            break;
        case Json::arrayValue:
            WriteArray(writer, value);
            break;
    }
}

/// An administrator may have closed the file to others; a save must not open it again.
mode_t ModeForReplacement(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0644;
}

}  // namespace

bool fromString(Json::Value& value, const std::string& text) {
    // Not recursive, so that no text overflows the stack. The parser's own conversion of numbers is
    // either not exact or not defined for every zero.
    constexpr unsigned int kFlags =
        rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;
    value = Json::Value();
    Builder builder(value);
    rapidjson::StringStream stream(text.c_str());
    rapidjson::Reader reader;
    // The parser takes a NUL byte for the end of the text.
    return !reader.Parse<kFlags>(stream, builder).IsError() && stream.Tell() == text.size();
}

std::string toString(const Json::Value& value) {
    rapidjson::StringBuffer text;
    Writer writer(text);
    Write(writer, value);
    return std::string(text.GetString(), text.GetSize());
}

bool fromFile(Json::Value& value, const std::string& path) {
    const base::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    std::string text;
    return fd.IsValid() && base::ReadUpTo(fd.Get(), kMaxFileSize, text) && fromString(value, text);
}

bool toFile(const Json::Value& value, const std::string& path) {
    const base::Replaced replaced =
        base::ReplaceFile(path, toString(value), ModeForReplacement(path));
    if (replaced == base::Replaced::kNotSure) {
        // Who calls would take the change back; but every reader sees it already.
        LogError(LogSite::Here(), "%s is saved, but may be lost in a power failure", path.c_str());
    }
    return replaced != base::Replaced::kNo;
}

template <>
bool isJsonType<std::string>(const Json::Value& value) {
    return value.isConvertibleTo(Json::stringValue);
}
template <>
bool isJsonType<bool>(const Json::Value& value) {
    return value.isConvertibleTo(Json::booleanValue);
}
template <>
bool isJsonType<int>(const Json::Value& value) {
    return value.isConvertibleTo(Json::intValue);
}
template <>
bool isJsonType<unsigned int>(const Json::Value& value) {
    return value.isConvertibleTo(Json::uintValue);
}
template <>
bool isJsonType<long long>(const Json::Value& value) {
    // Not "convertible" as the others: 1.5 seconds or true must not pass for a time.
    return (value.type() == Json::intValue || value.type() == Json::uintValue) && value.isInt64();
}
template <>
bool isJsonType<double>(const Json::Value& value) {
    return value.isConvertibleTo(Json::realValue);
}

template <>
std::string asJsonType<std::string>(const Json::Value& value) {
    return value.asString();
}
template <>
bool asJsonType<bool>(const Json::Value& value) {
    return value.asBool();
}
template <>
int asJsonType<int>(const Json::Value& value) {
    return value.asInt();
}
template <>
unsigned int asJsonType<unsigned int>(const Json::Value& value) {
    return value.asUInt();
}
template <>
long long asJsonType<long long>(const Json::Value& value) {
    return value.asInt64();
}
template <>
double asJsonType<double>(const Json::Value& value) {
    return value.asDouble();
}

std::string AppendData(const Json::Value& data) {
    return ", data=" + toString(data);
}

const Json::Value* FindJsonMember(const Json::Value& json, const std::string& key, bool required) {
    if (!json.isObject()) {
        if (required) {
            throw Error(Error::kBadArgument, "Not an object" + AppendData(json));
        }
        return nullptr;
    }
    const Json::Value* member = json.find(key.data(), key.data() + key.size());
    if (member == nullptr && required) {
        // Without a log line: only the caller knows what was read.
        throw Error(Error::kBadArgument, "Missing property: " + key + AppendData(json));
    }
    return member;
}

void GetJsonValue(Json::Value& out, const Json::Value& json, const std::string& key,
                  bool required) {
    const Json::Value* member = FindJsonMember(json, key, required);
    if (member != nullptr) {
        out = Json::Value(*member);  // `out` may be the document itself
    }
}

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
    if (!target.isObject()) {
        target = Json::Value(Json::objectValue);
    }
    if (!changes.isObject()) {
        return;
    }
    for (auto it = changes.begin(); it != changes.end(); ++it) {
        const std::string key = it.name();
        if (it->isNull()) {
            // Not by the whole text: that stops at a NUL byte.
            target.removeMember(key.data(), key.data() + key.size(), nullptr);
        } else if (it->isObject()) {
            JsonApplyChanges(target[key], *it);
        } else {
            target[key] = *it;
        }
    }
}

}  // namespace quivra
