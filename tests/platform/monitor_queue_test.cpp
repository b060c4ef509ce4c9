#include <kesto/monitor_queue.h>

#include <cerrno>
#include <set>

#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using KESTO::KESTOTIFYD::MonitorQueue;

class MonitorQueueTest : public PlatformTest {
  protected:
    void TearDown() override { std::filesystem::remove_all("/var/lib/kesto"); }

    static bool Upsert(const std::string& queue, const std::string& path,
                       const std::string& app = "fileindex") {
        Json::Value description;
        description["queue"] = queue;
        description["config"]["path"].append(path);
        return MonitorQueue::Upsert(MonitorQueue(description), app, MONITOR_QUEUE_TYPE_APPLICATION);
    }
    static bool Delete(const std::string& queue, const std::string& app = "fileindex") {
        return MonitorQueue::Delete(queue, app, MONITOR_QUEUE_TYPE_APPLICATION);
    }
    /// "QUEUE|APP|PATH" of every registration on disk.
    static std::multiset<std::string> Registered() {
        std::multiset<std::string> found;
        for (const auto& entry : std::filesystem::directory_iterator(KESTO_MONITOR_DIRECTORY)) {
            EXPECT_EQ(entry.path().extension(), ".json");
            Json::Value value;
            EXPECT_TRUE(Json::Reader().parse(ReadFile(entry.path()), value));
            EXPECT_EQ(value["type"].asInt(), 1);
            found.insert(value["queue"].asString() + "|" + value["app"].asString() + "|" +
                         value["config"]["path"][0].asString());
        }
        return found;
    }
};

TEST_F(MonitorQueueTest, OneRegistrationPerQueueAndApplication) {
    using Set = std::multiset<std::string>;
    errno = 0;
    EXPECT_TRUE(Delete("/v/a/queue"));  // before the directory exists
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/1"));
    EXPECT_EQ(ModeOf(KESTO_MONITOR_DIRECTORY), 0700U);
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/2"));
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/3", "other"));
    EXPECT_TRUE(Upsert("/v/a%2Fqueue", "/v/a/4"));
    EXPECT_TRUE(Upsert("/v/\xff\n/queue", "/v/\xff"));
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(Registered(),
              (Set{"/v/a/queue|fileindex|/v/a/2", "/v/a/queue|other|/v/a/3",
                   "/v/a%2Fqueue|fileindex|/v/a/4", "/v/\xff\n/queue|fileindex|/v/\xff"}));
    EXPECT_TRUE(Delete("/v/a/queue"));
    EXPECT_TRUE(Delete("/v/a/queue"));
    EXPECT_TRUE(Delete("/v/a%2Fqueue"));
    EXPECT_TRUE(Delete("/v/\xff\n/queue"));
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(Registered(), Set{"/v/a/queue|other|/v/a/3"});
}

TEST_F(MonitorQueueTest, LongQueuePathsStayApart) {
    const std::string common = "/volume1/" + std::string(4000, 'x');
    EXPECT_TRUE(Upsert(common + "a", "/a"));
    EXPECT_TRUE(Upsert(common + "b", "/b"));
    EXPECT_EQ(Registered().size(), 2U);
    EXPECT_TRUE(Delete(common + "a"));
    EXPECT_EQ(Registered(), std::multiset<std::string>{common + "b|fileindex|/b"});
}

TEST_F(MonitorQueueTest, RefusesDescriptionsThatDescribeNothing) {
    for (const char* text : {"null", "[]", "{}", "{\"queue\": 1, \"config\": {}}",
                             "{\"queue\": \"/q\"}", "{\"queue\": \"/q\", \"config\": []}"}) {
        Json::Value description;
        Json::Reader().parse(std::string("{\"v\": ") + text + "}", description);
        errno = 0;
        EXPECT_FALSE(MonitorQueue::Upsert(MonitorQueue(description["v"]), "fileindex",
                                          MONITOR_QUEUE_TYPE_APPLICATION))
            << text;
        EXPECT_EQ(errno, EINVAL);
    }
    EXPECT_FALSE(std::filesystem::exists("/var/lib/kesto"));
    WriteFile(KESTO_MONITOR_DIRECTORY, "in the way");
    EXPECT_FALSE(Upsert("/q", "/p"));
    EXPECT_EQ(errno, ENOTDIR);
}

}  // namespace
