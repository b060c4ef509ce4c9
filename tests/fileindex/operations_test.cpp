#include <fcntl.h>
#include <kesto/error.h>
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>

#include "common/lock_file.h"
#include "fileindex/index_mgr.h"
#include "tests/fileindex/management_fixture.h"

namespace quivra::fileindex {
namespace {

class OperationsTest : public ManagementTest {
  protected:
    OperationsTest() { Arrange(); }

    void Arrange() {
        Reset();
        for (const char* share : {"a", "b"}) {
            AddShare(share);
            for (const char* folder : {"/x", "/y"}) {
                std::filesystem::create_directories(std::string("/volume1/") + share + folder);
            }
        }
        StartSteps();
    }

    static Json::Value Paths(const std::vector<std::string>& paths) {
        Json::Value list(Json::arrayValue);
        for (const std::string& path : paths) {
            list.append(path);
        }
        return list;
    }
    static Json::Value ConfigEvent(const std::string& path, const std::string& cfg) {
        Json::Value event = Parse(R"({"event":131072,"path_old":""})");
        event["path"] = path;
        event["data"] = Parse(cfg);
        return event;
    }
};

constexpr const char* kAll = R"({"document":true,"audio":true,"video":true,"photo":true})";
constexpr const char* kPhoto = R"({"document":false,"audio":false,"video":false,"photo":true})";
constexpr const char* kNone = R"({"document":false,"audio":false,"video":false,"photo":false})";

TEST_F(OperationsTest, AnAddedFolderMakesItsShareReady) {
    FolderAdd(List({"/b/y", "/a/x", "/b/x"}), false);
    std::vector<std::string> expected = {"save", "KESTOSMBSetSpotlight(1)",
                                         "KLIBServiceRestart(samba)",
                                         "KLIBServiceStart(kestocontentextractd, 1)",
                                         "KLIBServicectlStart(pkg-Quivra-fileindexd, 1)"};
    for (const std::string share : {"a", "b"}) {
        expected.push_back("search index_create fileindex_" + share);
        expected.push_back("daemon notify_setting_changed " + share);
        expected.push_back("MonitorQueue::Upsert(" + QueuePath("/volume1/" + share) +
                           ", fileindex, 1)");
    }
    EXPECT_EQ(Steps(), expected);
    EXPECT_EQ(Folders(), List({"/b/y", "/a/x", "/b/x"}));
    EXPECT_EQ(daemon_.Requests().back(), Parse(R"({"type":"notify_setting_changed",
                  "data":{"share_name":"b","is_upsert":true}})"));
    EXPECT_EQ(fake::Platform()->monitor_queues.at({QueuePath("/volume1/b"), "fileindex"}),
              Parse(R"({"path":["/volume1/b/y","/volume1/b/x"],"mask":65478,
                        "ignore":["@eaDir"]})"));
    EXPECT_EQ(Queue("/volume1/b"),
              (std::vector{ConfigEvent("/volume1/b/y", kAll), ConfigEvent("/volume1/b/x", kAll)}));
    ExpectNothingHeld();

    // A known share gets no index, and an unchanged folder no event.
    StartSteps();
    FolderAdd(List({"/a/y"}), false);
    FolderSet(List({"/a/x"}), false);
    Json::Value without_photo = List({"/a/x"});
    without_photo[0]["photo"] = false;
    FolderSet(without_photo, false);
    for (const std::string& step : Steps()) {
        EXPECT_FALSE(step.starts_with("search ") || step.starts_with("KESTOSMB")) << step;
    }
    EXPECT_EQ(Queue("/volume1/a"),
              (std::vector{ConfigEvent("/volume1/a/x", kAll), ConfigEvent("/volume1/a/y", kAll),
                           ConfigEvent("/volume1/a/x", kPhoto)}));
}

TEST_F(OperationsTest, ARefusedRequestChangesNothing) {
    FolderAdd(List({"/a/x"}), false);
    const Json::Value before = Folders();
    struct Row {
        const char* what;
        Json::Value list;
        int code;
    };
    Json::Value malformed = List({"/a/y", "/b/x"});
    malformed[1].removeMember("photo");
    std::vector<std::string> many;
    for (int i = 0; i <= 1000; ++i) {
        many.push_back("/b/" + std::to_string(i));
        std::filesystem::create_directories("/volume1" + many.back());
    }
    const Row rows[] = {
        {"malformed", malformed, 120},
        {"not indexable", List({"/a/y", "/a/none"}), 903},
        {"duplicate", List({"/a/y", "/a/x"}), 901},
        {"twice", List({"/a/y", "/a/y"}), 901},
        {"too many", List(many), 900},
        {"unknown share", List({"/c"}), 800},
    };
    StartSteps();
    for (const Row& row : rows) {
        EXPECT_EQ(ErrorOf([&] { FolderAdd(row.list, false); }).code, row.code) << row.what;
    }
    fake::Platform()->space_code = KESTO_ERR_QUOTA_EXCEEDED;
    EXPECT_EQ(ErrorOf([&] { FolderSet(List({"/a/y"}), false); }).code, 1003);
    EXPECT_TRUE(Steps().empty());
    EXPECT_EQ(Folders(), before);
    ExpectNothingHeld();

    fake::Platform()->space_code.reset();
    FolderAdd(List({"/a/none"}), true);  // an updater may
    EXPECT_EQ(Folders().size(), 2U);
}

TEST_F(OperationsTest, WhatCannotBeginTouchesNothing) {
    EXPECT_TRUE(toFile(List({"/a"}), kFileIndexFoldersCfgPath));
    const std::pair<std::function<void()>, const char*> rows[] = {
        {[] { SharePause(""); }, "Missing share name"},
        {[] { ShareResume(""); }, "Missing share name"},
        {[] { VolumePause(""); }, "Missing mount point"},
        {[] { VolumeResume(""); }, "Missing mount point"},
        {[] { ShareClearPaused("", "/volume1/a"); }, "Missing share name"},
        {[] { ShareClearPaused("a", ""); }, "Missing share path"},
        {[] { VolumeClearPaused(""); }, "Missing mount point"},
        {[] { ShareRename("", "a"); }, "Missing share_from"},
        {[] { ShareRename("a", ""); }, "Missing share_to"},
        {[] { ShareMigrate("", "/volume1/a"); }, "Missing share name"},
        {[] { ShareMigrate("a", ""); }, "Missing share path"},
        {[] { ShareCheckRecycle(""); }, "Missing share name"},
        {[] { FolderAdd(Json::objectValue, false); }, "Not an array, data={}"},
        {[] { FolderDelete(Json::objectValue); }, "Not an array, data={}"},
        {[] { FolderDelete(Parse("[7]")); }, "Not a string, data=7"},
        {[] { FolderReindex(Json::objectValue); }, "Not an array, data={}"},
    };
    for (const auto& [run, reason] : rows) {
        const Error error = ErrorOf(run);
        EXPECT_EQ(error.code, 120) << reason;
        EXPECT_EQ(error.reason, reason);
    }
    // Not even beside somebody who only reads.
    const LockFile held(kFileIndexFoldersLockPath, false);
    for (const std::function<void()>& run : std::initializer_list<std::function<void()>>{
             [] { FolderAdd(List({"/b"}), false); }, [] { FolderDelete(Paths({"/a"})); },
             [] { ShareRename("a", "b"); }, [] { ShareMigrate("a", "/volume9/a"); }}) {
        EXPECT_EQ(ErrorOf(run).code, 506);
    }
    EXPECT_TRUE(Steps().empty());
    EXPECT_EQ(Folders(), List({"/a"}));
}

TEST_F(OperationsTest, AReindexIsQueuedAndEndsTheNeedForOne) {
    FolderAdd(List({"/a/x"}), false);
    std::filesystem::remove(QueuePath("/volume1/a"));
    StatusMgr().SetShareStatus("a", kShareNeedReindex);
    StatusMgr().SetShareStatus("b", kShareNeedReindex);
    FolderReindex(Paths({"/a/x", "/b/x", "/a/x/deep", "/a"}));
    const auto queue = Queue("/volume1/a");
    ASSERT_EQ(queue.size(), 2U);  // one covers another
    EXPECT_EQ(queue[0]["path"], "/volume1/a/x");
    EXPECT_EQ(queue[1]["path"], "/volume1/a");
    EXPECT_TRUE(Queue("/volume1/b").empty());
    EXPECT_EQ(Status()["share"], Parse(R"({"a":0,"b":1})"));

    // What could not be queued keeps its flag.
    fake::FailNext("FILEIDXQueuePathCompose");
    FolderReindex(Paths({"/a/x"}));
    EXPECT_EQ(Status()["share"]["a"], 1);
}

TEST_F(OperationsTest, ACustomEventIsOneLineUnlessAReindexIsPendingAbove) {
    std::filesystem::create_directories("/volume1/a/@eaDir/fileindex");
    const std::string reindex = R"({"event":65536,"path":"/volume1/a/x"})";
    WriteFile(QueuePath("/volume1/a"), reindex);  // its end is missing
    AddCustomEvent(0x20000, "/volume1/a/x/sub", "", Parse(kAll));
    EXPECT_EQ(ReadFile(QueuePath("/volume1/a")), reindex);
    AddCustomEvent(0x40, "/volume1/a/c\nd\xff", "/volume1/a/o", Json::Value());
    const auto lines = Queue("/volume1/a");
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[1], Parse(R"({"event":64,"path":"/volume1/a/c\nd)"
                              "\xff"
                              R"(","path_old":"/volume1/a/o","data":null})"));
    fake::FailNext("FILEIDXQueuePathCompose");
    AddCustomEvent(2, "/volume1/a/f", "", Json::Value());
    EXPECT_TRUE(StatusMgr().GetShareStatus("a") == kShareNeedReindex) << "the event was lost";
}

