#include "fileindex/index_mgr.h"
#include "tests/fileindex/management_fixture.h"

namespace quivra::fileindex {
namespace {

class ShareMovesTest : public ManagementTest {
  protected:
    ShareMovesTest() { Arrange(); }

    /// The platform knows the share "new" at /volume1/new, which was "old" a moment ago.
    void Arrange() {
        Reset();
        AddShare("new");
        AddShare("other");
        EXPECT_TRUE(toFile(List({"/old", "/other", "/old/x"}), kFileIndexFoldersCfgPath));
        StartSteps();
    }
    static Json::Value Line(int event, const std::string& path, const std::string& path_old) {
        Json::Value line = Parse(R"({"is_dir":true,"data":null})");
        line["event"] = event;
        line["path"] = path;
        line["path_old"] = path_old;
        return line;
    }
    static bool IsFlagged(const std::string& share) {
        return StatusMgr().GetShareStatus(share) == 1;
    }
};

TEST_F(ShareMovesTest, ARenamedShareTakesEverythingAlong) {
    StatusMgr().SetShareStatus("old", kShareNeedReindex);
    StartSteps();
    ShareRename("old", "new");
    EXPECT_EQ(Steps(),
              (std::vector<std::string>{
                  "save",  // flagged for the time of the move
                  "daemon worker_delete old",
                  "MonitorQueue::Delete(/volume1/old/@eaDir/fileindex/queue, fileindex, 1)",
                  "search index_config_set fileindex_old",
                  "save",          // folders
                  "save", "save",  // flags: first the new name's, then the old name's
                  "MonitorQueue::Upsert(/volume1/new/@eaDir/fileindex/queue, fileindex, 1)",
                  "daemon worker_create new"}));
    EXPECT_EQ(search_.Requests().back()["data"]["data"],
              Parse(R"({"id":"fileindex_new","path":"/volume1/new/@eaDir/fileindex/db"})"));
    EXPECT_EQ(Folders(), List({"/new", "/other", "/new/x"}));
    EXPECT_EQ(Status()["share"], Parse(R"({"new":1})"));
    EXPECT_EQ(Queue("/volume1/new"), std::vector{Line(256, "/volume1/new", "/volume1/old")});
    EXPECT_EQ(fake::Platform()->monitor_queues.at({QueuePath("/volume1/new"), "fileindex"})["path"],
              Parse(R"(["/volume1/new","/volume1/new/x"])"));
}

TEST_F(ShareMovesTest, APausedShareStaysPaused) {
    Json::Value folders = List({"/old", "/other"});
    folders[0]["paused"] = true;
    EXPECT_TRUE(toFile(folders, kFileIndexFoldersCfgPath));
    ShareRename("old", "new");
    EXPECT_TRUE(fake::Platform()->monitor_queues.empty());
    EXPECT_EQ(daemon_.Requests().back()["type"], "worker_delete");
    StartSteps();
    ShareMigrate("other", "/volume1/other");  // has not moved
    EXPECT_TRUE(Steps().empty());
}

TEST_F(ShareMovesTest, ASwitchedRecycleBinIsSettled) {
    AddShare("homes");
    std::filesystem::create_directories("/volume1/homes/alice/#recycle");
    EXPECT_TRUE(toFile(List({"/homes"}), kFileIndexFoldersCfgPath));
    ShareCheckRecycle("homes");
    const auto queue = Queue("/volume1/homes");
    ASSERT_EQ(queue.size(), 2U);
    EXPECT_EQ(queue[0]["event"], 65536);
    EXPECT_EQ(queue[0]["path"], "/volume1/homes/#recycle");
    EXPECT_EQ(queue[1]["path"], "/volume1/homes/alice/#recycle");
}

/// Every outside call fails in turn; the second call must bring the same end, and must have queued
/// a reindex where the first left the share unwatched.
TEST_F(ShareMovesTest, ASecondCallFinishesWhatTheFirstLeft) {
    struct Operation {
        const char* name;
        bool is_rename;
        std::function<void()> run;
    };
    const Operation operations[] = {
        {"rename", true, [] { ShareRename("old", "new"); }},
        {"migrate", false, [] { ShareMigrate("new", "/volume9/new"); }},
    };
    for (const Operation& operation : operations) {
        const std::string from = operation.is_rename ? "old" : "new";
        const auto arrange = [&] {
            Arrange();
            if (!operation.is_rename) {
                EXPECT_TRUE(toFile(List({"/new", "/other", "/new/x"}), kFileIndexFoldersCfgPath));
            }
        };
        arrange();
        operation.run();
        EXPECT_EQ(search_.Requests().back()["data"]["data"].isMember("id"), operation.is_rename);
        const Json::Value folders = Folders();
        const auto registrations = fake::Platform()->monitor_queues;
        const auto event = Queue("/volume1/new").at(0);
        const int calls = OutsideCalls();
        for (int call = 1; call <= calls; ++call) {
            arrange();
            StartSteps(call);
            const Error error = ErrorOf(operation.run);
            const auto first_steps = Steps();
            const bool was_unwatched =
                std::find(first_steps.begin(), first_steps.end(), "daemon worker_delete " + from) !=
                first_steps.end();
            const bool was_flagged = IsFlagged("new");
            ExpectNothingHeld();
            StartSteps();
            operation.run();
            const std::string where = operation.name + std::string(" at ") + std::to_string(call);
            EXPECT_EQ(Folders(), folders) << where;
            EXPECT_EQ(fake::Platform()->monitor_queues, registrations) << where;
            EXPECT_FALSE(IsFlagged("new")) << where;
            const auto queue = Queue("/volume1/new");
            ASSERT_FALSE(queue.empty()) << where;
            EXPECT_EQ(queue[0], event) << where;
            if (was_flagged) {
                EXPECT_EQ(queue.back(), Line(65536, "/volume1/new", "")) << where;
                const auto steps = Steps();
                EXPECT_EQ(steps[steps.size() - 2], "daemon worker_create new") << where;
            }
            EXPECT_TRUE(error.code == 0 || was_flagged || !was_unwatched) << where;
            ExpectNothingHeld();
        }
    }
}

}  // namespace
}  // namespace quivra::fileindex
