#pragma once

#include <json/json.h>

#include <functional>
#include <map>
#include <string>
#include <string_view>

/// The fields of a document as they are kept: field by field, each as the JSON text of its value,
/// so that a hit is put together without parsing. The id and the file's text are kept elsewhere.
namespace elasticd {

/// Number of field -> JSON text.
using Record = std::map<unsigned int, std::string>;

std::string EncodeRecord(const Record& record);
/// Calls `take` for every field of an encoded record, in order. Damaged data ends the walk early.
void WalkRecord(std::string_view encoded,
                const std::function<void(unsigned int, std::string_view)>& take);
Record DecodeRecord(std::string_view encoded);

/// Appends the compact JSON text. The bytes of a text that is no valid UTF-8 are kept.
void AppendJson(std::string& out, const Json::Value& value);
void AppendJsonText(std::string& out, std::string_view text);

/// Both are inverse. Unpack gives nothing for damaged data.
std::string PackText(std::string_view text);
std::string UnpackText(std::string_view packed);

}  // namespace elasticd
