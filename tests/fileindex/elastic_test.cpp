#include "fileindex/elastic/elastic_control.h"

#include <algorithm>
#include <cerrno>
#include <set>

#include "fileindex/status_mgr.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex::elastic {
namespace {

class ElasticTest : public LibraryTest {
  protected:
    /// What the library asked since the last call.
    std::vector<Json::Value> NewRequests() {
        std::vector<Json::Value> requests = server_.Requests();
        requests.erase(requests.begin(), requests.begin() + static_cast<std::ptrdiff_t>(seen_));
        seen_ += requests.size();
        return requests;
    }

    fake::ScriptedServer server_{kSearchSocket};
    std::size_t seen_ = 0;
};

constexpr const char* kNotify = "KLIBCExecl(/usr/kesto/bin/kestokosnotify";

TEST_F(ElasticTest, ReplyDecidesTheError) {
    struct Row {
        std::string bytes;
        int code;
        std::string reason;
    };
    const Row rows[] = {
        {fake::Frame(R"({"success": true})"), 0, "nothing"},
        {fake::Frame("no json"), 913, "Recv failed, res=null"},
        {fake::Frame("[1]"), 913, "Recv failed, res=[1]"},
        {fake::Frame("5"), 913, "Recv failed, res=5"},
        {fake::Frame("{}"), 913, "Recv failed, res={}"},
        {fake::Frame(R"({"success": "true"})"), 913, R"(Recv failed, res={"success":"true"})"},
        {fake::Frame(R"({"success": 1})"), 913, "Recv failed, res="},
        {fake::Frame(std::string(3000, '[')), 913, "Recv failed, res=null"},
        {"", 913, "Recv failed, res=null"},
        {fake::Frame(R"({"success": true})").substr(0, 9), 913, "Recv failed, res=null"},
        {std::string("\x01", 1), 913, "Recv failed, res=null"},
        {std::string("\xff\xff\xff\xff", 4), 913, "Recv failed, res=null"},
        {fake::Frame(R"({"success":false,"error":{"code":7,"msg":"no index"}})"), 7,
         "Request failed, msg=no index"},
        {fake::Frame(R"({"success":false})"), 120, "Not an object"},
        {fake::Frame(R"({"success":false,"error":[]})"), 120, "Not an object"},
        {fake::Frame(R"({"success":false,"error":{"msg":"x"}})"), 120, "Missing property: code"},
        {fake::Frame(R"({"success":false,"error":{"code":7}})"), 120, "Missing property: msg"},
        {fake::Frame(R"({"success":false,"error":{"code":"7","msg":"x"}})"), 120, "Not a string"},
        {fake::Frame(R"({"success":false,"error":{"code":99999999999,"msg":"x"}})"), 120, "Not a"},
    };
    const std::size_t descriptors = OpenDescriptors();
    for (const Row& row : rows) {
        server_.Then({row.bytes});
        const Error error = ErrorOf([] { ShareIndexDelete("s"); });
        EXPECT_EQ(error.code, row.code) << row.bytes;
        EXPECT_TRUE(error.reason.starts_with(row.reason)) << error.what();
    }
    EXPECT_TRUE(NoneLeaked(descriptors));
    const auto lines = fake::LogLinesWith(
        R"(Failed [!conn.Recv(resp_raw) || !res.fromString(resp_raw) || )"
        R"(!res.isMember("success") || !res["success"].isBool()], reason: Recv failed, res=)");
    EXPECT_EQ(lines.size(), 11U);
    EXPECT_TRUE(lines[0].starts_with("elastic_control:"));
}

TEST_F(LibraryTest, NoSearchDaemonIsAChannelError) {
    const Error error = ErrorOf([] { ShareIndexDelete("s"); });
    EXPECT_EQ(error.code, 913);
    EXPECT_EQ(error.reason, "Connect failed");
    EXPECT_EQ(fake::LogLinesWith("Failed [!conn.Connect()], reason: Connect failed").size(), 1U);
}

TEST_F(ElasticTest, ABusyDaemonIsWaitedForAndAdministratorsAreToldOnce) {
    for (int i = 0; i < 13; ++i) {
        server_.ThenReply(i % 2 == 0 ? R"({"success":false,"error":{"code":1400,"msg":"memory"}})"
                                     : R"({"success":false,"error":{"code":1401,"msg":"moves"}})");
    }
    std::size_t retries_at_notice = 0;
    fake::OnExec([&](const auto& command) {
        EXPECT_EQ(command.back(), "error:lack_of_memory");
        retries_at_notice = fake::Sleeps().size();
        return 0;
    });
    ShareIndexPause("music");
    EXPECT_EQ(server_.Connections(), 14);
    EXPECT_EQ(retries_at_notice, 10U);  // before the sleep of the eleventh
    EXPECT_EQ(fake::CallsOf(kNotify).size(), 1U);
    std::set<std::chrono::microseconds> lengths;
    for (const auto sleep : fake::Sleeps()) {
        const auto past_base = sleep - std::chrono::minutes(15);
        EXPECT_EQ(past_base % std::chrono::minutes(1), std::chrono::microseconds(0));
        EXPECT_TRUE(past_base >= past_base.zero() && past_base <= std::chrono::minutes(4));
    }
    EXPECT_EQ(fake::Sleeps().size(), 13U);
    for (const char* retry : {"Retry[0]", "Retry[12]"}) {
        EXPECT_EQ(fake::LogLinesWith(retry + std::string(" since kestoelasticd is busy. Command: "
                                                         "index_pause, db: fileindex_music"))
                      .size(),
                  1U);
    }
}

TEST_F(ElasticTest, AQueryIsNotRepeated) {
    server_.ThenReply(R"({"success":false,"error":{"code":1400,"msg":"memory"}})");
    server_.ThenReply(R"({"success":true,"data":[{"KESTOMDPath":"/v/s/a"}],"total":1})");
    Json::Value reply;
    const Json::Value query = Parse(R"({"qsl":{"match":{"_all":"word"}},"limit":3})");
    EXPECT_EQ(ErrorOf([&] { IndexQuery(reply, "s", query); }).code, 1400);
    IndexQuery(reply, "s", query);
    EXPECT_EQ(reply["total"].asInt(), 1);
    EXPECT_TRUE(fake::Sleeps().empty());
    Json::Value expected =
        Parse(R"({"command":"document_get_by_query","data":{"id":"fileindex_s"}})");
    expected["data"]["query"] = query;
    EXPECT_EQ(NewRequests().back(), expected);
}

TEST_F(ElasticTest, IndexCommandsHaveTheirExactRequests) {
    AddShare("music");
    Json::Value create = Parse(
        R"({"command":"index_create","data":{"id":"fileindex_music",
            "path":"/volume1/music/@eaDir/fileindex/db","settings":{}}})");
    create["data"]["mappings"] = GetFileIndexMappings();
    ShareIndexCreate("music");
    ShareIndexDelete("music");
    ShareIndexPause("music");
    ShareIndexResume("");
    ShareIndexRename("music", "songs", "/volume1/songs/db");
    ShareIndexMigrate("music", "/volume2/db");
    IndexDel("music", "/volume1/music/a");
    IndexDelDir("music", "/volume1/music/a");
    IndexCommit("music");
    const std::vector<Json::Value> expected = {
        create,
        Parse(R"({"command":"index_delete","data":{"id":"fileindex_music"}})"),
        Parse(R"({"command":"index_pause","data":{"id":"fileindex_music"}})"),
        Parse(R"({"command":"index_resume","data":{"id":"fileindex_"}})"),
        Parse(R"({"command":"index_config_set","data":{"id":"fileindex_music",
                  "data":{"id":"fileindex_songs","path":"/volume1/songs/db"}}})"),
        Parse(R"({"command":"index_config_set","data":{"id":"fileindex_music",
                  "data":{"path":"/volume2/db"}}})"),
        Parse(R"({"command":"document_del_by_id","data":{"id":"fileindex_music",
                  "doc_id":"/volume1/music/a"}})"),
        Parse(R"({"command":"document_del_by_query","data":{"id":"fileindex_music",
                  "query":{"qsl":{"prefix":{"KESTOMDPath":"/volume1/music/a/"}}}}})"),
        Parse(R"({"command":"commit","data":{"id":"fileindex_music"}})"),
    };
    EXPECT_EQ(NewRequests(), expected);
    EXPECT_EQ(ErrorOf([] { ShareIndexCreate("unknown"); }).code, 800);
    EXPECT_TRUE(NewRequests().empty());
}

