#include "fileindex/path_rules.h"
#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

class WhyTest : public DaemonsTest {
  protected:
    WhyTest() {
        AddShare("s");
        SetFolders({"/s"});
        for (const char* file : {"a.txt", "b.jpg", "c.strange", "#recycle/x", "link-target/x"}) {
            const std::filesystem::path path = std::string("/volume1/s/") + file;
            std::filesystem::create_directories(path.parent_path());
            WriteFile(path, "x");
        }
        fake::Platform()->shares.at("s").recycle = 1;
        document_ = R"([{"KESTOMDTextContent": "x"}])";
    }

    static std::string Verdict(const std::string& path) {
        return PipedJson({"why", path, "--json"})["verdict"].asString();
    }

    static void ExpectVerdict(const std::string& path, const std::string& part) {
        const std::string verdict = Verdict(path);
        EXPECT_NE(verdict.find(part), std::string::npos) << part << ": " << verdict;
    }
};

TEST_F(WhyTest, PrintsTheRulesThatTheLibraryAsked) {
    const Json::Value why = PipedJson({"why", "/volume1/s/#recycle/x", "--json"});
    EXPECT_FALSE(why["may_be_indexed"].asBool());
    const auto findings = fileindex::ExaminePath("/volume1/s/#recycle/x");
    ASSERT_EQ(why["rules"].size(), findings.size());
    for (Json::ArrayIndex i = 0; i < why["rules"].size(); ++i) {
        EXPECT_EQ(why["rules"][i]["rule"], findings[i].rule);
        EXPECT_EQ(why["rules"][i]["passed"], findings[i].passed);
    }
    ExpectVerdict("/volume1/s/#recycle/x", findings.back().remedy);
    EXPECT_NE(Piped({"why", "/volume1/s/#recycle/x"}).out.find("  NO  in a recycle bin"),
              std::string::npos);
}

TEST_F(WhyTest, TellsWhatIsTrueOfThisDocument) {
    ExpectVerdict("/volume1/s/a.txt", "name, content and metadata");
    ExpectVerdict("/s/b.jpg", "folder set /s --photo");
    ExpectVerdict("/s/c.strange", "files of this kind");
    ExpectVerdict("/s/link-target", "as directories are");
    document_ = R"([{"KESTOMDPath": "/volume1/s/a.txt"}])";
    ExpectVerdict("/s/a.txt", "no text was found in it");
    document_ = R"([{"@content_error": "the file is leased", "@content_retry": true}])";
    ExpectVerdict("/s/a.txt", "could not be read (the file is leased) and is tried again");
    document_ = R"([{"@content_error": "it is damaged", "@content_retry": false}])";
    ExpectVerdict("/s/a.txt", "could not be read (it is damaged); that is tried again when");
    document_ = R"([{"@modified_ns": 5, "KESTOMDTextContent": "x"}])";
    ExpectVerdict("/s/a.txt", "changed since it was indexed, unnoticed");
    document_ = "[]";
    ExpectVerdict("/volume1/s/a.txt", "folder reindex /s/a.txt");
    Tell(indexer_, R"({"shares":[{"share":"s","waiting":12}]})");
    ExpectVerdict("/volume1/s/a.txt", "not in the index yet: 12 files");
    document_ = R"([{}])";
    ExpectVerdict("/volume1/s/a.txt", "may still wait for its turn: 12 files");
}

TEST_F(WhyTest, WhatStopsTheShareComesFirst) {
    WriteFile(QueueOf("s"), "{\"event\":2,\"path\":\"/volume1/s/a.txt\"}\n");
    ExpectVerdict("/volume1/s/a.txt", "waits in the queue");
    WriteFile(QueueOf("s"), "{\"event\":65536,\"path\":\"/volume1/s\"}\n");
    ExpectVerdict("/volume1/s/a.txt", "waits in the queue");
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"resume_time": 0})");
    ExpectVerdict("/volume1/s/a.txt", "fileindexctl resume");
    Tell(search_, R"({"indexes":[{"id":"fileindex_s","documents":0,"fresh":true}]})");
    ExpectVerdict("/volume1/s/a.txt", "made anew");
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"share": {"s": 1}})");
    ExpectVerdict("/volume1/s/a.txt", "folder reindex /s");
    monitor_.reset();
    ExpectVerdict("/volume1/s/a.txt", "kestotifyd is not running");
    Tell(indexer_, R"({"shares":[{"share":"s","problem":"its store is damaged"}]})");
    ExpectVerdict("/volume1/s/a.txt", "its store is damaged");
    SetFolders({"/s"}, true);
    ExpectVerdict("/volume1/s/a.txt", "share resume s");
    SetFolders({});
    ExpectVerdict("/volume1/s/a.txt", "folder add");
}

TEST_F(WhyTest, AnswersWithoutDaemonAndWithABrokenQueue) {
    search_.reset();
    ExpectVerdict("/s/a.txt", "kestoelasticd is not running");
    WriteFile(QueueOf("s"), "nonsense\n");
    const Result result = Piped({"why", "/s/a.txt"});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_NE(result.out.find("cannot be told"), std::string::npos) << result.out;
    EXPECT_EQ(result.out.find("Quivra error"), std::string::npos) << result.out;
    EXPECT_EQ(Piped({"why", "/etc/passwd"}).status, kFailure);
}

}  // namespace
}  // namespace quivra::ctl
