#include <gtest/gtest.h>

#include <filesystem>
#include <set>

#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/service.h"
#include "tests/programs/kestoelasticd/client.h"

namespace elasticd {
namespace {

/// One index with a handful of documents, made once for all queries.
class QueryTest : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        ServiceOptions options;
        options.state_directory = "/var/lib/query_test";
        service = new Service(options);
        client = new Client([](const std::string& request) { return service->Handle(request); });
        ASSERT_EQ(client->Create("/var/lib/query_test/db", TestMappings()), 0);
        const std::pair<const char*, const char*> documents[] = {
            {"/v/s", R"({"name": "s", "dir": true})"},
            {"/v/s/a", R"({"name": "a", "dir": true, "parent": "/v/s"})"},
            {"/v/s/a/Report 2020.pdf",
             R"({"name": "Report 2020.pdf", "size": 2020, "title": "Annual report", "year": "x",
                 "authors": ["Ann Lee", "Bo"], "length": 1.5,
                 "KESTOMDTextContent": "The quick brown fox jumps over the lazy dog."})"},
            {"/v/s/a/b/tokyo.txt",
             R"({"name": "tokyo.txt", "size": 9007199254740993, "length": -2,
                 "KESTOMDTextContent": "\u6771\u4eac\u90fd \u5927\u962a quick r\u00e9sum\u00e9"})"},
            {"/v/s/ab", R"({"name": "AB", "size": -5, "title": "report annual", "private": "hidden",
                            "secret": "treasure"})"},
            {"/v/s/a\xff/x", R"({"name": "x y", "size": 9007199254740992})"},
        };
        for (const auto& [id, fields] : documents) {
            ASSERT_EQ(client->Upsert(id, fields), 0) << id;
        }
        ASSERT_EQ(client->Commit(), 0);
    }
    static void TearDownTestSuite() {
        delete client;
        delete service;
        std::filesystem::remove_all("/var/lib/query_test");
    }

    static Service* service;
    static Client* client;
};

Service* QueryTest::service = nullptr;
Client* QueryTest::client = nullptr;

const std::string kReport = "/v/s/a/Report 2020.pdf";
const std::string kTokyo = "/v/s/a/b/tokyo.txt";
const std::string kRaw = "/v/s/a\xff/x";

