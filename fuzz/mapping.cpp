#include <cstdint>
#include <string>

#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/document_editor.h"

/// The first line is a mapping document, the rest a document. What the mapping takes in must come
/// out again, to the last term but for the id's.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string input(reinterpret_cast<const char*>(data), size);
    const std::size_t line_end = input.find('\n');
    Json::Value mappings;
    Json::Value fields;
    if (line_end == std::string::npos || !quivra::fromString(mappings, input.substr(0, line_end)) ||
        !quivra::fromString(fields, input.substr(line_end + 1)) || !fields.isObject()) {
        return 0;
    }
    try {
        const elasticd::Mapping mapping(mappings);
        elasticd::FieldTable table;
        Xapian::Document document;
        elasticd::DocumentEditor adding(mapping, table, document);
        for (auto it = fields.begin(); it != fields.end(); ++it) {
            adding.AddField(it.name(), *it);
        }
        adding.Finish();
        elasticd::DocumentEditor removing(mapping, table, document);
        for (auto it = fields.begin(); it != fields.end(); ++it) {
            removing.RemoveField(it.name(), *it);
        }
        removing.Finish();
        if (document.termlist_count() != 0 || document.values_count() != 0) {
            __builtin_trap();
        }
    } catch (const quivra::Error&) {
    }
    return 0;
}
