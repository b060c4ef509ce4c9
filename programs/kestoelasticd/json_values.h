#pragma once

#include <json/json.h>

#include <string>
#include <string_view>

#include "programs/kestoelasticd/engine/value.h"

namespace elasticd {

/// A member of a request's document as the engine takes it. Arrays and objects keep their JSON text
/// as the source that only we understand.
engine::Value ToValue(const Json::Value& json);

/// Appends the value as it came.
void AppendValue(std::string& out, const engine::Value& value);

/// Appends the compact JSON text. The bytes of a text that is not valid UTF-8 are kept.
void AppendJson(std::string& out, const Json::Value& value);
void AppendJsonText(std::string& out, std::string_view text);

}  // namespace elasticd
