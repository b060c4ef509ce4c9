#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

/// A search daemon whose indexes hold what the test puts there, in the order of relevance.
class SearchTest : public CtlTest {
  protected:
    SearchTest() : daemon_(kSearchSocket) {
        daemon_.SetHandler(
            [this](const Json::Value& request) { return fake::Frame(Answer(request)); });
    }

    void Put(const std::string& share, const std::string& hits) {
        indexes_["fileindex_" + share] = Parse(hits);
    }
    void Break(const std::string& share, int code) { broken_["fileindex_" + share] = code; }

    std::string Answer(const Json::Value& request) {
        const std::string id = request["data"]["id"].asString();
        Json::Value reply(Json::objectValue);
        reply["success"] = !broken_.contains(id);
        if (broken_.contains(id)) {
            reply["error"]["code"] = broken_[id];
            reply["error"]["msg"] = "broken";
            return toString(reply);
        }
        const Json::Value& query = request["data"]["query"];
        const Json::Value& hits = indexes_[id];
        reply["data"] = Json::Value(Json::arrayValue);
        const Json::ArrayIndex begin = query["offset"].asUInt();
        const Json::ArrayIndex size =
            query.isMember("limit") ? query["limit"].asUInt() : hits.size();
        for (Json::ArrayIndex i = begin; i < hits.size() && i < begin + size; ++i) {
            reply["data"].append(hits[i]);
        }
        reply["total"] = hits.size();
        return toString(reply);
    }

    Json::Value LastQuery() { return daemon_.Requests().back()["data"]["query"]; }

    std::map<std::string, Json::Value> indexes_;
    std::map<std::string, int> broken_;
    fake::ScriptedServer daemon_;
};

TEST_F(SearchTest, PathsAndTheLineWhereTheWordIs) {
    SetFolders({"/a"});
    AddShare("a");
    Put("a", R"([{"KESTOMDPath": "/volume1/a/x",
                  "highlight": {"KESTOMDTitle": "not me",
                                "KESTOMDTextContent": "two\nlines of \u0002whale\u0003"}},
                 {"KESTOMDPath": "/volume1/a/\u001b[2J",
                  "highlight": {"KESTOMDTitle": "\u001b]0;x\u0007 \u0002w\u0003"}}])");
    const Result piped = Piped({"search", "whale"});
    EXPECT_EQ(piped.status, kSuccess);
    EXPECT_EQ(piped.out,
              "/volume1/a/x\n    two lines of whale\n"
              "/volume1/a/\\x1b[2J\n    \\x1b]0;x\\x07 w\n");
    EXPECT_EQ(piped.err, "");
    EXPECT_EQ(OnTerminal({"search", "whale"}).out,
              "/volume1/a/x\n    two lines of \x1b[1mwhale\x1b[0m\x1b[0m\n"
              "/volume1/a/\\x1b[2J\n    \\x1b]0;x\\x07 \x1b[1mw\x1b[0m\x1b[0m\n");
    EXPECT_EQ(Piped({"search", "--paths", "whale"}).out, "/volume1/a/x\n/volume1/a/\\x1b[2J\n");
    EXPECT_FALSE(LastQuery().isMember("highlight"));
    EXPECT_EQ(OnTerminal({"search", "--null", "whale"}).out,
              std::string("/volume1/a/x\0/volume1/a/\x1b[2J\0", 29));
    const Json::Value json = PipedJson({"search", "--json", "whale"});
    EXPECT_EQ(json["hits"][1]["KESTOMDPath"], "/volume1/a/\x1b[2J");
}

