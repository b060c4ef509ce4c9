#pragma once

#include <json/json.h>

#include <string>

namespace KESTO {
namespace CONTENT_EXTRACT {

/// Describes one file or directory. `cfg` is {"need_meta": bool}: without it `file_data` gets the
/// file-system attributes only, with it also content and embedded metadata, one member per metadata
/// key found. False, with errno telling why, when the object cannot be examined; content that
/// cannot be read leaves the attributes alone.
bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data);

}  // namespace CONTENT_EXTRACT
}  // namespace KESTO
