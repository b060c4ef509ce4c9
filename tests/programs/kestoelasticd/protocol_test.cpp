#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <memory>
#include <thread>

#include "common/json.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/service.h"
#include "tests/programs/kestoelasticd/client.h"

namespace elasticd {
namespace {

const std::string kState = "/var/lib/protocol_test";
const std::string kDatabase = kState + "/s";

class ProtocolTest : public testing::Test {
  protected:
    void SetUp() override {
        std::filesystem::remove_all(kState);
        Restart();
    }
    void TearDown() override {
        service_.reset();
        std::filesystem::remove_all(kState);
    }

    void Restart(ServiceOptions options = {}) {
        options.state_directory = kState;
        service_.reset();
        service_ = std::make_unique<Service>(options);
    }
    void CreateIndex() { ASSERT_EQ(client.Create(kDatabase, TestMappings()), 0); }

    Client client{[this](const std::string& request) { return service_->Handle(request); }};

  private:
    std::unique_ptr<Service> service_;
};

TEST_F(ProtocolTest, BadRequestsGetStableCodes) {
    CreateIndex();
    const struct {
        const char* request;
        int code;
    } cases[] = {
        {"{}", kBadRequest},
        {R"({"command": "commit"})", kBadRequest},
        {R"({"command": 5, "data": {"id": "fileindex_s"}})", kBadRequest},
        {R"({"command": "commit", "data": {"id": 5}})", kBadRequest},
        {R"({"command": "nonsense", "data": {"id": "fileindex_s"}})", kUnknownCommand},
        {R"({"command": "commit", "data": {"id": "fileindex_x"}})", kNoSuchIndex},
        {R"({"command": "document_upsert_by_id", "data": {"id": "fileindex_s"}})", kBadRequest},
        {R"({"command": "document_upsert_by_id",
             "data": {"id": "fileindex_s", "doc_id": "", "data": {}}})",
         kBadRequest},
        {R"({"command": "index_config_set", "data": {"id": "fileindex_s", "data": {"path": 7}}})",
         kBadRequest},
    };
    for (const auto& test : cases) {
        const Json::Value reply = client.Ask(ParseJson(test.request));
        EXPECT_FALSE(reply["success"].asBool()) << test.request;
        EXPECT_EQ(reply["error"]["code"].asInt(), test.code) << test.request;
    }
    EXPECT_EQ(client.Commit(), 0);
}

TEST_F(ProtocolTest, BadMappingsAndPathsAreRefused) {
    const char* mappings[] = {
        R"({})",
        R"({"property_id": "a"})",  // the default analyzer is no keyword
        R"({"property_id": "a", "properties": {"a": {"analyzer": "keyword"}, "b": {"boost": 2}}})",
        R"({"property_id": "a", "properties": {"a": {"analyzer": "keyword"},
                                               "b": {"type": "int", "preprocess": ["ngram"]}}})",
        R"({"property_id": "a", "properties": {"a": {"analyzer": "keyword"}, "_all": {}}})",
    };
    for (const char* mapping : mappings) {
        EXPECT_EQ(client.Create(kDatabase, ParseJson(mapping)), kBadMapping) << mapping;
    }
    std::filesystem::create_directory(kState + "/taken");
    std::filesystem::create_directory(kState + "/taken/precious");
    std::filesystem::create_symlink(kState, kState + "/link");
    for (const std::string path : {"relative", "/no/such/parent", "/var/../tmp/x", "/", "/tmp/"}) {
        EXPECT_EQ(client.Create(path, TestMappings()), kPathRefused) << path;
    }
    EXPECT_EQ(client.Create(kState + "/taken", TestMappings()), kPathRefused);
    EXPECT_EQ(client.Create(kState + "/link", TestMappings()), kPathRefused);
    EXPECT_TRUE(std::filesystem::exists(kState + "/taken/precious"));
    EXPECT_EQ(client.Commit(), kNoSuchIndex);
}

TEST_F(ProtocolTest, CreatingCanBeRepeatedAndDeletingRemovesAll) {
    CreateIndex();
    EXPECT_EQ(client.Upsert("/a"), 0);
    EXPECT_EQ(client.Upsert("/b", R"({"size": "big"})"), kBadDocument);
    EXPECT_EQ(client.Upsert("/b", R"({"path": "/c"})"), kBadDocument);
    EXPECT_EQ(client.Commit(), 0) << "what is refused must not spoil the batch";
    CreateIndex();
    EXPECT_EQ(client.All(), Ids{"/a"});
    EXPECT_EQ(client.Create(kState + "/other", TestMappings()), kIndexExists);
    Client second = client;
    second.index = "fileindex_t";
    EXPECT_EQ(second.Create(kDatabase + "/below", TestMappings()), kIndexExists);
    EXPECT_EQ(client.Code("index_delete"), 0);
    EXPECT_FALSE(std::filesystem::exists(kDatabase));
    CreateIndex();
    EXPECT_EQ(client.All(), Ids{});
}

