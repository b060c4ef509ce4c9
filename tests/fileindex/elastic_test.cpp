#include "fileindex/elastic/elastic_control.h"

#include <kesto/error.h>

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
        {fake::Frame("{}"), 913, "Recv failed, res={}"},
        {fake::Frame(R"({"success": "true"})"), 913, R"(Recv failed, res={"success":"true"})"},
        {fake::Frame(std::string(3000, '[')), 913, "Recv failed, res=null"},
        {"", 913, "Recv failed, res=null"},
        {fake::Frame(R"({"success": true})").substr(0, 9), 913, "Recv failed, res=null"},
        {std::string("\xff\xff\xff\xff", 4), 913, "Recv failed, res=null"},
        {fake::Frame(R"({"success":false,"error":{"code":7,"msg":"no index"}})"), 7,
         "Request failed, msg=no index"},
        {fake::Frame(R"({"success":false,"error":{"msg":"x"}})"), 120, "Missing property: code"},
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
    std::filesystem::remove(kSearchSocket);
    EXPECT_EQ(ErrorOf([] { ShareIndexDelete("s"); }).reason, "Connect failed");
}

TEST_F(ElasticTest, ABusyDaemonIsWaitedForAndAdministratorsAreToldOnce) {
    for (int i = 0; i < 13; ++i) {
        server_.ThenReply(i % 2 == 0 ? R"({"success":false,"error":{"code":1400,"msg":"memory"}})"
                                     : R"({"success":false,"error":{"code":1401,"msg":"moves"}})");
    }
    std::size_t retries_at_notice = 0;
    fake::Platform()->on_call = [&](const std::string& call) {
        if (call.starts_with(kNotify)) {
            retries_at_notice = fake::Sleeps().size();
        }
    };
    ShareIndexPause("music");
    EXPECT_EQ(server_.Connections(), 14);
    EXPECT_EQ(retries_at_notice, 10U);  // before the sleep of the eleventh
    EXPECT_EQ(fake::CallsOf(kNotify).size(), 1U);
    for (const auto sleep : fake::Sleeps()) {
        const auto past_base = sleep - std::chrono::minutes(15);
        EXPECT_EQ(past_base % std::chrono::minutes(1), std::chrono::microseconds(0));
        EXPECT_TRUE(past_base >= past_base.zero() && past_base <= std::chrono::minutes(4));
    }
    EXPECT_EQ(fake::Sleeps().size(), 13U);
    EXPECT_EQ(fake::LogLinesWith("Retry[12] since kestoelasticd is busy. Command: index_pause, db: "
                                 "fileindex_music")
                  .size(),
              1U);
}

TEST_F(ElasticTest, CommandsHaveTheirExactRequests) {
    AddShare("s");
    const std::string file = "/volume1/s/a.txt";
    fake::Platform()->documents[file] = Parse(R"({"KESTOMDFSName":"a.txt","KESTOMDFSSize":5})");
    Json::Value create = Parse(R"({"command":"index_create","data":{"id":"fileindex_s",
            "path":"/volume1/s/@eaDir/fileindex/db","settings":{}}})");
    create["data"]["mappings"] = GetFileIndexMappings();
    const std::string document = R"("data":{"id":"fileindex_s","doc_id":"/volume1/s/a.txt","data":
        {"KESTOMDFSName":"a.txt","KESTOMDSearchFileName":"a.txt","KESTOMDFSSize":5}}})";
    ShareIndexCreate("s");
    IndexUpsert("s", file, true);
    IndexAttr("s", file);
    IndexDelDir("s", "/volume1/s/a");
    EXPECT_EQ(NewRequests(), (std::vector{
                                 create,
                                 Parse(R"({"command":"document_upsert_by_id",)" + document),
                                 Parse(R"({"command":"document_set_by_id",)" + document),
                                 Parse(R"({"command":"document_del_by_query",
                                     "data":{"id":"fileindex_s","query":{"qsl":{"prefix":
                                         {"KESTOMDPath":"/volume1/s/a/"}}}}})"),
                             }));
    EXPECT_EQ(fake::CallsOf("ParseFile(").back(),
              R"(ParseFile(/volume1/s/a.txt, {"need_meta":false}))");

    fake::Platform()->documents["/odd"] = Json::Value(Json::arrayValue);
    for (const char* path : {"/odd", "/unreadable"}) {
        EXPECT_EQ(ErrorOf([&] { IndexUpsert("s", path, true); }).code, 914);
    }
    Json::Value reply;
    server_.ThenReply(R"({"success":false,"error":{"code":1400,"msg":"memory"}})");
    EXPECT_EQ(ErrorOf([&] { IndexQuery(reply, "s", Json::Value()); }).code, 1400);
    EXPECT_EQ(NewRequests().size(), 1U) << "queries are not repeated";
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