TEST_F(OperationsTest, DeletingTheLastFolderDropsTheShareThenTheServices) {
    FolderAdd(List({"/a", "/a/x", "/b/x"}), false);
    StartSteps();
    FolderDelete(Paths({"/a/x", "/b/x"}));
    const std::string place_b = "/volume1/b/@eaDir/fileindex/";
    EXPECT_EQ(Steps(), (std::vector<std::string>{
                           "save", "daemon notify_setting_changed a",
                           "MonitorQueue::Upsert(" + QueuePath("/volume1/a") + ", fileindex, 1)",
                           "daemon notify_setting_changed b",
                           "MonitorQueue::Delete(" + place_b + "queue, fileindex, 1)",
                           "search index_delete fileindex_b",
                           "KLIBCExec(/bin/rm, -rf, " + place_b + "queue)",
                           "KLIBCExec(/bin/rm, -rf, " + place_b + "queue.tmp)",
                           "KLIBCExec(/bin/rm, -rf, " + place_b + "db)", "save"}));
    EXPECT_EQ(Folders(), List({"/a"}));
    EXPECT_EQ(daemon_.Requests().back()["data"]["is_upsert"], false);
    // The enclosing folder has the same switches as the one that went, but perhaps not its reach.
    EXPECT_EQ(Queue("/volume1/a"),
              (std::vector{ConfigEvent("/volume1/a", kAll), ConfigEvent("/volume1/a/x", kNone)}));
    EXPECT_EQ(Queue("/volume1/b").back(), ConfigEvent("/volume1/b/x", kAll));
    EXPECT_EQ(Status()["share"], Json::Value(Json::objectValue));

    EXPECT_EQ(ErrorOf([&] { FolderDelete(Paths({"/a", "/b/x"})); }).code, 902);
    EXPECT_EQ(Folders(), List({"/a"}));

    StartSteps();
    FolderDelete(Paths({"/a"}));
    EXPECT_EQ(Steps().back(), "KLIBServicectlStop(pkg-Quivra-fileindexd, 1)");
}

