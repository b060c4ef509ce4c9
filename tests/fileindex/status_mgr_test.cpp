#include "fileindex/status_mgr.h"

#include <functional>

#include "common/lock_file.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

class StatusMgrTest : public LibraryTest {
  protected:
    static Json::Value Stored() { return Parse(ReadFile(kFileIndexStatusCfgPath)); }
    static void Store(const std::string& text) { WriteFile(kFileIndexStatusCfgPath, text); }
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
        {2147480048, 1, 2147483648 - 4294967296},  // 32 bits wrap
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
    EXPECT_EQ(ErrorOf([] { StatusMgr().Pause(-1); }).code, 120);
    EXPECT_EQ(Stored(), Parse(R"({"resume_time":-1})"));
}

TEST_F(StatusMgrTest, FlagsAreSetClearedAndForgottenUnderTheLock) {
    Store(R"({"resume_time":7,"share":{"a":4},"other":[1]})");
    StatusMgr status;
    status.SetShareStatus("a", kShareNeedReindex);
    EXPECT_EQ(status.GetShareStatus("a"), 5U);
    status.UnsetShareStatus("a", kShareNeedReindex);
    status.UnsetShareStatus("new", kShareNeedReindex);
    EXPECT_EQ(Stored(), Parse(R"({"resume_time":7,"share":{"a":4,"new":0},"other":[1]})"));
    status.ClearShareStatus("a");
    EXPECT_EQ(Stored(), Parse(R"({"resume_time":7,"share":{"new":0},"other":[1]})"));

    // Of two objects neither takes back what the other has done.
    StatusMgr first;
    StatusMgr second;
    first.SetShareStatus("x", kShareNeedReindex);
    second.SetShareStatus("y", kShareNeedReindex);
    EXPECT_EQ(ErrorOf([&] { first.Pause(0); }).code, 502);  // nobody to tell
    second.UnsetShareStatus("new", kShareNeedReindex);
    EXPECT_EQ(Stored(), Parse(R"({"resume_time":0,"share":{"new":0,"x":1,"y":1},"other":[1]})"));
    EXPECT_EQ(second.GetPauseInfo(), 0);

    const LockFile held(kFileIndexStatusLockPath, false);
    const std::function<void()> changes[] = {
        [&] { status.Resume(); },
        [&] { status.SetShareStatus("s", kShareNeedReindex); },
        [&] { status.UnsetShareStatus("new", kShareNeedReindex); },
        [&] { status.ClearShareStatus("new"); },
    };
    for (const auto& change : changes) {
        EXPECT_EQ(ErrorOf(change).code, 506);
    }
}

TEST_F(StatusMgrTest, MembersOfWrongTypesCountAsAbsentAndAreReplaced) {
    for (const char* text :
         {"[]", R"({"share":[1,2]})", R"({"share":{"s":"1"}})", R"({"share":{"s":-1}})",
          R"({"resume_time":"soon","share":null})", R"({"resume_time":1e300})"}) {
        Store(text);
        EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << text;
        EXPECT_EQ(StatusMgr().GetShareStatus("s"), 0U) << text;
        StatusMgr().SetShareStatus("s", kShareNeedReindex);
        EXPECT_EQ(Stored()["share"]["s"].asUInt(), 1U) << text;
        Store(text);
        StatusMgr().ClearShareStatus("s");
        EXPECT_FALSE(Stored()["share"].isMember("s")) << text;
    }
    Store("{");
    EXPECT_EQ(ErrorOf([] { StatusMgr(); }).code, 504) << "a broken file is not an empty one";
}

}  // namespace
}  // namespace quivra::fileindex
