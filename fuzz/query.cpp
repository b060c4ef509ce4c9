#include <unistd.h>

#include <cstdint>
#include <memory>
#include <string>

#include "base/private_directory.h"
#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/sqlite_index.h"
#include "programs/kestoelasticd/json_values.h"
#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/search.h"

namespace {

using quivra::base::PrivateDirectory;

/// An index with a field of each kind.
struct Fixture {
    Fixture() {
        std::string path = "/tmp/fuzz_query_XXXXXX";
        directory = PrivateDirectory::Open(mkdtemp(path.data()));
        elasticd::engine::sqlite::Create(directory, *schema);
        index = elasticd::engine::sqlite::Open(directory, schema);
        Json::Value fields;
        quivra::fromString(fields, R"({"size": 5, "length": 1.5, "dir": true, "name": "A b.txt",
                                       "title": "Some words", "KESTOMDTextContent": "body"})");
        for (const std::string id : {"/a/b", "/a/c", "/d\xff"}) {
            elasticd::engine::Document document{id, {}};
            for (auto it = fields.begin(); it != fields.end(); ++it) {
                document.fields.push_back({it.name(), elasticd::ToValue(*it)});
            }
            index->Upsert(document);
        }
        index->Commit();
    }

    static Json::Value Mappings() {
        Json::Value mappings;
        quivra::fromString(mappings, R"({"property_id": "path", "properties": {
            "path": {"analyzer": "keyword", "_all": false}, "size": {"type": "int"},
            "length": {"type": "double"}, "dir": {"type": "bool"}, "title": {"type": "text"},
            "name": {"analyzer": "white space", "preprocess": ["tolower", "ngram"]}}})");
        return mappings;
    }

    std::shared_ptr<const elasticd::engine::Schema> schema =
        std::make_shared<elasticd::engine::Schema>(elasticd::ReadMapping(Mappings()));
    PrivateDirectory directory;
    std::unique_ptr<elasticd::engine::Index> index;
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
        const elasticd::Search search(query, *fixture.schema);
        const elasticd::SearchResult found =
            elasticd::RunSearch(search, *fixture.schema, *fixture.index);
        Json::Value reply;
        if (!quivra::fromString(reply, found.reply) || !reply["data"].isArray() ||
            reply["data"].size() > found.total) {
            __builtin_trap();
        }
    } catch (const quivra::Error& error) {
        // The engine must understand what the front has let through.
        if (static_cast<int>(error.code) == elasticd::kEngineFailed) {
            __builtin_trap();
        }
    }
    return 0;
}