TEST_F(QueryTest, FormsFindWhatTheyShould) {
    const struct {
        const char* qsl;
        std::set<std::string> expected;
    } cases[] = {
        {R"({"prefix": {"path": "/v/s/a/"}})", {kReport, kTokyo}},
        {R"({"prefix": {"path": "/v/s/a"}})", {"/v/s/a", kReport, kTokyo, "/v/s/ab", kRaw}},
        {R"({"prefix": {"path": "/v/s/a/R"}})", {kReport}},
        {R"({"prefix": {"path": ""}})", {"/v/s", "/v/s/a", kReport, kTokyo, "/v/s/ab", kRaw}},
        {R"({"prefix": {"parent": "/v"}})", {"/v/s/a"}},
        {R"({"term": {"parent": "/v/s"}})", {"/v/s/a"}},
        {R"({"term": {"parent": "/v"}})", {}},
        {R"({"term": {"dir": true}})", {"/v/s", "/v/s/a"}},
        {R"({"term": {"size": 9007199254740993}})", {kTokyo}},
        {R"({"match": {"_all": "QUICK"}})", {kReport, kTokyo}},
        {R"({"match": {"_all": {"text": "fox resume", "operator": "or"}}})", {kReport, kTokyo}},
        {R"({"match": {"_all": "quick & fox"}})", {kReport}},
        {R"x({"match": {"_all": "fox AND (NOT dog)"}})x", {}},
        {R"({"match": {"_all": "port"}})", {kReport}},
        {R"({"match": {"_all": "20.p"}})", {kReport}},
        {R"({"match": {"_all": "yot"}})", {}},
        {R"({"match": {"_all": "hidden"}})", {}},
        {R"({"match": {"_all": "treasure"}})", {"/v/s/ab"}},
        {R"({"match": {"authors": "Lee"}})", {kReport}},
        {R"({"match": {"authors": "lee"}})", {kReport}},
        {R"({"phrase": {"authors": "ann lee"}})", {kReport}},
        {R"({"phrase": {"authors": "lee bo"}})", {}},
        {R"({"phrase": {"KESTOMDTextContent": "brown fox"}})", {kReport}},
        {R"({"phrase": {"KESTOMDTextContent": "fox brown"}})", {}},
        {R"({"phrase": {"_all": "annual report"}})", {kReport}},
        {R"({"prefix": {"KESTOMDTextContent": "lazy do"}})", {kReport}},
        {R"({"prefix": {"_all": "qui"}})", {kReport, kTokyo}},
        {R"({"prefix": {"title": "rep"}})", {kReport, "/v/s/ab"}},
        {R"({"match": {"_all": "2020"}})", {kReport}},
        {R"({"match": {"_all": "-5"}})", {"/v/s/ab"}},
        {R"({"match": {"_all": "1.5"}})", {kReport}},
        {"{\"match\": {\"KESTOMDTextContent\": \"\u90fd\"}}", {kTokyo}},
        {R"({"term": {"name": "ab"}})", {"/v/s/ab"}},
        {R"({"below": "/v/s/a"})", {kReport, kTokyo}},
        {R"({"below": {"path": "/v/s/a", "self": true}})", {"/v/s/a", kReport, kTokyo}},
        {R"({"below": "/"})", {"/v/s", "/v/s/a", kReport, kTokyo, "/v/s/ab", kRaw}},
        {R"({"below": "/v/s/nowhere"})", {}},
        {R"({"match": {"private": "HIDDEN"}})", {"/v/s/ab"}},
        {"{\"match\": {\"KESTOMDTextContent\": \"\u4eac\u90fd\"}}", {kTokyo}},
        {"{\"match\": {\"KESTOMDTextContent\": \"\u90fd\u5927\"}}", {}},
        {R"({"match": {"name": "y x"}})", {kRaw, kTokyo}},
        {R"({"range": {"size": {"gt": 9007199254740992}}})", {kTokyo}},
        {R"({"range": {"size": {"gte": -5, "lt": 2019.5}}})", {"/v/s/ab"}},
        {R"({"range": {"size": {"gt": 1e300}}})", {}},
        {R"({"range": {"length": {"lt": 1.5}}})", {kTokyo}},
        {R"({"all": [{"match": {"_all": "quick"}}, {"prefix": {"path": "/v/s/a/b/"}}]})", {kTokyo}},
        {R"({"any": [{"term": {"dir": true}}, {"term": {"size": 2020}}]})",
         {"/v/s", "/v/s/a", kReport}},
        {R"({"not": {"prefix": {"path": "/v/s/"}}})", {"/v/s"}},
        {R"({"all": [{"not": {"term": {"dir": true}}}, {"not": {"match": {"_all": "quick"}}}]})",
         {"/v/s/ab", kRaw}},
    };
    for (const auto& test : cases) {
        const Json::Value reply = client->Query(std::string("{\"qsl\": ") + test.qsl + "}");
        std::set<std::string> found;
        for (const Json::Value& hit : reply["data"]) {
            found.insert(hit["path"].asString());
        }
        EXPECT_EQ(found, test.expected) << test.qsl;
        EXPECT_EQ(reply["total"].asUInt(), test.expected.size()) << test.qsl;
    }
}

TEST_F(QueryTest, BadQueriesAreRefused) {
    std::string deep = R"({"all": []})";
    for (int i = 0; i < 40; ++i) {
        deep = "{\"not\": " + deep + "}";
    }
    std::string wide = R"({"any": [{"any": []})";
    for (int i = 0; i < 2000; ++i) {
        wide += R"(, {"any": []})";
    }
    const std::string queries[] = {
        R"({"qsl": {}})",
        R"({"qsl": {"what": {"path": "x"}}})",
        R"({"qsl": {"prefix": {"path": 1}}})",
        R"({"qsl": {"prefix": {"size": "1"}}})",
        R"({"qsl": {"term": {"size": "big"}}})",
        R"({"qsl": {"match": {"_all": {"text": "x", "operator": "xor"}}}})",
        R"({"qsl": {"range": {"title": {"gt": 1}}}})",
        R"({"qsl": {"range": {"size": {"above": 1}}}})",
        R"({"qsl": {"all": []}, "limit": -1})",
        R"({"qsl": {"all": []}, "sort": [{"field": "size", "order": "up"}]})",
        "{\"qsl\": " + deep + "}",
        "{\"qsl\": " + wide + "]}}",
    };
    for (const std::string& query : queries) {
        EXPECT_EQ(client->Ids(query), Ids{"error 1410"}) << query.substr(0, 200);
    }
}

