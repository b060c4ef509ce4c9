#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "programs/kestoelasticd/engine/value.h"

/// How the fields of a document are kept. On disk: a change needs another layout.
namespace elasticd::engine::sqlite {

/// (number of field, value)
using Record = std::vector<std::pair<unsigned int, Value>>;

/// A text that is the document's own name takes no room: several fields hold it. Numbers are kept
/// as differences, because a document's dates lie close together.
std::string EncodeRecord(const Record& record, std::string_view name);
/// Inverse to EncodeRecord, given the same name. Throws Damaged for what that cannot have made.
Record DecodeRecord(std::string_view encoded, std::string_view name);

/// Both are inverse. UnpackText throws Damaged.
std::string PackText(std::string_view text);
std::string UnpackText(std::string_view packed);

}  // namespace elasticd::engine::sqlite