TEST(MappingsTest, ListsItsFields) {
    const Json::Value mappings = GetFileIndexMappings();
    EXPECT_EQ(mappings["property_id"], "KESTOMDPath");
    EXPECT_EQ(mappings["default"], Parse(R"({"type":"string","analyzer":"kestostandard",
                                             "required":false,"stored":true,"_all":true})"));
    const Json::Value& fields = mappings["properties"];
    EXPECT_EQ(fields.size(), 53U);
    EXPECT_EQ(fields["KESTOMDPath"],
              Parse(R"({"analyzer":"keyword","required":true,"_all":false})"));
    EXPECT_EQ(fields["KESTOMDKeywords"], Json::Value(Json::objectValue));
    EXPECT_EQ(fields["KESTOMDSearchFileName"], Parse(R"({"type":"text","analyzer":"white space",
                        "preprocess":["tolower","ngram"]})"));
    EXPECT_TRUE(fields.isMember("KESTOMDFinderLabel") && fields.isMember("_KESTOMDUserTags"));
    const auto keys = GetMetadataKeys();
    EXPECT_EQ(std::set<std::string_view>(keys.begin(), keys.end()).size(), 130U);
    EXPECT_EQ(keys.front(), "KESTOMDAttributeChangeDate");
    EXPECT_EQ(keys[46], "KESTOStateOrProvince");
    EXPECT_EQ(keys.back(), "KESTOMDPeopleDisplayName");
}

