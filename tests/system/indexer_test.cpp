// The live stack when something stands in the indexer's way: it says so in one sentence, and goes
// on by itself.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <functional>
#include <vector>

#include "fileindex/elastic/elastic_control.h"
#include "tests/system/live_fixture.h"

namespace {

const std::string kPlace = kRoot + "/@eaDir/fileindex";

class IndexerTest : public LiveTest {
  protected:
    static bool HasProblem(const std::string& part) {
        return Eventually([&] {
            const Json::Value state = ShareState();
            return state["state"] == "problem" &&
                   state["problem"].asString().find(part) != std::string::npos;
        });
    }
    static Json::Value Failures() {
        Json::Value request;
        request["type"] = "failed";
        request["data"]["share"] = "photo";
        return AskIndexer(request)["data"];
    }
};

TEST_F(IndexerTest, FreshFilesAreFoundAtOnce) {
    std::vector<double> took;
    for (int i = 0; i < 11; ++i) {
        const std::string path = kRoot + "/fresh " + std::to_string(i) + ".txt";
        Eventually([] { return ShareState()["state"] == "idle"; });
        std::this_thread::sleep_for(std::chrono::milliseconds(300));  // a calm share
        WriteFile(path, "fresh");
        const auto start = Clock::now();
        EXPECT_TRUE(Eventually([&] { return IsFound(path, "fresh"); }));
        took.push_back(MillisecondsSince(start));
    }
    std::sort(took.begin(), took.end());
    std::cout << "from close to found, median: " << took[took.size() / 2] << " ms\n";
}

TEST_F(IndexerTest, WhatIsPlantedIsReportedAndTheShareHeals) {
    const struct {
        const char* label;
        std::function<void()> plant;
        std::function<void()> remove;
        const char* problem;
    } cases[] = {
        {"a FIFO as working copy", [] { mkfifo((kPlace + "/queue.tmp").c_str(), 0600); },
         [] { fs::remove(kPlace + "/queue.tmp"); }, "queue.tmp is not a file; remove it"},
        {"a directory as backlog",
         [] {
             fs::remove(kPlace + "/queue.backlog");
             fs::create_directory(kPlace + "/queue.backlog");
         },
         [] { fs::remove(kPlace + "/queue.backlog"); }, "queue.backlog is not a file; remove it"},
        {"a dangling link as queue",
         [] {
             fs::remove(kPlace + "/queue");
             fs::create_symlink("/nowhere", kPlace + "/queue");
         },
         [] { fs::remove(kPlace + "/queue"); }, "queue is not a file; remove it"},
        {"open to others",
         [] { fs::permissions(kRoot + "/@eaDir", fs::perms::others_write, fs::perm_options::add); },
         [] {
             fs::permissions(kRoot + "/@eaDir", fs::perms::others_write, fs::perm_options::remove);
         },
         "can be written to by other users"},
    };
    for (const auto& test : cases) {
        SCOPED_TRACE(test.label);
        test.plant();
        WriteFile(kRoot + "/" + test.label, test.label);
        EXPECT_TRUE(HasProblem(test.problem)) << quivra::toString(ShareState());
        test.remove();
        ExpectSettled();
    }
}

TEST_F(IndexerTest, WhatIsLostIsMadeAnewWithoutACommand) {
    MakeDirectory(kRoot + "/album", 30);
    ExpectSettled();
    for (const char* lost :
         {"/@eaDir/fileindex/db", "/@eaDir/fileindex/queue.backlog", "/@eaDir"}) {
        SCOPED_TRACE(lost);
        fs::remove_all(kRoot + lost);
        WriteFile(kRoot + "/album/since.txt", lost);
        ExpectSettled();
    }
    for (const auto& file : fs::recursive_directory_iterator(kPlace + "/db")) {
        if (file.is_regular_file()) {
            WriteFile(file.path(), "garbage");
        }
    }
    WriteFile(kRoot + "/album/since.txt", "damaged");
    ExpectSettled();

    fs::remove_all(kRoot);
    fs::create_directory(kRoot);
    WriteFile(kRoot + "/new.txt", "the share was made again");
    ExpectSettled();
}

// A lease makes a file unreadable for as long as its holder likes, up to 45 seconds.
TEST_F(IndexerTest, ALeasedFileIsListedAndTriedAgain) {
    std::signal(SIGIO, SIG_IGN);
    const std::string outside = kVolume + "/leased.txt";
    const std::string path = kRoot + "/leased.txt";
    WriteFile(outside, "leased");
    const quivra::base::UniqueFd fd(open(outside.c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(fcntl(fd.Get(), F_SETLEASE, F_WRLCK), 0);
    fs::rename(outside, path);
    ASSERT_TRUE(Eventually([] { return Failures().size() == 1; }));
    EXPECT_EQ(Failures()[0]["path"], path);
    EXPECT_NE(Failures()[0]["reason"].asString().find("lease"), std::string::npos);
    EXPECT_GT(Failures()[0]["next_try"].asInt64(), Failures()[0]["since"].asInt64());
    EXPECT_TRUE(IsFound(path, "")) << "by its name";
    ASSERT_EQ(fcntl(fd.Get(), F_SETLEASE, F_UNLCK), 0);
    Json::Value request;
    request["type"] = "retry";
    request["data"]["share"] = "photo";
    EXPECT_EQ(AskIndexer(request)["success"], true);
    EXPECT_TRUE(Eventually([&] { return IsFound(path, "leased") && Failures().empty(); }));
}

TEST_F(IndexerTest, StopsWithinASecondWhileItWaitsForTheSearchDaemon) {
    kill(engine_->Pid(), SIGSTOP);
    WriteFile(kRoot + "/later.txt", "later");
    // It may already have been waiting for a reply before it could say what it is at.
    Eventually([] { return ShareState()["state"] == "processing"; }, std::chrono::seconds(3));
    const int worker = ShareState()["pid"].asInt();
    const auto start = Clock::now();
    EXPECT_EQ(indexer_->Stop(SIGTERM), 0);
    EXPECT_LT(MillisecondsSince(start), 1000);
    const std::string command = "/proc/" + std::to_string(worker) + "/cmdline";
    EXPECT_TRUE(
        Eventually([&] { return support::ReadFile(command).empty(); }, std::chrono::seconds(2)));
    kill(engine_->Pid(), SIGCONT);
    StartIndexer();
    kill(indexer_->Pid(), SIGHUP);
    kill(indexer_->Pid(), SIGPIPE);
    ExpectSettled();
}

TEST_F(IndexerTest, AFirstIndexingHoldsUpNobody) {
    indexer_->Stop(SIGTERM);
    MakeDirectory(kRoot + "/many", 5000);
    StartIndexer();
    Eventually([] { return ShareState()["waiting"].asInt() > 1000; }, std::chrono::seconds(3));
    WriteFile(kRoot + "/fresh.txt", "fresh");
    const auto start = Clock::now();
    // A question about all files would itself hold up the work.
    Json::Value query;
    query["qsl"]["term"]["KESTOMDPath"] = kRoot + "/fresh.txt";
    EXPECT_TRUE(Eventually([&] {
        Json::Value reply;
        elastic::IndexQuery(reply, "photo", query);
        return reply["total"] == 1;
    }));
    std::cout << "found after " << MillisecondsSince(start) << " ms, "
              << ShareState()["waiting"].asInt() << " files waiting\n";
    SharePause("photo");
    EXPECT_TRUE(Eventually([] { return ShareState().isNull(); }));
    ShareResume("photo");
    KillWorkerAtWork();
    ExpectSettled();
    EXPECT_TRUE(Eventually([] { return ShareState()["waiting"].asInt() == 0; }));
}

}  // namespace