TEST_F(ProtocolTest, BatchesAreSeenWhenCommitted) {
    CreateIndex();
    EXPECT_EQ(client.Upsert("/a"), 0);
    EXPECT_EQ(client.All(), Ids{});
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.Upsert("/b"), 0);
    EXPECT_EQ(client.Delete("/a"), 0);
    EXPECT_EQ(client.All(), Ids{"/a"});
    Restart();
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), Ids{"/a"}) << "a batch does not survive the process";
}

TEST_F(ProtocolTest, SetChangesTheGivenMembersOnly) {
    CreateIndex();
    EXPECT_EQ(client.Set("/a", "{}"), kNoSuchDocument);
    EXPECT_EQ(client.Upsert("/a", R"({"title": "one two two", "size": 5, "note": "two",
                                      "KESTOMDTextContent": "body two"})"),
              0);
    EXPECT_EQ(client.Set("/a", R"({"title": "three", "size": 7})"), 0);
    EXPECT_EQ(client.Commit(), 0);
    const auto finds = [&](const std::string& qsl) {
        return client.Ids("{\"qsl\": " + qsl + "}") == Ids{"/a"};
    };
    EXPECT_FALSE(finds(R"({"match": {"_all": "one"}})"));
    EXPECT_TRUE(finds(R"({"match": {"_all": "three two"}})")) << "two is in other fields, still";
    EXPECT_FALSE(finds(R"({"match": {"title": "two"}})"));
    EXPECT_TRUE(finds(R"({"term": {"size": 7}})"));
    EXPECT_EQ(client.Set("/a", R"({"note": null, "KESTOMDTextContent": "new body"})"), 0);
    EXPECT_EQ(client.Set("/a", R"({"size": null})"), 0);
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_FALSE(finds(R"({"match": {"_all": "two"}})"));
    EXPECT_TRUE(finds(R"({"match": {"KESTOMDTextContent": "new"}})"));
    EXPECT_FALSE(finds(R"({"range": {"size": {"gte": 0}}})"));
    const Json::Value hit = client.Query(R"({"qsl": {"all": []}})")["data"][0];
    EXPECT_EQ(quivra::toString(hit), R"({"path":"/a","title":"three"})");
}

/// The order of requests that a rename of a folder makes, with the members that were left over.
TEST_F(ProtocolTest, ARenameMovesEveryDocumentAndKeepsItsText) {
    CreateIndex();
    client.Upsert("/v/old", R"({"name": "old"})");
    client.Upsert("/v/old/x.txt", R"({"name": "x.txt", "KESTOMDTextContent": "some words"})");
    client.Upsert("/v/old/sub/y.txt", R"({"name": "y.txt"})");
    client.Upsert("/v/older", R"({"name": "older"})");
    client.Upsert("/v/new/x.txt", R"({"name": "x.txt", "KESTOMDTextContent": "overwritten"})");
    ASSERT_EQ(client.Commit(), 0);
    ASSERT_EQ(client.Set("/v/old", R"({"path": "/v/new", "name": "new"})"), 0);
    // What moved along is not listed again, though nothing is committed; other queries see nothing
    // of the batch.
    EXPECT_EQ(client.Ids(R"({"qsl": {"prefix": {"path": "/v/old/"}}})"), Ids{});
    EXPECT_EQ(client.Ids(R"({"qsl": {"prefix": {"path": "/v/old/sub/"}}})"), Ids{});
    EXPECT_EQ(client.Ids(R"({"qsl": {"prefix": {"path": "/v/old"}}})").size(), 4U);
    Json::Value compound;
    compound["compound"] = Json::arrayValue;
    for (const std::string name : {"x.txt", "sub/y.txt", "gone.txt"}) {  // as an older client does
        Json::Value element;
        element["command"] = "document_set_by_id";
        element["data"]["id"] = client.index;
        element["data"]["doc_id"] = "/v/old/" + name;
        element["data"]["data"]["path"] = "/v/new/" + name;
        element["data"]["query"]["qsl"]["prefix"]["path"] = "/v/old/";
        compound["compound"].append(element);
    }
    compound["compound"].append("nonsense");
    compound["compound"].append(
        ParseJson(R"({"command": "commit", "data": {"id": "fileindex_s"}})"));
    const Json::Value reply = client.Ask(compound);
    EXPECT_TRUE(reply["success"].asBool());
    EXPECT_TRUE(reply["has_fail"].asBool());
    ASSERT_EQ(reply["data"].size(), 5U);
    EXPECT_EQ(reply["data"][2]["error"]["code"].asInt(), kNoSuchDocument);
    EXPECT_EQ(reply["data"][3]["error"]["code"].asInt(), kBadRequest);
    EXPECT_EQ(reply["data"][4]["error"]["code"].asInt(), kUnknownCommand);
    ASSERT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), (Ids{"/v/new", "/v/new/sub/y.txt", "/v/new/x.txt", "/v/older"}));
    EXPECT_EQ(client.Ids(R"({"qsl": {"prefix": {"path": "/v/old/"}}})"), Ids{});
    EXPECT_EQ(client.Ids(R"({"qsl": {"match": {"_all": "words"}}})"), Ids{"/v/new/x.txt"});
    EXPECT_EQ(client.Ids(R"({"qsl": {"match": {"_all": "overwritten"}}})"), Ids{});
}