TEST_F(SearchTest, NothingIsCutOffSilently) {
    SetFolders({"/a", "/b"});
    Json::Value hits(Json::arrayValue);
    for (int i = 0; i < 30; ++i) {
        Json::Value hit(Json::objectValue);
        hit["KESTOMDPath"] = "/volume1/a/" + std::to_string(i);
        hits.append(hit);
    }
    Put("a", toString(hits));
    Put("b", R"([{"KESTOMDPath": "/volume1/b/0"}, {"KESTOMDPath": "/volume1/b/1"}])");
    EXPECT_EQ(Piped({"search", "x"}).err, "20 of 32, --limit for more\n");

    EXPECT_EQ(Piped({"search", "x", "--limit", "2", "--offset", "3"}).out,
              "/volume1/b/1\n/volume1/a/2\n");
    const Result beyond = Piped({"search", "x", "--offset", "4294967295", "--limit", "4294967295"});
    EXPECT_EQ(beyond.status, kFailure);
    EXPECT_NE(beyond.err.find("32 in all"), std::string::npos) << beyond.err;
    // What scripts read is whole unless they say otherwise.
    const Result whole = Piped({"search", "--paths", "x"});
    EXPECT_EQ(std::count(whole.out.begin(), whole.out.end(), '\n'), 32);
    EXPECT_EQ(whole.err, "");
}

TEST_F(SearchTest, SharesAreMergedByTheirOrder) {
    SetFolders({"/a", "/b", "/c"});
    Put("a",
        R"([{"KESTOMDPath": "a9", "KESTOMDFSSize": 9}, {"KESTOMDPath": "a3", "KESTOMDFSSize": 3},
                 {"KESTOMDPath": "a"}])");
    Put("b",
        R"([{"KESTOMDPath": "b10", "KESTOMDFSSize": 10},
                 {"KESTOMDPath": "b5", "KESTOMDFSSize": 5}])");
    Put("c", "[]");
    EXPECT_EQ(Piped({"search", "x", "--sort", "-size"}).out, "b10\na9\nb5\na3\na\n");
    EXPECT_EQ(LastQuery()["sort"], Parse(R"([{"field": "KESTOMDFSSize", "order": "desc"}])"));
    EXPECT_EQ(Piped({"search", "x"}).out, "a9\nb10\na3\nb5\na\n");
}

TEST_F(SearchTest, OneBrokenShareDoesNotHideTheOthers) {
    SetFolders({"/a", "/b"});
    Put("b", R"([{"KESTOMDPath": "/volume1/b/x"}])");
    Break("a", 404);
    const Result both = Piped({"search", "x"});
    EXPECT_EQ(both.out, "/volume1/b/x\n");
    EXPECT_EQ(both.status, kSuccess);
    EXPECT_NE(both.err.find("[404]"), std::string::npos) << both.err;
    EXPECT_EQ(Piped({"search", "x", "--share", "a"}).status, kFailure);
    Break("b", 1401);
    const Result none = Piped({"search", "x"});
    EXPECT_EQ(none.status, kFailure);
    EXPECT_EQ(none.err.find("Nothing found"), std::string::npos) << none.err;
    EXPECT_TRUE(fake::Sleeps().empty());
}

TEST_F(SearchTest, WordsThatLookLikeOptions) {
    SetFolders({"/a"});
    Put("a", "[]");
    const Result nothing = Piped({"search", "-draft", "--limit", "3", "-x"});
    EXPECT_EQ(nothing.status, kFailure);
    EXPECT_EQ(nothing.err, "Nothing found.\n");
    EXPECT_EQ(LastQuery()["qsl"]["all"].size(), 2U);
    EXPECT_TRUE(LastQuery()["qsl"]["all"][0].isMember("not"));
    EXPECT_EQ(LastQuery()["limit"], 3);
    Piped({"search", "--paths", "--", "--limit", "3"});
    EXPECT_EQ(LastQuery()["qsl"]["all"].size(), 2U);
}

TEST_F(SearchTest, ADaemonThatTalksNonsense) {
    SetFolders({"/a", "/b"});
    for (const char* reply :
         {R"({"success": true})", R"({"success": true, "data": {}, "total": 1})",
          R"({"success": true, "data": [], "total": "many"})", R"({"success": "yes"})", "[1]",
          "{"}) {
        daemon_.ThenReply(reply);
        const Result result = Piped({"search", "x"});
        EXPECT_EQ(result.status, kFailure) << reply;
        EXPECT_EQ(result.out, "") << reply;
    }
    daemon_.ThenReply(R"({"success": true, "total": 3, "data": [1, {"KESTOMDPath": {}},
                          {"highlight": []}, {"highlight": {"KESTOMDTextContent": 7}}]})");
    Piped({"search", "x"});
}

}  // namespace
}  // namespace quivra::ctl
