#pragma once

#include <json/json.h>

#include <string>

#include "common/error.h"
#include "common/export.h"

/// Checked access to JSON documents: configuration files, queue lines, daemon messages. Only
/// quivra::Error leaves these functions, whatever the document holds.
namespace quivra {

/// Parses `text`, which must hold one JSON value of any kind and nothing behind it, as RFC 8259 has
/// it: no comments, trailing commas, leading zeros or plus signs, no raw control characters or NUL
/// bytes. Bytes that are not valid UTF-8 pass. False, and `value` is unspecified, for anything else
/// and for nesting beyond 1000 levels. The locale plays no part.
QUIVRA_EXPORT bool fromString(Json::Value& value, const std::string& text);

/// The compact text of `value`, on one line. Bytes that are not valid UTF-8 are kept as they are,
/// so that the name of every file survives. The locale plays no part. A real number that is not
/// finite becomes null.
QUIVRA_EXPORT std::string toString(const Json::Value& value);

/// Reads and parses a file of at most 256 MiB. False when it cannot be read or parsed.
QUIVRA_EXPORT bool fromFile(Json::Value& value, const std::string& path);

/// Replaces the file by the text of `value`, atomically: whatever fails or is interrupted, the path
/// holds either the old file whole or the new one. False, with errno telling why, when it still
/// holds the old one. When the new one is there and only cannot be made durable, that is logged and
/// the result is true. A new file gets mode 0644, an existing one keeps its mode. Uses the name
/// with ".new" behind it for a moment; what a killed process left there is used by the next.
QUIVRA_EXPORT bool toFile(const Json::Value& value, const std::string& path);

/// Whether asJsonType<T> can read the value: convertible for std::string, bool, int, unsigned int
/// and double; for long long only an integer that fits.
template <typename T>
bool isJsonType(const Json::Value& value);

template <>
QUIVRA_EXPORT bool isJsonType<std::string>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool isJsonType<bool>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool isJsonType<int>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool isJsonType<unsigned int>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool isJsonType<long long>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool isJsonType<double>(const Json::Value& value);

template <>
inline bool isJsonType<Json::Value>(const Json::Value& /*value*/) {
    return true;
}

/// Reads a value for which isJsonType<T> holds.
template <typename T>
T asJsonType(const Json::Value& value);

template <>
QUIVRA_EXPORT std::string asJsonType<std::string>(const Json::Value& value);
template <>
QUIVRA_EXPORT bool asJsonType<bool>(const Json::Value& value);
template <>
QUIVRA_EXPORT int asJsonType<int>(const Json::Value& value);
template <>
QUIVRA_EXPORT unsigned int asJsonType<unsigned int>(const Json::Value& value);
template <>
QUIVRA_EXPORT long long asJsonType<long long>(const Json::Value& value);
template <>
QUIVRA_EXPORT double asJsonType<double>(const Json::Value& value);
template <>
inline Json::Value asJsonType<Json::Value>(const Json::Value& value) {
    return value;
}

/// ", data=" and the text of the document: the tail of a reason text.
QUIVRA_EXPORT std::string AppendData(const Json::Value& data);

/// The member `key` of the object `json`. Null when there is none or `json` is not an object; then,
/// when `required`, Error 120 is thrown instead ("Not an object...", "Missing property: ...").
/// The result lives as long as `json` is not changed.
QUIVRA_EXPORT const Json::Value* FindJsonMember(const Json::Value& json, const std::string& key,
                                                bool required);

/// Reads the member `key` of `json` into `out`. When it is missing or of another type, Error 120
/// is thrown if it is `required`; else, and after an error, `out` is left as it was.
template <typename T>
void GetJsonValue(T& out, const Json::Value& json, const std::string& key, bool required) {
    const Json::Value* member = FindJsonMember(json, key, required);
    if (member == nullptr) {
        return;
    }
    if (!isJsonType<T>(*member)) {
        if (required) {
            // One text serves all types: consumers match on it.
            throw Error(Error::kBadArgument, "Not a string" + AppendData(json));
        }
        return;
    }
    out = asJsonType<T>(*member);
}

/// The same for a member of any type, which is copied as it is.
QUIVRA_EXPORT void GetJsonValue(Json::Value& out, const Json::Value& json, const std::string& key,
                                bool required);

/// Merges `changes` into `target`: a null member removes, an object member merges, everything else
/// replaces. A target that is not an object becomes an empty one first; `changes` that are not an
/// object change nothing.
QUIVRA_EXPORT void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

}  // namespace quivra
