#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <random>

#include "base/private_directory.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/sqlite_index.h"
#include "programs/kestoelasticd/mapping.h"
#include "tests/programs/kestoelasticd/client.h"
#include "tests/programs/kestoelasticd/model.h"

namespace elasticd::engine {
namespace {

using quivra::base::PrivateDirectory;
using Form = Query::Form;

const std::string kPlace = "/var/lib/property_test";

/// Random documents and random queries: what the engine answers is what the model says, whole and
/// page by page. SEED changes the numbers, ROUNDS how many.
class PropertyTest : public testing::Test {
  protected:
    PropertyTest() : schema(std::make_shared<Schema>(ReadMapping(TestMappings()))), model(*schema) {
        const char* seed = std::getenv("SEED");
        random.seed(seed != nullptr ? static_cast<unsigned>(std::atoi(seed)) : 1);
        std::filesystem::remove_all(kPlace);
        directory = PrivateDirectory::Open(kPlace, PrivateDirectory::Make::kMissing);
        sqlite::Create(directory, *schema);
        index = sqlite::Open(directory, schema);
    }
    ~PropertyTest() override {
        index.reset();
        std::filesystem::remove_all(kPlace);
    }

    std::size_t Below(std::size_t limit) { return random() % limit; }
    template <std::size_t kCount>
    std::string Any(const char* const (&texts)[kCount]) {
        return texts[Below(kCount)];
    }

    std::string Word() {
        static constexpr const char* kWords[] = {
            "red",    "Green", "blue", "fooBar", "foo", "bar",          "20.p",
            "2020",   "-5",    "1.5",  "x_y",    "&",   "l'\u00e9cole", "\u6771\u4eac\u90fd",
            "\u4eac", "re",    "a"};
        return Any(kWords);
    }
    std::string Text() {
        std::string text;
        for (std::size_t words = 1 + Below(4); words > 0; --words) {
            text += (text.empty() ? "" : " ") + Word();
        }
        return text;
    }
    std::string Id() {
        static constexpr const char* kNames[] = {"a", "a-b", "a.c", "b", "", "d\xff", "a b"};
        std::string id = Below(8) == 0 ? "" : "/v";
        for (std::size_t depth = 1 + Below(4); depth > 0; --depth) {
            id += "/" + Any(kNames);
        }
        return id;
    }
    /// Mostly one that exists.
    std::string KnownId() {
        if (model.documents.empty() || Below(10) == 0) {
            return Id();
        }
        return std::next(model.documents.begin(),
                         static_cast<std::ptrdiff_t>(Below(model.documents.size())))
            ->first;
    }
    Value Number() { return static_cast<std::int64_t>(Below(6)) * 404 - 5; }

    std::vector<Field> Fields() {
        std::vector<Field> fields;
        for (const char* name : {"name", "title", "authors", "note", "private", "secret", "parent",
                                 kTextField, "@kept"}) {
            if (Below(2) == 0) {
                fields.push_back({name, Text()});
            }
        }
        if (Below(4) == 0) {
            fields.push_back({"tags", Composite{"[?]", {Text(), Text()}}});
        }
        if (Below(2) == 0) {
            fields.push_back({"size", Number()});
        }
        if (Below(2) == 0) {
            fields.push_back({"length", static_cast<double>(Below(4)) / 2});
        }
        if (Below(2) == 0) {
            fields.push_back({"dir", Below(2) == 0});
        }
        return fields;
    }

    void ChangeSomething() {
        const std::string id = KnownId();
        const std::size_t kind = Below(20);
        if (kind < 10) {
            const Document document{kind < 8 ? Id() : id, Fields()};
            index->Upsert(document);
            model.Upsert(document);
        } else if (kind < 17) {
            const std::string new_id = kind < 13 ? id : kind < 16 ? Id() : id + "/a/b";
            std::vector<Field> changes = Fields();
            for (Field& field : changes) {
                field.value = Below(4) == 0 ? Value() : field.value;
            }
            int code = 0;
            try {
                index->Set(id, new_id, changes);
            } catch (const quivra::Error& error) {
                code = error.code;
            }
            EXPECT_EQ(code, model.Set(id, new_id, changes) ? 0 : kNoSuchDocument) << id;
        } else if (kind < 19) {
            index->Delete(id);
            model.Delete(id);
        } else {
            Query query;
            query.form = Form::kBelow;
            query.text = id;
            index->DeleteMatching(query);
            model.DeleteMatching(query);
        }
    }

    Query RandomQuery(std::size_t depth = 0) {
        Query query;
        const std::size_t kind = Below(depth < 3 ? 13 : 10);
        static constexpr const char* kFields[] = {"_all",    "_all",   "title", "authors", "note",
                                                  "private", "parent", "tags",  kTextField};
        query.field = Any(kFields);
        query.text = Text();
        if (kind < 4) {
            query.form = Form::kMatch;
            query.any_word = Below(3) == 0;
            query.field = Below(4) == 0 ? "name" : query.field;
        } else if (kind == 4) {
            query.form = Form::kPhrase;
            query.text = Below(2) == 0 ? Word() : query.text;
        } else if (kind == 5) {
            query.form = Form::kPrefix;
            query.text = Word();
        } else if (kind == 6) {
            query.form = Form::kPrefix;
            query.field = "path";
            query.text = KnownId();
            query.text.resize(Below(query.text.size() + 1));
        } else if (kind == 7) {
            query.form = Form::kBelow;
            query.text = KnownId();
            query.inclusive = Below(2) == 0;
        } else if (kind == 8) {
            query.form = Form::kRange;
            query.field = Below(2) == 0 ? "size" : "length";
            query.lower = Bound{Number(), Below(2) == 0};
            if (Below(2) == 0) {
                query.upper = Bound{Value(static_cast<double>(Below(2000)) / 2), Below(2) == 0};
            }
        } else if (kind == 9) {
            query.form = Form::kTerm;
            query.field = Below(2) == 0 ? "dir" : "size";
            query.value = query.field == "dir" ? Value(Below(2) == 0) : Number();
        } else {
            query.form = kind == 10 ? Form::kAll : kind == 11 ? Form::kAny : Form::kNot;
            for (std::size_t parts = kind == 12 ? 1 : Below(4); parts > 0; --parts) {
                query.parts.push_back(RandomQuery(depth + 1));
            }
        }
        return query;
    }

