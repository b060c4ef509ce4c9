#include "fileindex/index_mgr.h"
#include "tests/fileindex/management_fixture.h"

namespace quivra::fileindex {
namespace {

class ShareOperationsTest : public ManagementTest {
  protected:
    ShareOperationsTest() { Arrange(); }

    /// Shares "b" and "a" on /volume1 and "c" on /volume10, each with two folders.
    void Arrange() {
        Reset();
        AddShare("a");
        AddShare("b");
        AddShare("c", "/volume10");
        SetFolders(List({"/b", "/b/x", "/a", "/c", "/a/x", "/c/x"}));
        StartSteps();
    }
    static void SetFolders(const Json::Value& folders) {
        EXPECT_TRUE(toFile(folders, kFileIndexFoldersCfgPath));
    }
    static std::string Queue(const std::string& share) {
        return QueuePath((share == "c" ? "/volume10/" : "/volume1/") + share);
    }
    static std::vector<std::string> PausedPaths() {
        std::vector<std::string> paths;
        for (const Json::Value& folder : Folders()) {
            if (folder["paused"].asBool()) {
                paths.push_back(folder["path"].asString());
            }
        }
        return paths;
    }
};

using Texts = std::vector<std::string>;

TEST_F(ShareOperationsTest, AShareIsPausedAndResumedInOppositeOrder) {
    SharePause("a");
    const std::string registration = "(" + Queue("a") + ", fileindex, 1)";
    EXPECT_EQ(Steps(), (Texts{"daemon worker_delete a", "MonitorQueue::Delete" + registration,
                              "search index_pause fileindex_a", "save"}));
    EXPECT_EQ(PausedPaths(), (Texts{"/a", "/a/x"}));
    StartSteps();
    ShareResume("a");
    EXPECT_EQ(Steps(),
              (Texts{"search index_resume fileindex_a", "MonitorQueue::Upsert" + registration,
                     "daemon worker_create a", "save"}));
    EXPECT_EQ(PausedPaths(), Texts{});
}

TEST_F(ShareOperationsTest, AVolumeIsAPlainPrefixAndIsSavedFirst) {
    VolumePause("/volume1");
    Texts expected = {"save"};
    for (const std::string share : {"a", "b", "c"}) {
        expected.push_back("daemon worker_delete " + share);
        expected.push_back("MonitorQueue::Delete(" + Queue(share) + ", fileindex, 1)");
        expected.push_back("search index_pause fileindex_" + share);
    }
    EXPECT_EQ(Steps(), expected);
    EXPECT_EQ(PausedPaths().size(), 6U);
    StartSteps();
    VolumeResume("/volume10");
    EXPECT_EQ(Steps(), (Texts{"save", "search index_resume fileindex_c", "daemon worker_create c",
                              "MonitorQueue::Upsert(" + Queue("c") + ", fileindex, 1)"}));
    EXPECT_EQ(PausedPaths(), (Texts{"/b", "/b/x", "/a", "/a/x"}));
}

TEST_F(ShareOperationsTest, NothingIsSentForNoOrAnUnindexedShare) {
    EXPECT_EQ(ErrorOf([] { VolumePause(""); }).code, 120);  // would be a prefix of all
    EXPECT_EQ(ErrorOf([] { ShareClearPaused("a", ""); }).code, 120);
    SharePause("unindexed");
    ShareResume("unindexed");
    EXPECT_TRUE(Steps().empty());
}

TEST_F(ShareOperationsTest, AFailedPauseLeavesTheFoldersAsTheyWere) {
    const Json::Value before = Folders();
    SharePause("a");
    const int calls = OutsideCalls();
    int errors = 0;
    for (int call = 1; call <= calls; ++call) {
        Arrange();
        StartSteps(call);
        const bool failed = ErrorOf([] { SharePause("a"); }).code != 0;
        errors += failed ? 1 : 0;
        EXPECT_EQ(Folders() == before, failed) << call;
    }
    EXPECT_GT(errors, calls / 4);
}

TEST_F(ShareOperationsTest, AClearedShareLosesDataIndexAndFolders) {
    StatusMgr().SetShareStatus("gone", kShareNeedReindex);
    SetFolders(List({"/gone", "/gone/x"}));
    StartSteps();
    ShareClearPaused("gone", "/volume9/gone");
    const std::string place = "/volume9/gone/@eaDir/fileindex/";
    EXPECT_EQ(Steps(), (Texts{"KLIBCExec(/bin/rm, -rf, " + place + "queue)",
                              "KLIBCExec(/bin/rm, -rf, " + place + "queue.tmp)",
                              "KLIBCExec(/bin/rm, -rf, " + place + "db)", "save",
                              "search index_delete fileindex_gone", "save",
                              "KLIBServiceStop(kestocontentextractd, 0)",
                              "KLIBServicectlStop(pkg-Quivra-fileindexd, 1)"}));
    EXPECT_EQ(Folders(), Json::Value(Json::arrayValue));
    EXPECT_EQ(Status()["share"], Json::Value(Json::objectValue));
}

TEST_F(ShareOperationsTest, AClearedVolumeForgetsItsPausedFolders) {
    Json::Value folders = List({"/a", "/a/x", "/b", "/c"});
    folders[0]["paused"] = true;
    folders[0]["volume_to_be_clean"] = "/volume1";
    folders[2]["volume_to_be_clean"] = "/volume1";  // not paused
    folders[3]["paused"] = true;
    folders[3]["volume_to_be_clean"] = "/volume10";
    SetFolders(folders);
    for (const char* share : {"a", "b"}) {
        StatusMgr().SetShareStatus(share, kShareNeedReindex);
    }
    StartSteps();
    VolumeClearPaused("/volume1");
    EXPECT_EQ(Steps(), (Texts{"save", "save"}));
    EXPECT_EQ(Folders().size(), 2U);
    EXPECT_EQ(Status()["share"], Parse(R"({"b":1})"));
}

}  // namespace
}  // namespace quivra::fileindex
