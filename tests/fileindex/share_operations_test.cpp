#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
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
        Json::Value folders(Json::arrayValue);
        for (const char* path : {"/b", "/b/x", "/a", "/c", "/a/x", "/c/x"}) {
            folders.append(FolderData(path));
        }
        SetFolders(folders);
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

using Steps_ = std::vector<std::string>;

TEST_F(ShareOperationsTest, AShareIsPausedAndResumedInOppositeOrder) {
    SharePause("a");
    const std::string registration = "(" + Queue("a") + ", fileindex, 1)";
    EXPECT_EQ(Steps(), (Steps_{"daemon worker_delete a", "MonitorQueue::Delete" + registration,
                               "search index_pause fileindex_a", "save"}));
    EXPECT_EQ(PausedPaths(), (Steps_{"/a", "/a/x"}));
    StartSteps();
    ShareResume("a");
    EXPECT_EQ(Steps(),
              (Steps_{"search index_resume fileindex_a", "MonitorQueue::Upsert" + registration,
                      "daemon worker_create a", "save"}));
    EXPECT_EQ(PausedPaths(), Steps_{});
    EXPECT_EQ(daemon_.Requests().back(),
              Parse(R"({"type":"worker_create","data":{"share_name":"a"}})"));

    StartSteps();
    SharePause("unindexed");
    ShareResume("unindexed");
    EXPECT_TRUE(Steps().empty());
}

TEST_F(ShareOperationsTest, AVolumeIsAPlainPrefixAndIsSavedFirst) {
    VolumePause("/volume1");
    Steps_ expected = {"save"};
    for (const std::string share : {"a", "b", "c"}) {
        expected.push_back("daemon worker_delete " + share);
        expected.push_back("MonitorQueue::Delete(" + Queue(share) + ", fileindex, 1)");
        expected.push_back("search index_pause fileindex_" + share);
    }
    EXPECT_EQ(Steps(), expected);
    EXPECT_EQ(PausedPaths().size(), 6U);
    StartSteps();
    VolumeResume("/volume10");
    EXPECT_EQ(Steps(), (Steps_{"save", "search index_resume fileindex_c", "daemon worker_create c",
                               "MonitorQueue::Upsert(" + Queue("c") + ", fileindex, 1)"}));
    EXPECT_EQ(PausedPaths(), (Steps_{"/b", "/b/x", "/a", "/a/x"}));
}

TEST_F(ShareOperationsTest, EmptyNamesAreRefusedBeforeAnythingIsSent) {
    struct Row {
        std::function<void()> call;
        std::string reason;
        std::string condition;
    };
    const Row rows[] = {
        {[] { SharePause(""); }, "Missing share name", "share_name.empty()"},
        {[] { VolumeResume(""); }, "Missing mount point", "mount_point.empty()"},
        {[] { ShareClearPaused("a", ""); }, "Missing share path", "share_path.empty()"},
        {[] { ShareRename("", "b"); }, "Missing share_from", "share_from.empty()"},
        {[] { ShareRename("a", ""); }, "Missing share_to", "share_to.empty()"},
        {[] { ShareMigrate("", "/p"); }, "Missing share name", "share.empty()"},
        {[] { ShareMigrate("a", ""); }, "Missing share path", "share_path_from.empty()"},
        {[] { ShareCheckRecycle(""); }, "Missing share name", "share.empty()"},
    };
    for (const Row& row : rows) {
        fake::ResetLibc();
        const Error error = ErrorOf(row.call);
        EXPECT_EQ(error.code, 120);
        EXPECT_EQ(error.reason, row.reason);
        const auto lines = fake::LogLinesWith("Failed [" + row.condition + "]");
        ASSERT_EQ(lines.size(), 1U) << row.condition;
        EXPECT_TRUE(lines[0].starts_with("index_mgr:")) << lines[0];
    }
    EXPECT_TRUE(Steps().empty());
}

TEST_F(ShareOperationsTest, AFailedPauseLeavesTheFoldersAsTheyWere) {
    const Json::Value before = Folders();
    struct Row {
        const char* step;
        std::function<void()> fail;
        int code;
        std::string reason;
    };
    const Row rows[] = {
        {"worker", [&] { daemon_.Then({std::string(4, '\xff')}); }, 502, "read failed, reason="},
        {"monitor", [] { fake::FailNext("MonitorQueue::Delete"); }, 502,
         "MonitorQueue::Delete failed, share=a"},
        {"index", [&] { search_.ThenReply(R"({"success":false,"error":{"code":77,"msg":"m"}})"); },
         77, "Request failed, msg=m"},
    };
    for (const Row& row : rows) {
        row.fail();
        const Error error = ErrorOf([] { SharePause("a"); });
        EXPECT_EQ(error.code, row.code) << row.step;
        EXPECT_TRUE(error.reason.starts_with(row.reason)) << error.reason;
        EXPECT_EQ(Folders(), before) << row.step;
    }
}

TEST_F(ShareOperationsTest, AClearedShareLosesDataIndexAndFolders) {
    StatusMgr().SetShareStatus("gone", kShareNeedReindex);
    Json::Value folders = List({"/gone", "/gone/x"});
    SetFolders(folders);
    StartSteps();
    ShareClearPaused("gone", "/volume9/gone");
    const std::string place = "/volume9/gone/@eaDir/fileindex/";
    EXPECT_EQ(Steps(), (Steps_{"KLIBCExec(/bin/rm, -rf, " + place + "queue)",
                               "KLIBCExec(/bin/rm, -rf, " + place + "queue.tmp)",
                               "KLIBCExec(/bin/rm, -rf, " + place + "db)", "save",
                               "search index_delete fileindex_gone", "save",
                               "KLIBServiceStop(kestocontentextractd, 0)",
                               "KLIBServicectlStop(pkg-Quivra-fileindexd, 1)"}));
    EXPECT_EQ(Folders(), Json::Value(Json::arrayValue));
    EXPECT_EQ(Status()["share"], Json::Value(Json::objectValue));
    for (const char* call : {"FILEIDXQueuePathCompose", "FILEIDXDBPathCompose"}) {
        fake::FailNext(call);
        const Error error = ErrorOf([] { ShareClearPaused("gone", "/v"); });
        EXPECT_EQ(error.code, 502);
        EXPECT_EQ(error.reason, std::string(call) + " failed, share_path=/v");
    }
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
    EXPECT_EQ(Steps(), (Steps_{"save", "save"}));
    EXPECT_EQ(Folders().size(), 2U);
    EXPECT_EQ(Status()["share"], Parse(R"({"b":1})"));
    EXPECT_EQ(fake::LogLinesWith("Examine path=/a, paused=1, volume_to_be_clean=/volume1").size(),
              1U);
}

}  // namespace
}  // namespace quivra::fileindex
