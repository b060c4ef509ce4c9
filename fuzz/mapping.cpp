#include <cstdint>
#include <string>

#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/engine/sqlite/encoder.h"
#include "programs/kestoelasticd/json_values.h"
#include "programs/kestoelasticd/mapping.h"

/// The first line is a mapping document, the rest a document. A document that the mapping takes in
/// is kept as it was, and gives the same words once it was kept: else it could not be deleted.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    namespace sqlite = elasticd::engine::sqlite;
    const std::string input(reinterpret_cast<const char*>(data), size);
    const std::size_t line_end = input.find('\n');
    Json::Value mappings;
    Json::Value json;
    if (line_end == std::string::npos || !quivra::fromString(mappings, input.substr(0, line_end)) ||
        !quivra::fromString(json, input.substr(line_end + 1)) || !json.isObject()) {
        return 0;
    }
    try {
        const elasticd::engine::Schema schema = elasticd::ReadMapping(mappings);
        sqlite::FieldTable fields(schema);
        sqlite::Record record;
        for (auto it = json.begin(); it != json.end(); ++it) {
            if (!it->isNull()) {
                record.emplace_back(fields.FindOrAdd(it.name()), elasticd::ToValue(*it));
            }
        }
        const sqlite::Encoded before = sqlite::Encode(record, {}, fields);
        const sqlite::Record kept =
            sqlite::DecodeRecord(sqlite::EncodeRecord(before.record, "name"), "name");
        const sqlite::Encoded after = sqlite::Encode(kept, {}, fields);
        for (std::size_t column = 0; column < before.columns.size(); ++column) {
            if (before.columns[column].Bytes() != after.columns[column].Bytes()) {
                __builtin_trap();
            }
        }
    } catch (const quivra::Error&) {
    }
    return 0;
}
