#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <ctime>
#include <random>

#include "tests/programs/fileindexd/pass_fixture.h"

namespace fileindexd {
namespace {

class BacklogTest : public PassTest {
  protected:
    void TearDown() override {
        // Deeper than std::filesystem's own way of removing can go.
        ASSERT_EQ(std::system(("rm -rf " + root_).c_str()), 0);
    }

    void PutMany(const std::string& directory, int count) {
        for (int i = 0; i < count; ++i) {
            Put(directory + "/" + std::to_string(i) + ".txt", directory + std::to_string(i));
        }
    }
    void ReadNames() {
        RunPass();
        while (backlog_->GetTotals().places > 0) {
            RunSlice();
        }
    }
    std::string TextOf(const std::string& path) const {
        const auto found = index_->Committed().find(Full(path));
        return found == index_->Committed().end() ? "(not there)" : found->second.text;
    }
};

TEST_F(BacklogTest, NamesComeBeforeContentsAndAFreshChangeBeforeBoth) {
    PutMany("/a", 700);
    PutMany("/b", 700);
    Queue(EVENT_REINDEX, "");
    RunPass();
    EXPECT_TRUE(index_->Committed().empty());
    Write("/fresh.txt", "now");
    RunPass();
    EXPECT_EQ(TextOf("/fresh.txt"), "now");

    ReadNames();
    EXPECT_EQ(index_->extracted, 1);
    EXPECT_EQ(index_->Committed().size(), Expected().size());
    EXPECT_EQ(TextOf("/b/7.txt"), "");
    EXPECT_EQ(backlog_->GetTotals().files, 1400U);
    EXPECT_GT(backlog_->GetTotals().bytes, 1400U * 3);
    Write("/fresh.txt", "again");
    RunPass();
    EXPECT_EQ(TextOf("/fresh.txt"), "again");
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
    EXPECT_EQ(index_->extracted, 1402);
}

TEST_F(BacklogTest, RenamesAndDeletesTakeTheBacklogAlong) {
    PutMany("/old", 50);
    PutMany("/gone", 50);
    PutMany("/kept", 50);
    Queue(EVENT_REINDEX, "");
    ReadNames();
    Move("/old", "/kept/new");
    Move("/kept/7.txt", "/kept/new/7.txt");
    Remove("/gone");
    RunPass();
    EXPECT_EQ(backlog_->GetTotals().files, 98U) << "one took another's place, and is done";
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
    EXPECT_EQ(index_->extracted, 99) << "each file once";
}

TEST_F(BacklogTest, ARenamedShareTakesItAlong) {
    PutMany("/d", 20);
    Queue(EVENT_REINDEX, "");
    ReadNames();
    const std::string renamed = "/volume1/renamed";
    fs::rename(root_, renamed);
    std::ofstream(renamed + "/@eaDir/fileindex/queue")
        << R"({"event":256,"is_dir":true,"path":"/volume1/renamed","path_old":"/volume1/share"})"
        << "\n";
    Open(renamed);
    Run();
    EXPECT_EQ(index_->Committed().at(renamed + "/d/7.txt").text, "/d7");
    EXPECT_EQ(index_->extracted, 20);
    fs::remove_all(renamed);
}

TEST_F(BacklogTest, APassLeavesWhatIsTooMuchForIt) {
    for (int i = 0; i < 30; ++i) {
        Write("/" + std::to_string(i) + ".txt", "text");
    }
    Put("/29.txt", "more");
    Remove("/28.txt");
    files_time_ = {};
    RunPass();
    EXPECT_EQ(index_->extracted, 0);
    Move("/27.txt", "/moved.txt");
    RunPass();
    while (backlog_->GetTotals().places > 0) {
        RunSlice();
    }
    EXPECT_EQ(index_->Committed().size() + 1, Expected().size()) << "the root has not changed";
    Run();
    EXPECT_EQ(TextOf("/29.txt"), "more");
    EXPECT_EQ(index_->Committed().size() + 1, Expected().size());
    EXPECT_EQ(index_->extracted, 29);
}

// The classes to be extracted again stand in the directories that have not been read.
TEST_F(BacklogTest, WhatIsMovedOutOfAnUnreadTreeIsStillExtractedAgain) {
    for (const char* path : {"/from/d/f.txt", "/from/g.txt"}) {
        Put(path, "text");
    }
    scope_.without_meta = {Full("")};
    IndexAll();
    scope_.without_meta.clear();
    Json::Value settings;
    settings["document"] = true;
    Queue(EVENT_UPDATE_CFG, "/from", "", true, settings);
    RunPass();
    Move("/from/d", "/d");
    Move("/from/g.txt", "/g.txt");
    Run();
    EXPECT_EQ(TextOf("/d/f.txt"), "text");
    EXPECT_EQ(TextOf("/g.txt"), "text");
}

TEST_F(BacklogTest, ADirectoryTooLargeForASliceMayBeRenamedMeanwhile) {
    PutMany("/large", 1800);
    Queue(EVENT_REINDEX, "");
    RunPass();
    for (int slice = 0; slice < 3; ++slice) {
        RunSlice();
    }
    EXPECT_GT(index_->Committed().size(), 100U);
    EXPECT_LT(index_->Committed().size(), 1800U);
    Move("/large", "/renamed");
    Mkdir("/large");
    Write("/large/f.txt", "another");
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
}

TEST_F(BacklogTest, ExchangedDirectoriesAreSeenThoughNobodyWatched) {
    const timespec times[] = {{1'700'000'000, 0}, {1'700'000'000, 0}};
    for (const char* path : {"/a/f.txt", "/b/f.txt"}) {
        Put(path, std::string("text in ") + path[1]);
        ASSERT_EQ(utimensat(AT_FDCWD, Full(path).c_str(), times, 0), 0);
    }
    IndexAll();
    fs::rename(Full("/a"), Full("/t"));
    fs::rename(Full("/b"), Full("/a"));
    fs::rename(Full("/t"), Full("/b"));
    Queue(EVENT_REINDEX, "");
    Run();
    EXPECT_EQ(TextOf("/a/f.txt"), "text in b");
    EXPECT_EQ(TextOf("/b/f.txt"), "text in a");
}

TEST_F(BacklogTest, WhatCannotBeReadIsListedAndTriedAgain) {
    index_->unreadable = {
        {Full("/leased.txt"), true}, {Full("/broken.txt"), false}, {Full("/late.txt"), true}};
    for (const char* path : {"/leased.txt", "/broken.txt"}) {
        Write(path, "text");
    }
    RunPass();
    Put("/late.txt", "text");
    Queue(EVENT_REINDEX, "");
    Run();
    const std::int64_t now = time(nullptr);
    const std::vector<Backlog::Failure> failures = backlog_->Failures(10);
    ASSERT_EQ(failures.size(), 3U);
    EXPECT_EQ(failures[0].path, Full("/broken.txt"));
    EXPECT_EQ(failures[0].reason, "it cannot be read");
    EXPECT_EQ(failures[0].next_try, Backlog::kNever);
    EXPECT_NEAR(static_cast<double>(failures[2].since), static_cast<double>(now), 2);
    EXPECT_NEAR(static_cast<double>(failures[2].next_try), static_cast<double>(now + 5), 2);
    EXPECT_EQ(TextOf("/leased.txt"), "") << "it is found by its name";

    RunSlice({}, now + 60,
             CatchUp::Clock::now() + std::chrono::seconds(1));  // in vain: the wait grows
    EXPECT_NEAR(static_cast<double>(backlog_->Failures(10)[1].next_try),
                static_cast<double>(now + 70), 2);
    EXPECT_EQ(backlog_->Failures(10)[1].since, failures[2].since);
    index_->unreadable.clear();
    RunSlice({}, now + 120, CatchUp::Clock::now() + std::chrono::seconds(1));
    EXPECT_EQ(TextOf("/leased.txt"), "text");
    ASSERT_EQ(backlog_->Failures(10).size(), 1U);
    Write("/broken.txt", "mended");
    Run();
    EXPECT_EQ(TextOf("/broken.txt"), "mended");
    EXPECT_TRUE(backlog_->Failures(10).empty());

    index_->unreadable = {{Full("/broken.txt"), false}};
    Write("/broken.txt", "text");
    Run();
    index_->unreadable.clear();
    Open(root_);
    backlog_->RetryFailures();
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
}

TEST_F(BacklogTest, LinesAboutOtherPlacesDropNothing) {
    PutMany("/d", 3);
    IndexAll();
    const auto line = [&](const char* text) {
        std::ofstream(queue_, std::ios::app) << text << "\n";
    };
    for (const char* event : {"128", "2", "4", "65536", "131072", "256"}) {
        for (const char* path : {"/volume1", "/", "/volume1/shar", "/volume1/share/../share"}) {
            line((std::string(R"({"event":)") + event + R"(,"path":")" + path +
                  R"(","path_old":"/volume1/share/none","is_dir":true})")
                     .c_str());
        }
    }
    line(R"({"event":256,"path":"/volume1/share/d/x","path_old":"/volume1","is_dir":true})");
    line(R"({"event":256,"path":"/elsewhere","path_old":"/volume1/share/d/0.txt"})");
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
    EXPECT_EQ(index_->extracted, 0);
}