TEST_F(OperationsTest, AListReadsEachQueueOnceAndGoesOnWithoutAShareThatIsGone) {
    EXPECT_TRUE(toFile(List({"/a/x", "/gone", "/b", "/a/y", "/a"}), kFileIndexFoldersCfgPath));
    WriteFile(QueuePath("/volume1/a"), R"({"event":2,"path":"/volume1/a/x/f"})"
                                       "\n"
                                       R"({"event":2,"path":"/volume1/a/x2"})"
                                       "\n");
    Json::Value result;
    FolderList(result, 0, 10, "path", "", Parse(R"(["status"])"));
    std::string states;
    for (const Json::Value& folder : result["folder"]) {
        states += folder["path"].asString() + ":" +
                  folder["additional"]["status"]["text"].asString() + " ";
    }
    EXPECT_EQ(states, "/a:processing /a/x:processing /a/y:finished /b:finished /gone:error ");
    EXPECT_EQ(fake::CallsOf("FILEIDXQueuePathCompose").size(), 2U);

    // A bad line does not mean that nothing is pending; what was found before it holds.
    WriteFile(QueuePath("/volume1/a"), R"({"event":2,"path":"/volume1/a/x/f"})"
                                       "\nbad\n");
    FolderList(result, 1, 1, "path", "", Parse(R"(["status"])"));
    EXPECT_EQ(result["folder"][0]["additional"]["status"]["text"], "processing");
    EXPECT_EQ(ErrorOf([&] { FolderList(result, 2, 1, "path", "", Parse(R"(["status"])")); }).code,
              906);
    EXPECT_EQ(ErrorOf([&] { FolderList(result, 0, 1, "", "", Json::Value()); }).code, 120);
}