TEST_F(ElasticTest, DocumentsCarryWhatTheExtractorFound) {
    fake::SetDocument("/volume1/s/a.txt", Parse(R"({"KESTOMDFSName":"a.txt","KESTOMDFSSize":5})"));
    IndexUpsert("s", "/volume1/s/a.txt", true);
    IndexAttr("s", "/volume1/s/a.txt");
    const std::string data = R"("data":{"id":"fileindex_s","doc_id":"/volume1/s/a.txt","data":
        {"KESTOMDFSName":"a.txt","KESTOMDSearchFileName":"a.txt","KESTOMDFSSize":5}}})";
    EXPECT_EQ(NewRequests(), (std::vector{Parse(R"({"command":"document_upsert_by_id",)" + data),
                                          Parse(R"({"command":"document_set_by_id",)" + data)}));
    const auto calls = fake::CallsOf("ParseFile(");
    ASSERT_EQ(calls.size(), 2U);
    EXPECT_NE(calls[0].find("true"), std::string::npos) << calls[0];
    EXPECT_NE(calls[1].find("false"), std::string::npos) << calls[1];

    for (const Json::Value& unusable : {Json::Value("text"), Json::Value(Json::arrayValue)}) {
        fake::SetDocument("/volume1/s/odd", unusable);
        EXPECT_EQ(ErrorOf([] { IndexUpsert("s", "/volume1/s/odd", true); }).code, 914);
    }
    fake::FailNext("ParseFile");
    const Error error = ErrorOf([] { IndexUpsert("s", "/volume1/s/b", true); });
    EXPECT_EQ(error.code, 914);
    EXPECT_EQ(error.reason, "Parse failed, path=/volume1/s/b");
    EXPECT_TRUE(NewRequests().empty());
    EXPECT_FALSE(fake::LogLinesWith("[!ParseFile(full_path, cfg, file_data)]").empty());
}