    SearchRequest RandomRequest() {
        SearchRequest request;
        request.query = RandomQuery();
        request.by_relevance = Below(2) == 0;
        static constexpr const char* kSorts[] = {"path", "size", "length", "dir", "name", "note"};
        for (std::size_t keys = Below(3); keys > 0; --keys) {
            request.sort.push_back({Any(kSorts), Below(2) == 0});
        }
        return request;
    }

    /// For a failure's message.
    static std::string Describe(const Query& query) {
        std::string text = std::to_string(static_cast<int>(query.form)) + " " + query.field + " '" +
                           query.text + (query.any_word ? "' any" : "'");
        for (const Query& part : query.parts) {
            text += " [" + Describe(part) + "]";
        }
        return text;
    }

    struct Answer {
        std::vector<std::string> ids;
        std::string cursor;
        std::uint64_t total;
    };
    Answer Ask(const SearchRequest& request) {
        Answer answer;
        answer.total = index
                           ->Search(request,
                                    [&](Hit&& hit) {
                                        answer.ids.push_back(hit.id);
                                        answer.cursor = hit.cursor;
                                        ExpectFields(hit);
                                    })
                           .total;
        return answer;
    }
    void ExpectFields(const Hit& hit) {
        std::size_t stored = 0;
        for (const auto& [name, value] : model.documents[hit.id]) {
            stored += name != kTextField && schema->Of(name).stored ? 1 : 0;
        }
        EXPECT_EQ(hit.fields.size(), stored) << hit.id;
        for (const Field& field : hit.fields) {
            EXPECT_EQ(field.value, model.ValueOf(hit.id, field.name)) << hit.id << field.name;
        }
    }

    void ExpectOrder(const SearchRequest& request, const std::vector<std::string>& ids) {
        if (request.sort.empty()) {
            if (!request.by_relevance) {
                EXPECT_TRUE(std::is_sorted(ids.begin(), ids.end()));
            }
            return;
        }
        const SortKey& key = request.sort.front();
        if (key.field != "size" && key.field != "length") {
            return;
        }
        for (std::size_t i = 1; i < ids.size(); ++i) {
            const Value before = model.ValueOf(ids[i - 1], key.field);
            const Value after = model.ValueOf(ids[i], key.field);
            EXPECT_TRUE(IsNone(after) ||
                        (!IsNone(before) && (key.descending ? before >= after : before <= after)));
        }
    }

    void Compare() {
        SearchRequest request = RandomRequest();
        const Answer whole = Ask(request);
        std::vector<std::string> expected = model.Find(request.query);
        EXPECT_EQ(whole.total, expected.size());
        std::vector<std::string> found = whole.ids;
        ExpectOrder(request, found);
        std::sort(found.begin(), found.end());
        ASSERT_EQ(found, expected) << Describe(request.query);
        request.limit = 1 + Below(4);
        Answer page;
        std::vector<std::string> by_offset;
        std::vector<std::string> by_cursor;
        for (; by_offset.size() < expected.size(); request.offset += request.limit) {
            page = Ask(request);
            ASSERT_FALSE(page.ids.empty());
            by_offset.insert(by_offset.end(), page.ids.begin(), page.ids.end());
        }
        EXPECT_EQ(by_offset, whole.ids);
        request.offset = 0;
        do {
            page = Ask(request);
            EXPECT_EQ(page.total, expected.size());
            by_cursor.insert(by_cursor.end(), page.ids.begin(), page.ids.end());
            request.after = page.cursor;
        } while (!page.ids.empty());
        EXPECT_EQ(by_cursor, whole.ids);
    }

    std::mt19937 random;
    const std::shared_ptr<const Schema> schema;
    Model model;
    PrivateDirectory directory;
    std::unique_ptr<Index> index;
};

TEST_F(PropertyTest, EveryAnswerIsTheModels) {
    const char* rounds = std::getenv("ROUNDS");
    for (int round = rounds != nullptr ? std::atoi(rounds) : 60; round > 0; --round) {
        const auto committed = model.documents;
        for (std::size_t changes = 1 + Below(12); changes > 0; --changes) {
            ChangeSomething();
        }
        if (Below(8) == 0) {
            index->Rollback();
            model.documents = committed;
        } else {
            index->Commit();
        }
        for (int query = 0; query < 12; ++query) {
            Compare();
            ASSERT_FALSE(HasFailure()) << "round " << round;
        }
    }
    index->Check();
    while (index->Compact()) {
    }
    Compare();
}

}  // namespace
}  // namespace elasticd::engine