TEST_F(OperationsTest, AVolumeIsAPlainPrefixAndIsSavedFirst) {
    AddShare("c", "/volume10");
    EXPECT_TRUE(toFile(List({"/b", "/a", "/gone", "/a/x", "/c"}), kFileIndexFoldersCfgPath));
    SharePause("unindexed");
    EXPECT_TRUE(Steps().empty());
    VolumePause("/volume1");
    std::vector<std::string> expected = {"save"};
    for (const std::string root : {"/volume1/a", "/volume1/b", "/volume10/c"}) {
        const std::string share = root.substr(root.size() - 1);
        expected.push_back("daemon worker_delete " + share);
        expected.push_back("MonitorQueue::Delete(" + QueuePath(root) + ", fileindex, 1)");
        expected.push_back("search index_pause fileindex_" + share);
    }
    EXPECT_EQ(Steps(), expected);
    StartSteps();
    VolumeResume("/volume10");
    EXPECT_EQ(Steps(),
              (std::vector<std::string>{
                  "save", "search index_resume fileindex_c", "daemon worker_create c",
                  "MonitorQueue::Upsert(" + QueuePath("/volume10/c") + ", fileindex, 1)"}));
    ShareResume("b");
    std::string paused;
    for (const Json::Value& folder : Folders()) {
        paused += folder["paused"].asBool() ? folder["path"].asString() : "";
    }
    EXPECT_EQ(paused, "/a/a/x");
}