TEST_F(ProtocolTest, APausedIndexAnswersButDoesNotChange) {
    CreateIndex();
    client.Upsert("/a");
    ASSERT_EQ(client.Commit(), 0);
    client.Upsert("/b");
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(client.Code("index_pause"), 0);
        EXPECT_EQ(client.Upsert("/c"), kPaused);
        EXPECT_EQ(client.Commit(), kPaused);
        EXPECT_EQ(client.All(), Ids{"/a"});
        Restart();  // pausing is remembered
    }
    EXPECT_EQ(client.Code("index_resume"), 0);
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), Ids{"/a"}) << "the batch was dropped";
    EXPECT_EQ(client.Upsert("/d"), 0);
}

TEST_F(ProtocolTest, ShortMemoryAndFullDisksAreTold) {
    CreateIndex();
    client.Upsert("/a");
    ASSERT_EQ(client.Commit(), 0);
    ServiceOptions options;
    options.min_free_space = UINT64_MAX;
    Restart(options);
    EXPECT_EQ(client.Upsert("/b"), kNoSpace);
    EXPECT_EQ(client.Set("/a", "{}"), kNoSpace);
    EXPECT_EQ(client.Delete("/a"), 0) << "what frees space is allowed";
    EXPECT_EQ(client.Commit(), 0);
    options.min_memory = UINT64_MAX;
    Restart(options);
    EXPECT_EQ(client.Commit(), kOutOfMemory);
}

/// No file may grow: the engine fails in the middle of a batch.
TEST_F(ProtocolTest, ALostBatchFailsTheNextCommitOnly) {
    CreateIndex();
    client.Upsert("/a");
    ASSERT_EQ(client.Commit(), 0);
    client.Upsert("/b");
    std::signal(SIGXFSZ, SIG_IGN);
    rlimit before{};
    getrlimit(RLIMIT_FSIZE, &before);
    const rlimit none{0, before.rlim_max};
    setrlimit(RLIMIT_FSIZE, &none);
    int code = 0;
    std::string fields;
    for (int i = 0; i < 1000 && code == 0; ++i) {
        fields = R"({"title": ")" + std::string(50000, static_cast<char>('a' + i % 26)) + "\"}";
        code = client.Upsert("/c" + std::to_string(i), fields);
    }
    setrlimit(RLIMIT_FSIZE, &before);
    EXPECT_EQ(code, kEngineFailed);
    EXPECT_EQ(client.Upsert("/d"), 0);
    EXPECT_EQ(client.Commit(), kBatchLost);
    EXPECT_EQ(client.All(), Ids{"/a"});
    EXPECT_EQ(client.Upsert("/e"), 0);
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), (Ids{"/a", "/e"}));
}

TEST_F(ProtocolTest, PathsOfEveryKindAreDocuments) {
    CreateIndex();
    std::string longest;
    while (longest.size() < 4096) {
        longest += "/\xc3\xa4" + std::string(longest.size() % 2 == 0 ? 1 : 250, 'x');
    }
    Ids ids{longest.substr(0, 4096),  "/raw\xff\xfe/\x80", "/\"quoted\"\n\\", "no slash", "//",
            std::string("/nul\0l", 6)};
    for (const std::string& id : ids) {
        EXPECT_EQ(client.Upsert(id, R"({"name": "x"})"), 0);
    }
    ASSERT_EQ(client.Commit(), 0);
    std::sort(ids.begin(), ids.end());
    EXPECT_EQ(client.All(), ids);
}

TEST_F(ProtocolTest, ManyClientsReadWhileOneWrites) {
    CreateIndex();
    std::atomic<bool> done = false;
    std::vector<std::jthread> readers;
    for (int i = 0; i < 3; ++i) {
        readers.emplace_back([&] {
            while (!done) {
                // A query sees whole batches: pairs of documents.
                EXPECT_EQ(
                    client.Query(R"({"qsl": {"match": {"_all": "pair"}}})")["total"].asInt() % 2,
                    0);
            }
        });
    }
    for (int i = 0; i < 40; ++i) {
        client.Upsert("/a" + std::to_string(i), R"({"title": "pair"})");
        client.Upsert("/b" + std::to_string(i), R"({"title": "pair"})");
        EXPECT_EQ(client.Commit(), 0);
    }
    done = true;
}

}  // namespace
}  // namespace elasticd