TEST_F(QueryTest, OrdersAndPages) {
    const struct {
        const char* query;
        Ids expected;
    } cases[] = {
        {R"({"qsl": {"all": []}})", {"/v/s", "/v/s/a", kReport, kTokyo, "/v/s/ab", kRaw}},
        {R"({"qsl": {"all": []}, "offset": 1, "limit": 2})", {"/v/s/a", kReport}},
        {R"({"qsl": {"all": []}, "limit": 3, "sort": [{"field": "path", "order": "desc"}]})",
         {kRaw, "/v/s/ab", kTokyo}},
        {R"({"qsl": {"range": {"size": {"gte": -5}}}, "sort": [{"field": "size"}]})",
         {"/v/s/ab", kReport, kRaw, kTokyo}},
        // Documents without a value come last in both directions.
        {R"({"qsl": {"all": []}, "limit": 5,
             "sort": [{"field": "length", "order": "desc"}, {"field": "path"}]})",
         {kReport, kTokyo, "/v/s", "/v/s/a", "/v/s/ab"}},
        // A match in the name weighs more than one in the text.
        {R"({"qsl": {"match": {"_all": {"text": "port quick", "operator": "or"}}}})",
         {kReport, kTokyo}},
    };
    for (const auto& test : cases) {
        EXPECT_EQ(client->Ids(test.query), test.expected) << test.query;
    }
    EXPECT_EQ(client->Query(R"({"qsl": {"all": []}, "limit": 0})")["total"].asInt(), 6);
}

TEST_F(QueryTest, PagesByCursorWithoutCounting) {
    Ids all;
    std::string after;
    do {
        const Json::Value reply =
            client->Query(R"({"qsl": {"all": []}, "limit": 4, "count": false)" + after + "}");
        EXPECT_FALSE(reply.isMember("total"));
        for (const Json::Value& hit : reply["data"]) {
            all.push_back(hit["path"].asString());
        }
        after = reply.isMember("next") ? R"(, "after": ")" + reply["next"].asString() + "\"" : "";
    } while (!after.empty());
    EXPECT_EQ(all, client->All());
    EXPECT_EQ(client->Ids(R"({"qsl": {"match": {"_all": "quick"}}, "after": "00"})"),
              Ids{"error 1410"});
}

TEST_F(QueryTest, AsManyWordsAsAreAllowedAndADeadline) {
    std::string words = "quick";
    for (int i = 0; i < 500; ++i) {
        words += " w" + std::to_string(i);
    }
    const std::string query = R"({"qsl": {"match": {"_all": {"operator": "or", "text": ")" + words;
    EXPECT_EQ(client->Ids(query + "\"}}}}").size(), 2U);
    EXPECT_EQ(client->Ids(query + R"("}}}, "timeout": 0})"), Ids{"error 1418"});
}

TEST_F(QueryTest, HitsCarryTheTextOnRequestOnly) {
    const std::string report = R"({"qsl": {"term": {"size": 2020}})";
    Json::Value hit = client->Query(report + "}")["data"][0];
    EXPECT_EQ(hit["authors"][1].asString(), "Bo");
    EXPECT_FALSE(hit.isMember("KESTOMDTextContent"));
    hit = client->Query(report + R"(, "fields": ["size", "KESTOMDTextContent"]})")["data"][0];
    EXPECT_EQ(hit.size(), 2U);
}

TEST_F(QueryTest, HighlightsTheWordsFound) {
    const struct {
        const char* words;
        const char* field;
        const char* style;
        const char* expected;
    } cases[] = {
        {"FOX dog", "KESTOMDTextContent", "",
         "The quick brown <b>fox</b> jumps over the lazy <b>dog</b>."},
        {"fox", "KESTOMDTextContent", R"(, "pre": "[", "post": "]", "length": 12)",
         "wn [fox] jumps"},
        {"port", "name", "", "Re<b>port</b> 2020.pdf"},
        {"fox", "title", "", ""},
        {"ann", "authors", "", "<b>Ann</b> Lee"},
    };
    for (const auto& test : cases) {
        const std::string query =
            std::string(R"({"qsl": {"all": [{"term": {"size": 2020}}, {"any": [{"all": []},
                                            {"match": {"_all": ")") +
            test.words + R"("}}]}]}, "highlight": {"fields": [")" + test.field + "\"]" +
            test.style + "}}";
        const Json::Value hit = client->Query(query)["data"][0];
        EXPECT_EQ(hit["highlight"].get(test.field, "").asString(), test.expected) << query;
    }
    const Json::Value hit = client->Query(
        "{\"qsl\": {\"match\": {\"KESTOMDTextContent\": \"\u6771\u4eac\u90fd resume\"}}, "
        "\"highlight\": {\"fields\": [\"KESTOMDTextContent\"]}}")["data"][0];
    EXPECT_EQ(hit["highlight"]["KESTOMDTextContent"].asString(),
              "<b>\u6771\u4eac\u90fd</b> \u5927\u962a quick <b>r\u00e9sum\u00e9</b>");
}

}  // namespace
}  // namespace elasticd
