#pragma once

#include <json/json.h>

#include <string>

namespace KESTO {
namespace CONTENT_EXTRACT {

/// Describes one file-system object: a link as itself, never what it points to. `cfg` is
/// {"need_meta": bool}. `file_data` becomes an object with one member per metadata key: the names
/// that come from the path (bytes as they are), "KESTOMDIsDir", "KESTOMDFSSize", the owner's ids as
/// texts, and the dates as seconds since the epoch. With need_meta also content and embedded
/// metadata: here the text of plain-text files as "KESTOMDTextContent", valid UTF-8 of at most
/// 4 MiB.
/// False, with errno telling why, when the object cannot be examined; content that cannot be read
/// leaves the attributes alone.
bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data);

}  // namespace CONTENT_EXTRACT
}  // namespace KESTO
