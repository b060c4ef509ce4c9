#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>

#include <atomic>
#include <filesystem>
#include <random>
#include <thread>

#include "programs/kestoelasticd/codes.h"
#include "tests/programs/kestoelasticd/client.h"
#include "tests/support/program.h"

namespace elasticd {
namespace {

namespace fs = std::filesystem;
using support::Program;

const std::string kSocket = "/var/run/kestoelasticd.sock";
const std::string kVolume = "/volume9";

/// The real program, killed and filled up.
class CrashTest : public testing::Test {
  protected:
    void SetUp() override {
        fs::create_directories(kVolume + "/a");
        fs::create_directories(kVolume + "/b");
    }
    void TearDown() override {
        umount2((kVolume + "/a").c_str(), MNT_DETACH);
        fs::remove_all(kVolume);
        fs::remove_all("/var/lib/kesto/elastic");
    }
    static Program StartDaemon() {
        return support::StartDaemon("kestoelasticd", kSocket, {"--min-free-space", "0"});
    }

    Client client{[](const std::string& request) { return SendToSocket(kSocket, request); }};
};

/// Each round writes batches of two documents that name their round; whenever the kill comes, the
/// index opens, holds the last commit that was answered, or the one after it, and no half of one.
TEST_F(CrashTest, KilledAtAnyMomentItHoldsTheLastCommit) {
    Program daemon = StartDaemon();
    ASSERT_EQ(client.Create(kVolume + "/a/db", TestMappings()), 0);
    std::mt19937 random(3);
    int committed = 0;
    for (int round = 0; round < 20; ++round) {
        std::atomic<int> last = committed;
        std::jthread writer([&] {
            for (int batch = committed + 1;; ++batch) {
                const std::string fields =
                    "{\"size\": " + std::to_string(batch) + ", \"title\": \"some words\"}";
                if (client.Upsert("/one", fields) != 0 || client.Upsert("/two", fields) != 0 ||
                    client.Commit() != 0) {
                    return;
                }
                last = batch;
            }
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(random() % 60));
        daemon.Stop(SIGKILL);
        writer.join();
        daemon = StartDaemon();
        const Json::Value reply = client.Query(R"({"qsl": {"all": []}})");
        ASSERT_TRUE(reply["success"].asBool()) << reply;
        const int size = reply["data"][0]["size"].asInt();
        EXPECT_EQ(reply["data"][1]["size"].asInt(), size);
        EXPECT_GE(size, last);
        EXPECT_LE(size, last + 1);
        committed = size;
    }
    EXPECT_GT(committed, 0);
    EXPECT_EQ(daemon.Stop(SIGTERM), 0);
    EXPECT_FALSE(fs::exists(kSocket));
}

TEST_F(CrashTest, KilledInTheMiddleOfMovesItLosesNothing) {
    Program daemon = StartDaemon();
    mount("none", (kVolume + "/a").c_str(), "tmpfs", 0, nullptr);  // else both are plain renames
    std::string path = kVolume + "/a/db";
    ASSERT_EQ(client.Create(path, TestMappings()), 0);
    for (int i = 0; i < 2000; ++i) {
        ASSERT_EQ(client.Upsert("/" + std::to_string(i), R"({"title": "some words"})"), 0);
    }
    ASSERT_EQ(client.Commit(), 0);
    std::mt19937 random(5);
    for (int round = 0; round < 15; ++round) {
        path = kVolume + (round % 2 == 0 ? "/b/db" : "/a/db");
        Json::Value data;
        data["data"]["path"] = path;
        std::jthread mover([&] { client.Code("index_config_set", data); });
        std::this_thread::sleep_for(std::chrono::milliseconds(random() % 20));
        daemon.Stop(SIGKILL);
        mover.join();
        daemon = StartDaemon();
        ASSERT_EQ(client.Query(R"({"qsl": {"all": []}, "limit": 0})")["total"].asInt(), 2000);
        ASSERT_EQ(client.Code("index_config_set", data), 0);
        for (const std::string side : {"/a", "/b"}) {
            const auto files = std::distance(fs::directory_iterator(kVolume + side), {});
            EXPECT_EQ(files, path == kVolume + side + "/db" ? 1 : 0) << side;
        }
    }
}

TEST_F(CrashTest, AFullDiskCostsTheBatchOnly) {
    if (mount("none", (kVolume + "/a").c_str(), "tmpfs", 0, "size=2m") != 0) {
        GTEST_SKIP() << "cannot mount here";
    }
    Program daemon = StartDaemon();
    ASSERT_EQ(client.Create(kVolume + "/a/db", TestMappings()), 0);
    ASSERT_EQ(client.Upsert("/kept", R"({"title": "kept"})"), 0);
    ASSERT_EQ(client.Commit(), 0);
    int code = 0;
    std::mt19937 random(9);
    for (int i = 0; i < 200 && code == 0; ++i) {
        std::string text;
        for (int word = 0; word < 3000; ++word) {
            text += std::to_string(random()) + " ";
        }
        code = client.Upsert("/" + std::to_string(i), "{\"KESTOMDTextContent\": \"" + text + "\"}");
    }
    if (code == 0) {
        code = client.Commit();
    }
    EXPECT_EQ(code, kNoSpace);
    EXPECT_EQ(client.All(), Ids{"/kept"});
    client.Commit();  // may have to tell of the loss
    ASSERT_EQ(mount("none", (kVolume + "/a").c_str(), "tmpfs", MS_REMOUNT, "size=4m"), 0);
    EXPECT_EQ(client.Upsert("/small", "{}"), 0);
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), (Ids{"/kept", "/small"}));
}

}  // namespace
}  // namespace elasticd
