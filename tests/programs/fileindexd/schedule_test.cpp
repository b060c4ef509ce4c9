#include "programs/fileindexd/schedule.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "programs/fileindexd/queue_watch.h"

namespace fileindexd {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr Clock::time_point kStart{};

TEST(ScheduleTest, ABurstIsWaitedOutButNotForever) {
    struct Case {
        const char* name;
        std::vector<int> changes;  // milliseconds
        int due;
    };
    const Case cases[] = {
        {"a lone change", {0}, 200},
        {"a short burst", {0, 100, 250}, 450},
        {"a burst without end",
         {0, 150, 300, 450, 600, 750, 900, 1050, 1200, 1350, 1500, 1650, 1800, 1950},
         2000},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.name);
        Schedule schedule;
        schedule.QueueChanged(kStart - seconds(1));
        EXPECT_EQ(schedule.Due(), kStart - seconds(1)) << "nobody waits for the first change";
        schedule.PassBegins();
        schedule.PassSucceeded(kStart);
        EXPECT_FALSE(schedule.Due());
        for (const int change : test.changes) {
            schedule.QueueChanged(kStart + milliseconds(change));
        }
        EXPECT_EQ(schedule.Due(), kStart + milliseconds(test.due));
        schedule.PassBegins();
        EXPECT_FALSE(schedule.Due());
        const Clock::time_point later = kStart + seconds(9);
        schedule.PassSucceeded(later);
        schedule.QueueChanged(later + Schedule::kQuiet);
        EXPECT_EQ(schedule.Due(), later + Schedule::kQuiet) << "it has been calm";
    }
    Schedule busy;
    busy.QueueChangedLater(kStart + seconds(20));
    busy.QueueChangedLater(kStart + seconds(10));
    EXPECT_EQ(busy.Due(), kStart + seconds(10));
}

TEST(ScheduleTest, AFailedPassIsRepeatedLaterEachTime) {
    Schedule schedule;
    Clock::time_point now = kStart;
    for (const int expected : {1, 2, 4, 8, 16, 32, 64, 128, 256, 300, 300, 300}) {
        schedule.PassBegins();
        schedule.PassFailed(now);
        schedule.QueueChanged(now);  // changes are no reason to hurry
        EXPECT_EQ(schedule.Due(), now + seconds(expected));
        now += seconds(expected);
    }
    schedule.PassBegins();
    schedule.PassSucceeded(now);
    EXPECT_FALSE(schedule.Due());
}

TEST(ChangeRatesTest, AFileThatKeepsChangingWaitsLongerEachTime) {
    ChangeRates rates;
    Clock::time_point now = kStart;
    for (const int expected : {0, 2, 4, 8, 16, 30, 30}) {
        EXPECT_EQ(rates.NotBefore("/other", now), now);
        rates.Indexed("/log", now);
        const Clock::time_point due = rates.NotBefore("/log", now);
        EXPECT_EQ(due, now + seconds(expected));
        now = due + seconds(1);
    }
    now += 3 * ChangeRates::kLongestWait;
    EXPECT_EQ(rates.NotBefore("/log", now), now) << "it has been calm";
    rates.Indexed("/log", now);
    EXPECT_EQ(rates.NotBefore("/log", now), now);
}

TEST(QueueWatchTest, NewLinesAboutBusyFilesWait) {
    const std::string directory = "/var/queue_test";
    std::filesystem::create_directories(directory);
    const auto place = quivra::base::PrivateDirectory::Open(directory);
    ASSERT_TRUE(place.IsValid()) << place.Problem();
    QueueWatch watch(place, "queue");
    ChangeRates rates;
    rates.Indexed("/busy", kStart);
    rates.Indexed("/busy", kStart);
    Schedule schedule;
    const auto append = [&](const char* text) {
        std::ofstream(directory + "/queue", std::ios::app) << text;
        EXPECT_TRUE(watch.Read().queue);
        watch.ReadNewLines(schedule, rates, kStart);
    };
    append(R"({"event":2,"pa)");
    EXPECT_FALSE(schedule.Due()) << "half a line";
    append("th\":\"/busy\"}\n");
    EXPECT_EQ(schedule.Due(), kStart + ChangeRates::kShortestWait);
    append("garbage\n");
    EXPECT_EQ(schedule.Due(), kStart);
    std::ofstream(directory + "/queue.backlog");
    EXPECT_FALSE(watch.Read().gone);
    std::filesystem::remove_all(directory);
    EXPECT_TRUE(watch.Read().gone);
}

}  // namespace
}  // namespace fileindexd
