#include <kesto/monitor_queue.h>
#include <sys/resource.h>

#include <cerrno>
#include <csignal>
#include <set>

#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using KESTO::KESTOTIFYD::MonitorQueue;
using Set = std::multiset<std::string>;

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
    static bool Delete(const std::string& queue) {
        return MonitorQueue::Delete(queue, "fileindex", MONITOR_QUEUE_TYPE_APPLICATION);
    }
    /// "QUEUE|APP|PATH" of every registration on disk, where nothing else may be.
    static Set Registered() {
        Set found;
        for (const auto& entry : std::filesystem::directory_iterator(KESTO_MONITOR_DIRECTORY)) {
            Json::Value value;
            EXPECT_TRUE(Json::Reader().parse(ReadFile(entry.path()), value)) << entry;
            found.insert(value["queue"].asString() + "|" + value["app"].asString() + "|" +
                         value["config"]["path"][0].asString());
        }
        return found;
    }
};

TEST_F(MonitorQueueTest, OneRegistrationPerQueueAndApplication) {
    const std::string common = "/volume1/" + std::string(4000, 'x');
    const std::string queues[] = {"/v/a%2Fqueue", "/v/\xff\n/queue", common + "a", common + "b"};
    errno = 0;
    EXPECT_TRUE(Delete("/v/a/queue"));  // before the directory exists
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/1"));
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/2"));
    EXPECT_TRUE(Upsert("/v/a/queue", "/v/a/3", "other"));
    EXPECT_EQ(ModeOf(KESTO_MONITOR_DIRECTORY), 0700U);
    Set expected{"/v/a/queue|fileindex|/v/a/2", "/v/a/queue|other|/v/a/3"};
    for (const std::string& queue : queues) {
        EXPECT_TRUE(Upsert(queue, "/v/\xff"));
        expected.insert(queue + "|fileindex|/v/\xff");
    }
    EXPECT_EQ(Registered(), expected);
    for (const std::string& queue : queues) {
        EXPECT_TRUE(Delete(queue));
        expected.erase(queue + "|fileindex|/v/\xff");
        EXPECT_EQ(Registered(), expected);
    }
    EXPECT_EQ(errno, 0);
}

TEST_F(MonitorQueueTest, FailedUpsertLeavesTheOldRegistration) {
    EXPECT_TRUE(Upsert("/q", "/old"));
    rlimit old_limit{};
    getrlimit(RLIMIT_FSIZE, &old_limit);
    const auto old_handler = std::signal(SIGXFSZ, SIG_IGN);
    const rlimit limit{10, old_limit.rlim_max};
    setrlimit(RLIMIT_FSIZE, &limit);
    EXPECT_FALSE(Upsert("/q", "/new"));
    EXPECT_EQ(errno, EFBIG);
    setrlimit(RLIMIT_FSIZE, &old_limit);
    std::signal(SIGXFSZ, old_handler);
    EXPECT_EQ(Registered(), Set{"/q|fileindex|/old"});
}

}  // namespace
