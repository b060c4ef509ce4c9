#include <kesto/filesystem.h>

#include "fileindex/util.h"
#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

class WhyTest : public CtlTest {
  protected:
    WhyTest() : search_(kSearchSocket) {
        AddShare("s");
        SetFolders({"/s"});
        SetInIndex(true);
        for (const char* file : {"a.txt", "b.jpg", "#snapshot/x", "#recycle/x", ".DS_Store/x",
                                 "mounted/x", "virtual/x", "real/x"}) {
            const std::filesystem::path path = std::string("/volume1/s/") + file;
            std::filesystem::create_directories(path.parent_path());
            WriteFile(path, "x");
        }
        std::filesystem::create_directory_symlink("real", "/volume1/s/link");
        fake::Platform()->shares.at("s").recycle = 1;
        fake::Platform()->mount_points.insert("/volume1/s/mounted");
        fake::Platform()->fs_types = {{"/volume1/s/virtual", KESTO_FS_VIRTUAL}};
    }

    void SetInIndex(bool held) {
        search_.SetHandler([held](const Json::Value&) {
            return fake::Frame(held ? R"({"success":true,"data":[],"total":1})"
                                    : R"({"success":true,"data":[],"total":0})");
        });
    }

    static std::string Verdict(const std::string& path) {
        return PipedJson({"why", path, "--json"})["verdict"].asString();
    }

    fake::ScriptedServer search_;
};

TEST_F(WhyTest, TheRuleThatFailsIsTheLastAndAgreesWithTheLibrary) {
    const std::pair<const char*, const char*> rows[] = {
        {"/volume1/s/a.txt", nullptr},
        {"/volume1/s/nothing", "exists"},
        {"/volume1/s/#snapshot/x", "in a snapshot"},
        {"/volume1/s/virtual/x", "file system"},
        {"/volume1/s/#recycle/x", "in a recycle bin"},
        {"/volume1/s/mounted", "mount point"},
        {"/volume1/s/link/x", "reached without links"},
    };
    for (const auto& [path, rule] : rows) {
        const Json::Value why = PipedJson({"why", path, "--json"});
        EXPECT_EQ(why["may_be_indexed"].asBool(), fileindex::CanFullPathBeIndexed(path)) << path;
        const Json::Value& last = why["rules"][why["rules"].size() - 1];
        EXPECT_EQ(last["passed"].asBool(), rule == nullptr) << path;
        if (rule != nullptr) {
            EXPECT_EQ(last["rule"], rule) << path;
        }
    }
    EXPECT_FALSE(PipedJson({"why", "/volume1/s/.DS_Store/x", "--json"})["may_be_indexed"].asBool());
    fake::Platform()->shares.at("s").read_only = 1;
    EXPECT_NE(Verdict("/volume1/s/a.txt").find("read-only"), std::string::npos);
}

TEST_F(WhyTest, TheVerdictSaysWhatToDo) {
    const auto expect = [](const std::string& path, const std::string& part) {
        const std::string verdict = Verdict(path);
        EXPECT_NE(verdict.find(part), std::string::npos) << verdict;
    };
    expect("/volume1/s/a.txt", "name, content and metadata");
    expect("/s/b.jpg", "found by its name");
    SetInIndex(false);
    expect("/volume1/s/a.txt", "folder reindex /s/a.txt");
    WriteFile(QueueOf("s"), "{\"event\":2,\"path\":\"/volume1/s/a.txt\"}\n");
    expect("/volume1/s/a.txt", "waits in the queue");
    WriteFile(QueueOf("s"), "{\"event\":65536,\"path\":\"/volume1/s\"}\n");
    expect("/volume1/s/a.txt", "waits in the queue");
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"resume_time": 0})");
    expect("/volume1/s/a.txt", "fileindexctl resume");
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"share": {"s": 1}})");
    expect("/volume1/s/a.txt", "folder reindex /s");
    SetFolders({"/s"}, true);
    expect("/volume1/s/a.txt", "share resume s");
    SetFolders({});
    expect("/volume1/s/a.txt", "folder add");
}

TEST_F(WhyTest, AnswersWithoutDaemonAndWithABrokenQueue) {
    search_.SetHandler([](const Json::Value&) { return std::string("nonsense"); });
    EXPECT_NE(Verdict("/s/a.txt").find("cannot be asked"), std::string::npos);
    WriteFile(QueueOf("s"), "nonsense\n");
    const Result result = Piped({"why", "/s/a.txt"});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_NE(result.out.find("cannot be told"), std::string::npos) << result.out;
    EXPECT_EQ(Piped({"why", "/etc/passwd"}).status, kFailure);
}

}  // namespace
}  // namespace quivra::ctl
