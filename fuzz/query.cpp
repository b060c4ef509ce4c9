#include <cstdint>
#include <string>

#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/document_editor.h"
#include "programs/kestoelasticd/record.h"
#include "programs/kestoelasticd/search.h"

namespace {

using elasticd::FieldTable;
using elasticd::Mapping;

/// A database in memory with a field of each kind.
struct Fixture {
    Fixture() {
        Json::Value fields;
        quivra::fromString(fields, R"({"size": 5, "length": 1.5, "dir": true, "name": "A b.txt",
                                       "title": "Some words", "KESTOMDTextContent": "body"})");
        for (const std::string id : {"/a/b", "/a/c", "/d\xff"}) {
            Xapian::Document document;
            elasticd::DocumentEditor editor(mapping, table, document);
            elasticd::Record record;
            editor.AddId(id);
            for (auto it = fields.begin(); it != fields.end(); ++it) {
                editor.AddField(it.name(), *it);
                elasticd::AppendJson(record[table.FindOrAdd(it.name())], *it);
            }
            editor.Finish();
            document.set_data(elasticd::EncodeRecord(record));
            database.add_document(document);
        }
    }

    static Json::Value Mappings() {
        Json::Value mappings;
        quivra::fromString(mappings, R"({"property_id": "path", "properties": {
            "path": {"analyzer": "keyword", "_all": false}, "size": {"type": "int"},
            "length": {"type": "double"}, "dir": {"type": "bool"}, "title": {"type": "text"},
            "name": {"analyzer": "white space", "preprocess": ["tolower", "ngram"]}}})");
        return mappings;
    }

    Mapping mapping{Mappings()};
    FieldTable table;
    Xapian::WritableDatabase database{std::string(), Xapian::DB_BACKEND_INMEMORY};
};

}  // namespace

/// Any query either finds something or is refused.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const Fixture fixture;
    Json::Value query;
    if (!quivra::fromString(query, std::string(reinterpret_cast<const char*>(data), size))) {
        return 0;
    }
    try {
        const elasticd::SearchResult found =
            elasticd::Search(query, fixture.mapping, fixture.table, fixture.database);
        Json::Value hits;
        if (!quivra::fromString(hits, found.data) || !hits.isArray() || hits.size() > found.total) {
            __builtin_trap();
        }
    } catch (const quivra::Error&) {
    }
    return 0;
}