// Opening each directory from the share's root costs the square of the depth, so little of it that
// the limit of a path's length comes first; resolving each path by hand cost its cube.
TEST_F(BacklogTest, DeepChainsEnd) {
    for (const int depth : {1000, 2500}) {
        SCOPED_TRACE(depth);
        StartAgain();
        quivra::base::UniqueFd at(open(root_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        for (int i = 0; i < depth; ++i) {
            ASSERT_EQ(mkdirat(at.Get(), "d", 0755), 0);
            at = quivra::base::UniqueFd(openat(at.Get(), "d", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        }
        Queue(EVENT_REINDEX, "");
        const std::clock_t begin = std::clock();
        Run();
        EXPECT_LT(static_cast<double>(std::clock() - begin) / CLOCKS_PER_SEC, 5);
        const std::size_t reachable = (4095 - root_.size()) / 2;
        EXPECT_EQ(index_->Committed().size(),
                  1 + std::min(static_cast<std::size_t>(depth), reachable));
        TearDown();
    }
}

TEST_F(BacklogTest, ADamagedStoreBeginsAgainWithEverything) {
    std::mt19937 random(7);
    const std::string file = root_ + "/@eaDir/fileindex/" + Backlog::kFileName;
    for (int trial = 0; trial < 30; ++trial) {
        SCOPED_TRACE(trial);
        StartAgain();
        PutMany("/d", 20);
        Queue(EVENT_REINDEX, "");
        trial % 2 == 0 ? void(RunPass()) : ReadNames();
        catch_up_.reset();
        backlog_.reset();  // the log goes into the file
        std::fstream stream(file, std::ios::in | std::ios::out | std::ios::binary);
        const auto size = static_cast<unsigned int>(fs::file_size(file));
        for (int change = 0; change < 40; ++change) {
            stream.seekp(random() % (trial % 3 == 0 ? 200 : size));
            stream.put(static_cast<char>(random()));
        }
        stream.close();
        try {
            Open(root_);
            Run();
            backlog_->Failures(10);
            backlog_->RetryFailures();
        } catch (const sqlite::Error&) {
            catch_up_.reset();
            backlog_.reset();
            Backlog::Remove(directory_);
        }
        Open(root_);
        backlog_->AddReindex(root_, scope_.Describe(root_));
        Run();
        ASSERT_EQ(index_->Committed(), Expected());
    }
}

}  // namespace
}  // namespace fileindexd