TEST_F(ElasticTest, ARenameMovesTheDocumentThenAllBelow) {
    server_.ThenReply(R"({"success":true})");
    server_.ThenReply(R"({"success":true,"data":[
        {"KESTOMDPath":"/v/s/old/x","KESTOMDFSName":"x","KESTOMDParent":"/v/s/old"},
        {"KESTOMDPath":"/v/s/old/d/y.TXT","KESTOMDFSName":"y.TXT","KESTOMDParent":"/v/s/old/d"},
        {"KESTOMDPath":"/v/s/old/z","KESTOMDFSName":"z","KESTOMDParent":"/"}]})");
    IndexRename("s", "/v/t/Report.PDF", "/v/s/old");
    const std::string data_of_first = R"({"KESTOMDPath":"/v/t/Report.PDF","KESTOMDParent":"/v/t",
        "KESTOMDFSName":"Report.PDF","KESTOMDSearchFileName":"Report.PDF",
        "KESTOMDDisplayName":"Report.PDF","KESTOMDKind":"pdf","KESTOMDExtension":"pdf"})";
    const auto request = [](const std::string& command, const std::string& members) {
        return R"({"command":")" + command + R"(","data":{"id":"fileindex_s",)" + members + "}}";
    };
    const std::string query = R"("query":{"qsl":{"prefix":{"KESTOMDPath":"/v/s/old/"}}})";
    const auto element = [&](const std::string& doc_id, const std::string& parent,
                             const std::string& name) {
        return request("document_set_by_id", query + R"(,"doc_id":")" + doc_id +
                                                 R"(","data":{"KESTOMDParent":")" + parent +
                                                 R"(","KESTOMDPath":")" + parent + "/" + name +
                                                 R"(","KESTOMDSearchFileName":")" + name + R"("})");
    };
    const std::string first = R"("doc_id":"/v/s/old","data":)" + data_of_first;
    EXPECT_EQ(NewRequests(),
              (std::vector{
                  Parse(request("document_set_by_id", first)),
                  Parse(request("document_get_by_query", first + "," + query)),
                  Parse(R"({"compound":[)" + element("/v/s/old/x", "/v/t/Report.PDF", "x") + "," +
                        element("/v/s/old/d/y.TXT", "/v/t/Report.PDF/d", "y.TXT") + "," +
                        element("/v/s/old/z", "/v/t/Report.PDF", "z") + "]}"),
              }));
}

TEST_F(ElasticTest, HostileHitsOfARenameAreErrors) {
    struct Row {
        std::string reply;
        int code;
        std::string reason;
    };
    const Row rows[] = {
        {R"({"success":true,"data":[]})", 0, "nothing"},
        {R"({"success":true})", 916, R"({"success":true})"},
        {R"({"success":true,"data":{}})", 916, R"({"data":{},"success":true})"},
        {R"({"success":true,"data":[5]})", 120, "Not an object"},
        {R"({"success":true,"data":[{"KESTOMDParent":"/v"}]})", 120,
         "Missing property: KESTOMDFSName"},
        {R"({"success":true,"data":[{"KESTOMDFSName":"n","KESTOMDParent":[]}]})", 120,
         "Not a string"},
    };
    for (const Row& row : rows) {
        server_.ThenReply(R"({"success":true})");
        server_.ThenReply(row.reply);
        const Error error = ErrorOf([] { IndexRename("s", "/v/s/new", "/v/s/old"); });
        EXPECT_EQ(error.code, row.code) << row.reply;
        EXPECT_TRUE(error.reason.starts_with(row.reason)) << error.reason;
    }
    EXPECT_EQ(NewRequests()[2], Parse(R"({"compound":[]})"));  // sent without descendants, too
    EXPECT_EQ(fake::LogLinesWith(R"([!res.isMember("data") || !res["data"].isArray()])").size(),
              2U);
}