TEST_F(OperationsTest, WhatIsClearedLosesDataIndexAndFolders) {
    Json::Value folders = List({"/gone", "/gone/x", "/a", "/b", "/c"});
    for (const Json::ArrayIndex paused : {2U, 4U}) {
        folders[paused]["paused"] = true;
    }
    folders[2]["volume_to_be_clean"] = folders[3]["volume_to_be_clean"] = "/volume1";
    folders[4]["volume_to_be_clean"] = "/volume10";
    EXPECT_TRUE(toFile(folders, kFileIndexFoldersCfgPath));
    for (const char* share : {"gone", "a", "b"}) {
        StatusMgr().SetShareStatus(share, kShareNeedReindex);
    }
    VolumeClearPaused("/volume1");
    EXPECT_EQ(Folders().size(), 4U) << "of its two only the paused one goes";
    EXPECT_EQ(Status()["share"], Parse(R"({"gone":1,"b":1})"));

    EXPECT_TRUE(toFile(List({"/gone", "/gone/x"}), kFileIndexFoldersCfgPath));
    StartSteps();
    ShareClearPaused("gone", "/volume9/gone");
    const std::string place = "/volume9/gone/@eaDir/fileindex/";
    EXPECT_EQ(Steps(), (std::vector<std::string>{"KLIBCExec(/bin/rm, -rf, " + place + "queue)",
                                                 "KLIBCExec(/bin/rm, -rf, " + place + "queue.tmp)",
                                                 "KLIBCExec(/bin/rm, -rf, " + place + "db)", "save",
                                                 "search index_delete fileindex_gone", "save",
                                                 "KLIBServiceStop(kestocontentextractd, 0)",
                                                 "KLIBServicectlStop(pkg-Quivra-fileindexd, 1)"}));
    EXPECT_EQ(Folders(), Json::Value(Json::arrayValue));
    EXPECT_EQ(Status()["share"], Parse(R"({"b":1})"));
}

TEST_F(OperationsTest, AnInterruptedRequestLeavesTheOldSetOrTheNewOne) {
    const std::pair<const char*, std::function<void()>> operations[] = {
        {"add",
         [] {
             FolderAdd(List({"/a/y", "/b/x"}), false);
         }},
        {"set",
         [] {
             FolderSet(List({"/a/x", "/a/y"}), false);
         }},
        {"delete", [] { FolderDelete(Paths({"/a/x"})); }},
        {"pause", [] { SharePause("a"); }},
    };
    for (const auto& [name, run] : operations) {
        const auto arrange = [&](int failing_call) {
            Arrange();
            FolderAdd(List({"/a/x"}), false);
            StartSteps(failing_call);
        };
        arrange(kNever);
        const Json::Value before = Folders();
        run();
        const Json::Value after = Folders();
        const int calls = OutsideCalls();
        int errors = 0;
        for (int call = 1; call <= calls; ++call) {
            arrange(call);
            const Error error = ErrorOf(run);
            errors += error.code != 0 ? 1 : 0;
            const Json::Value left = Folders();
            EXPECT_TRUE(left == before || left == after) << name << " at " << call;
            if (error.code == 0) {
                EXPECT_EQ(left, after) << name << " at " << call;
            }
            ExpectNothingHeld();
        }
        EXPECT_GT(errors, calls / 4) << name << ": hardly any call was made to fail";
    }
}

TEST_F(OperationsTest, TwoProcessesLoseNothing) {
    // Lock attempts are few, and a faked sleep would use them up at once.
    fake::OnSleep([](auto) { poll(nullptr, 0, 50); });
    constexpr int kEach = 10;
    // Both wait for the start, so that the servers' threads hold no lock while this process forks.
    std::array<int, 2> start{};
    ASSERT_EQ(pipe2(start.data(), O_CLOEXEC), 0);
    for (const std::string share : {"a", "b"}) {
        for (int i = 0; i < kEach; ++i) {
            std::filesystem::create_directories("/volume1/" + share + "/" + std::to_string(i));
        }
        if (fork() == 0) {
            close(start[1]);
            char none = 0;
            int code = read(start[0], &none, 1) == 0 ? 0 : 1;
            for (int i = 0; i < kEach && code == 0; ++i) {
                code = ErrorOf([&] {
                           FolderAdd(List({"/" + share + "/" + std::to_string(i)}), false);
                       }).code;
            }
            _exit(code == 0 ? 0 : 1);
        }
    }
    close(start[0]);
    close(start[1]);
    int status = 0;
    while (wait(&status) > 0) {
        EXPECT_EQ(status, 0);
    }
    EXPECT_EQ(Folders().size(), 2U * kEach);
}

}  // namespace
}  // namespace quivra::fileindex
