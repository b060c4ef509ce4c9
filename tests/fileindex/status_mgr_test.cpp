#include "fileindex/status_mgr.h"

#include <sys/stat.h>

#include <functional>

#include "common/lock_file.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

class StatusMgrTest : public LibraryTest {
  protected:
    static std::string File() { return ReadFile(kFileIndexStatusCfgPath); }
    static void SetFile(const std::string& text) { WriteFile(kFileIndexStatusCfgPath, text); }
};

TEST_F(StatusMgrTest, PauseIsStoredAndTold) {
    struct Row {
        std::int64_t now;
        int hours;
        std::int64_t resume_time;
    };
    const Row rows[] = {
        {1000, 0, 0},
        {1000, 2, 8200},
        // 32 bits: 2^31 - 1 - 3599 + 3600 wraps, 596524 hours are more than 2^31 seconds, and a
        // clock beyond 2038 counts in 32 bits too.
        {2147480048, 1, 2147483648 - 4294967296},
        {0, 596524, 2147486400 - 4294967296},
        {4294967296 + 5, 1, 3605},
    };
    fake::ScriptedServer daemon(kDaemonSocket);
    for (const Row& row : rows) {
        fake::SetTime(row.now);
        StatusMgr().Pause(row.hours);
        EXPECT_EQ(StatusMgr().GetPauseInfo(), row.resume_time) << row.hours;
        const Json::Value request = daemon.Requests().back();
        EXPECT_EQ(request["type"], "pause");
        EXPECT_EQ(request["data"]["resume_time"].asInt64(), row.resume_time);
    }
    StatusMgr().Resume();
    EXPECT_EQ(daemon.Requests().back(), Parse(R"({"type":"resume","data":null})"));
    EXPECT_EQ(Parse(File()), Parse(R"({"resume_time":-1})"));

    const Error error = ErrorOf([] { StatusMgr().Pause(-1); });
    EXPECT_EQ(error.code, 120);
    EXPECT_EQ(error.reason, "Pause length should NOT be negative");
    EXPECT_EQ(Parse(File()), Parse(R"({"resume_time":-1})"));
}

TEST_F(StatusMgrTest, FlagsAreSetClearedAndForgotten) {
    SetFile(R"({"resume_time":7,"share":{"a":4},"other":[1]})");
    StatusMgr status;
    status.SetShareStatus("a", kShareNeedReindex);
    status.SetShareStatus("a", kShareNeedReindex);
    EXPECT_EQ(status.GetShareStatus("a"), 5U);
    status.UnsetShareStatus("a", kShareNeedReindex);
    status.UnsetShareStatus("new", kShareNeedReindex);
    EXPECT_EQ(Parse(File()), Parse(R"({"resume_time":7,"share":{"a":4,"new":0},"other":[1]})"));
    status.ClearShareStatus("a");
    status.ClearShareStatus("absent");
    EXPECT_EQ(Parse(File()), Parse(R"({"resume_time":7,"share":{"new":0},"other":[1]})"));
    struct stat info {};
    ASSERT_EQ(stat(kFileIndexStatusCfgPath, &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0644U);
}

TEST_F(StatusMgrTest, MembersOfWrongTypesCountAsAbsentAndAreReplaced) {
    for (const char* text :
         {"null", "[]", "5", "\"x\"", R"({"share":[1,2]})", R"({"share":"s"})",
          R"({"share":{"s":"1"}})", R"({"share":{"s":[]}})", R"({"share":{"s":-1}})",
          R"({"resume_time":"soon","share":null})", R"({"resume_time":1e300})",
          R"({"resume_time":99999999999999999999})", R"({"resume_time":1.5})"}) {
        SetFile(text);
        EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << text;
        EXPECT_EQ(StatusMgr().GetShareStatus("s"), 0U) << text;
        StatusMgr().SetShareStatus("s", kShareNeedReindex);
        EXPECT_EQ(Parse(File())["share"]["s"].asUInt(), 1U) << text;
        SetFile(text);
        StatusMgr().ClearShareStatus("s");
        EXPECT_FALSE(Parse(File())["share"].isMember("s")) << text;
    }
}

TEST_F(StatusMgrTest, FilesThatCannotBeReadOrWrittenAreErrors) {
    for (const char* text : {"{", "", "{} {}"}) {
        SetFile(text);
        const Error error = ErrorOf([] { StatusMgr(); });
        EXPECT_EQ(error.code, 504);
        EXPECT_EQ(error.reason, std::string("Cannot load json: ") + kFileIndexStatusCfgPath);
    }
    EXPECT_EQ(fake::LogLinesWith("[IsFileExist(kFileIndexStatusCfgPath) && "
                                 "!data_.fromFile(kFileIndexStatusCfgPath)]")
                  .size(),
              3U);
    std::filesystem::remove_all("/var/packages/Quivra/etc");
    const Error error = ErrorOf([] { StatusMgr().SetShareStatus("s", kShareNeedReindex); });
    EXPECT_EQ(error.code, 505);
    EXPECT_EQ(error.reason, std::string("Failed to save json: ") + kFileIndexStatusCfgPath);
    EXPECT_EQ(fake::LogLinesWith("status_mgr.cpp:121 ").size(), 1U);
    fake::FailNext("ResetCredentialsByName");
    EXPECT_EQ(ErrorOf([] { StatusMgr().Save(); }).code, 503);
}

TEST_F(StatusMgrTest, EveryChangeWaitsForTheLock) {
    StatusMgr status;
    const LockFile held(kFileIndexStatusLockPath, true);
    const std::function<void()> changes[] = {
        [&] { status.Pause(0); },
        [&] { status.Resume(); },
        [&] { status.SetShareStatus("s", kShareNeedReindex); },
        [&] { status.UnsetShareStatus("s", kShareNeedReindex); },
        [&] { status.ClearShareStatus("s"); },
    };
    for (const auto& change : changes) {
        EXPECT_EQ(ErrorOf(change).code, 506);
    }
    EXPECT_FALSE(std::filesystem::exists(kFileIndexStatusCfgPath));
}

}  // namespace
}  // namespace quivra::fileindex