TEST_F(ElasticTest, FailedElementsOfABatchAreLoggedAndBusyOnesRepeatIt) {
    const auto rename = [this](const std::string& batch_reply) {
        server_.ThenReply(R"({"success":true})");
        server_.ThenReply(R"({"success":true,"data":[
            {"KESTOMDPath":"/v/a/x","KESTOMDFSName":"x","KESTOMDParent":"/v/a"},
            {"KESTOMDPath":"/v/a/y","KESTOMDFSName":"y","KESTOMDParent":"/v/a"}]})");
        server_.ThenReply(batch_reply);
        errno = 0;
        return ErrorOf([] { IndexRename("s", "/v/b", "/v/a"); });
    };
    EXPECT_EQ(rename(R"({"success":true,"has_fail":true,"data":[{"success":true},
                         {"success":false,"error":{"code":5,"msg":"gone"}}]})")
                  .code,
              0);
    const auto lines = fake::LogLinesWith("Compound failed: ");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_NE(lines[0].find(R"("doc_id":"/v/a/y")"), std::string::npos);
    EXPECT_TRUE(lines[0].ends_with(" (5) gone")) << lines[0];

    const int before = server_.Connections();
    EXPECT_EQ(rename(R"({"success":true,"has_fail":true,"data":[{"success":true},
                         {"success":false,"error":{"code":1401,"msg":"moves"}}]})")
                  .code,
              0);
    EXPECT_EQ(server_.Connections() - before, 4);  // the batch twice
    EXPECT_EQ(server_.RequestTexts().rbegin()[0], server_.RequestTexts().rbegin()[1]);
    EXPECT_EQ(fake::LogLinesWith("is busy. Command: , db: ").size(), 1U);

    struct Row {
        std::string members;
        int code;
    };
    const Row hostile[] = {
        {R"("data":"x")", 0},  // no failure announced
        {R"("has_fail":true)", 120},
        {R"("has_fail":"yes","data":[])", 120},
        {R"("has_fail":true,"data":{"a":1})", 120},
        {R"("has_fail":true,"data":[5])", 120},
        {R"("has_fail":true,"data":[{"success":[]}])", 120},
        {R"("has_fail":true,"data":[{"success":false}])", 120},
        {R"("has_fail":true,"data":[{"success":false,"error":"x"}])", 120},
        {R"("has_fail":true,"data":[{"success":true},{"success":true},
            {"success":false,"error":{"code":5,"msg":"one more than asked"}}])",
         0},
    };
    for (const Row& row : hostile) {
        EXPECT_EQ(rename(R"({"success":true,)" + row.members + "}").code, row.code) << row.members;
    }
}

TEST_F(ElasticTest, AFailedCommitIsExplainedByMissingSpace) {
    AddShare("s");
    const std::string failed = R"({"success":false,"error":{"code":77,"msg":"no"}})";
    server_.ThenReply(failed);
    EXPECT_EQ(ErrorOf([] { IndexCommit("s"); }).code, 77);
    EXPECT_EQ(StatusMgr().GetShareStatus("s"), 0U);

    fake::SetSpace(false);
    IndexCommit("s");  // no failure, no question about space
    EXPECT_EQ(fake::CallsOf("KESTOQuotaIsEnough").size(), 1U);

    server_.ThenReply(failed);
    const Error error = ErrorOf([] { IndexCommit("s"); });
    EXPECT_EQ(error.code, 1003);
    EXPECT_EQ(error.reason, "Share (s) space not enough");
    EXPECT_EQ(StatusMgr().GetShareStatus("s"), 1U);

    server_.ThenReply(failed);
    EXPECT_EQ(ErrorOf([] { IndexCommit("unknown"); }).code, 800);
}

}  // namespace
}  // namespace quivra::fileindex::elastic