TEST_F(ElasticTest, FailedElementsOfABatchAreLoggedAndBusyOnesRepeatIt) {
    const std::string two_hits = R"({"success":true,"data":[
            {"KESTOMDPath":"/v/a/x","KESTOMDFSName":"x","KESTOMDParent":"/v/a"},
            {"KESTOMDPath":"/v/a/y","KESTOMDFSName":"y","KESTOMDParent":"/v/a"}]})";
    const auto batch_of = [&](const std::string& members) {
        server_.ThenReply(R"({"success":true})");
        server_.ThenReply(two_hits);
        server_.ThenReply(R"({"success":true,)" + members + "}");
        return ErrorOf([] { IndexRename("s", "/v/b", "/v/a"); }).code;
    };
    EXPECT_EQ(batch_of(R"("has_fail":true,"data":[{"success":true},
                          {"success":false,"error":{"code":5,"msg":"gone"}}])"),
              0);
    const auto lines = fake::LogLinesWith("Compound failed: ");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_NE(lines[0].find(R"("doc_id":"/v/a/y")"), std::string::npos);

    const int before = server_.Connections();
    EXPECT_EQ(batch_of(R"("has_fail":true,"data":[{"success":true},
                          {"success":false,"error":{"code":1401,"msg":"moves"}}])"),
              0);
    EXPECT_EQ(server_.Connections() - before, 4);  // the batch twice
    EXPECT_EQ(server_.Requests().rbegin()[0], server_.Requests().rbegin()[1]);

    // What a reply lacks counts as 0 and empty, and does not hide the other elements.
    const std::pair<std::string, std::size_t> odd[] = {
        {R"("has_fail":true)", 0},
        {R"("has_fail":true,"data":{"success":false})", 0},
        {R"("has_fail":"yes","data":[{}])", 0},
        {R"("has_fail":true,"data":[{"success":false,"error":"x"},{},7])", 3},
        {R"("has_fail":true,"data":[{"success":true},{"error":{"code":5}},
            {"success":false,"error":{"code":5,"msg":"one more than asked"}}])",
         2},
    };
    for (const auto& [members, logged] : odd) {
        fake::ResetLibc();
        EXPECT_EQ(batch_of(members), 0) << members;
        EXPECT_EQ(fake::LogLinesWith("Compound failed: ").size(), logged) << members;
    }
    EXPECT_EQ(batch_of(R"("has_fail":true,"data":[{},{"error":{"code":1400}}])"), 0);
    EXPECT_EQ(fake::Sleeps().size(), 1U) << "a busy element without a message repeats the batch";
    server_.ThenReply(R"({"success":true})");
    server_.ThenReply(R"({"success":true,"data":[{"KESTOMDFSName":"n","KESTOMDParent":[]}]})");
    EXPECT_EQ(ErrorOf([] { IndexRename("s", "/v/b", "/v/a"); }).code, 120);
}

TEST_F(ElasticTest, AFailedCommitIsExplainedByMissingSpace) {
    AddShare("s");
    const std::string failed = R"({"success":false,"error":{"code":77,"msg":"no"}})";
    server_.ThenReply(failed);
    EXPECT_EQ(ErrorOf([] { IndexCommit("s"); }).code, 77);
    EXPECT_EQ(StatusMgr().GetShareStatus("s"), 0U);

    fake::Platform()->space_code = KESTO_ERR_VOLUME_FULL;
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
