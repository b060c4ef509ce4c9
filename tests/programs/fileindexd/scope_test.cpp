#include "programs/fileindexd/scope.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "programs/fileindexd/queue_watch.h"
#include "programs/fileindexd/schedule.h"

namespace fs = std::filesystem;

namespace fileindexd {
namespace {

using quivra::fileindex::kFileIndexFoldersCfgPath;

/// The machine's own platform, with one share.
class ScopeTest : public testing::Test {
  protected:
    ScopeTest() {
        fs::remove_all("/var/packages/Quivra");
        fs::create_directories("/var/packages/Quivra/etc");
        fs::create_directories("/etc/kesto");
        for (const char* directory : {"in/sub/deep", "out/chosen", "in2"}) {
            fs::create_directories("/volume1/s/" + std::string(directory));
        }
        std::ofstream("/etc/kesto/shares.conf") << "[s]\npath = /volume1/s\nrecycle = yes\n";
    }

    static void Configure() {
        const auto folder = [](const char* path, bool audio) {
            return quivra::fileindex::Folder(path, "", true, audio, false, false, false).GetData();
        };
        Json::Value list(Json::arrayValue);
        list.append(folder("/s/in", true));
        list.append(folder("/s/in/sub/deep", false));
        list.append(folder("/s/out/chosen", true));
        ASSERT_TRUE(quivra::toFile(list, kFileIndexFoldersCfgPath));
    }
};

TEST_F(ScopeTest, TheWholeShareUntilFoldersWereChosen) {
    const auto scope = LoadScope();
    EXPECT_TRUE(scope->Covers("/volume1/s/any", true));
    EXPECT_TRUE(scope->NeedsMeta("/volume1/s/a.jpg"));
    EXPECT_FALSE(scope->NeedsMeta("/volume1/s/a.unknown"));
    std::ofstream(kFileIndexFoldersCfgPath) << "[]";
    EXPECT_FALSE(LoadScope()->Covers("/volume1/s/any", true));
}

TEST_F(ScopeTest, FoldersDecideWhatIsIndexedAndHow) {
    Configure();
    const auto scope = LoadScope();
    const struct {
        const char* path;
        bool is_dir;
        bool covered;
    } cases[] = {
        {"/volume1/s", true, false},
        {"/volume1/s/in", true, true},
        {"/volume1/s/in2", true, false},
        {"/volume1/s/in/a.mp3", false, true},
        {"/volume1/s/in/sub", true, true},
        {"/volume1/s/out", true, false},
        {"/volume1/s/out/a", false, false},
        {"/volume1/s/out/chosen/a", false, true},
        {"/volume1/s/in/nowhere/a", false, false},
    };
    for (const auto& test : cases) {
        EXPECT_EQ(scope->Covers(test.path, test.is_dir), test.covered) << test.path;
    }
    EXPECT_TRUE(scope->NeedsMeta("/volume1/s/in/a.mp3"));
    EXPECT_FALSE(scope->NeedsMeta("/volume1/s/in/sub/deep/a.mp3"));

    using Paths = std::vector<std::string>;
    EXPECT_EQ(scope->RootsWithin("/volume1/s/in/sub"), Paths{"/volume1/s/in/sub"});
    EXPECT_EQ(scope->RootsWithin("/volume1/s/out"), Paths{"/volume1/s/out/chosen"});
    EXPECT_TRUE(scope->RootsWithin("/volume1/s/in2").empty());

    EXPECT_TRUE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/out/chosen/b"));
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in/sub/deep/b"));
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in/sub")) << "deep is in it";
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in2/b"));
}

TEST_F(ScopeTest, NewLinesAboutBusyFilesWait) {
    const std::string queue = "/var/queue_test/queue";
    fs::remove_all("/var/queue_test");
    fs::create_directories("/var/queue_test");
    const auto append = [&](const std::string& text) {
        std::ofstream(queue, std::ios::app) << text;
    };
    const std::string busy = R"({"event":2,"path":"/busy"})"
                             "\n";
    QueueWatch watch(queue);
    ChangeRates rates;
    const Clock::time_point now = Clock::now();
    rates.Indexed("/busy", now);
    rates.Indexed("/busy", now);

    append(busy.substr(0, 5));
    EXPECT_TRUE(watch.Read().queue);
    EXPECT_FALSE(watch.Read().queue);
    Schedule schedule;
    watch.ReadNewLines(schedule, rates, now);
    EXPECT_FALSE(schedule.Due()) << "half a line";
    append(busy.substr(5) + busy);
    watch.ReadNewLines(schedule, rates, now);
    EXPECT_EQ(schedule.Due(), now + ChangeRates::kShortestWait);
    append(R"({"event":64,"path":"/other"})"
           "\n");
    watch.ReadNewLines(schedule, rates, now);
    EXPECT_EQ(schedule.Due(), now + Schedule::kQuiet);

    schedule.PassBegins();
    watch.Forget();
    fs::remove(queue);
    append("garbage\n");
    watch.ReadNewLines(schedule, rates, now);
    EXPECT_EQ(schedule.Due(), now + Schedule::kQuiet);
    fs::remove_all("/var/queue_test");
    EXPECT_TRUE(watch.Read().gone);
}

}  // namespace
}  // namespace fileindexd
