#pragma once

#include <json/json.h>

#include "programs/kestoelasticd/engine/schema.h"

namespace elasticd {

/// Reads a mapping document: {"property_id": NAME, "default": SETTINGS, "properties": {NAME:
/// SETTINGS}}. SETTINGS name what differs from the default: "type", "analyzer", "preprocess",
/// "required", "stored", "_all". Throws Error 1406 that names the offending part.
engine::Schema ReadMapping(const Json::Value& document);

}  // namespace elasticd
