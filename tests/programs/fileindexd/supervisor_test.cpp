#include "programs/fileindexd/supervisor.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>

#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexd/controller.h"
#include "programs/fileindexd/state_file.h"
#include "tests/support/program.h"

namespace fs = std::filesystem;

namespace fileindexd {
namespace {

using Clock = Supervisor::Clock;
using std::chrono::seconds;
using support::Eventually;

/// Workers are small shell commands, chosen by the share's name.
std::vector<std::string> Command(const std::string& share) {
    const char* script = share == "dies"       ? "exit 3"
                         : share == "stubborn" ? "trap '' TERM; echo > /tmp/ready; exec sleep 1000"
                                               : "exec sleep 1000";
    return {"/bin/sh", "-c", script};
}

class SupervisorTest : public testing::Test {
  protected:
    bool Ends(const std::string& share) {
        return Eventually([&] {
            supervisor_.Update(now_);
            return !supervisor_.IsRunning(share);
        });
    }

    Supervisor supervisor_{Command};
    Clock::time_point now_ = Clock::now();
};

TEST_F(SupervisorTest, RunsOneWorkerForEachWantedShare) {
    supervisor_.SetWanted({"a", "b", "again"}, now_);
    const pid_t a = supervisor_.PidOf("a");
    const pid_t again = supervisor_.PidOf("again");
    ASSERT_GT(a, 0);
    supervisor_.SetWanted({"a"}, now_);
    supervisor_.SetWanted({"a", "c", "again"}, now_);  // while the old worker is still ending
    EXPECT_EQ(supervisor_.PidOf("a"), a);
    EXPECT_GT(supervisor_.PidOf("c"), 0);
    EXPECT_TRUE(Ends("b"));
    EXPECT_TRUE(Eventually([&] {
        supervisor_.Update(now_);
        return supervisor_.PidOf("again") > 0 && supervisor_.PidOf("again") != again;
    }));
}

TEST_F(SupervisorTest, ADeadWorkerIsStartedAgainLaterEachTime) {
    supervisor_.SetWanted({"dies"}, now_);
    for (const int expected : {1, 2, 4, 8}) {
        ASSERT_TRUE(Ends("dies"));
        EXPECT_EQ(supervisor_.NextUpdate(), now_ + seconds(expected));
        now_ += seconds(expected);
        supervisor_.Update(now_);
        EXPECT_TRUE(supervisor_.IsRunning("dies"));
    }
    now_ += Supervisor::kStable;  // it ends after a long life
    ASSERT_TRUE(Ends("dies"));
    EXPECT_EQ(supervisor_.NextUpdate(), now_ + Supervisor::kFirstRestart);
}

TEST_F(SupervisorTest, AWorkerThatDoesNotStopIsKilled) {
    fs::remove("/tmp/ready");
    supervisor_.SetWanted({"stubborn"}, now_);
    ASSERT_TRUE(Eventually([] { return fs::exists("/tmp/ready"); }));
    supervisor_.SetWanted({}, now_);
    supervisor_.Update(now_);
    EXPECT_TRUE(supervisor_.IsRunning("stubborn"));
    EXPECT_EQ(supervisor_.NextUpdate(), now_ + Supervisor::kStopTimeout);
    now_ += Supervisor::kStopTimeout;
    EXPECT_TRUE(Ends("stubborn"));
}

/// Which shares have a worker, as commands and configuration come.
class ControllerTest : public testing::Test {
  protected:
    ControllerTest() {
        fs::remove_all("/var/packages/Quivra");
        fs::create_directories("/var/packages/Quivra/etc");
        fs::remove_all(kRunDirectory);
        MakeRunDirectory();
    }

    static void Configure(const std::vector<std::pair<std::string, bool>>& folders) {
        Json::Value list(Json::arrayValue);
        for (const auto& [path, paused] : folders) {
            list.append(
                quivra::fileindex::Folder(path, "", true, true, true, true, paused).GetData());
        }
        ASSERT_TRUE(quivra::toFile(list, quivra::fileindex::kFileIndexFoldersCfgPath));
    }

    /// The reply to a command, given in the end.
    std::string Send(const std::string& text) {
        std::string answer;
        controller_->Execute(
            ParseCommand(text), [&](const std::string& reply) { answer = reply; }, now_);
        EXPECT_TRUE(Eventually([&] {
            controller_->Update(now_);
            return !answer.empty();
        }));
        return answer;
    }

    bool Has(const std::string& share) const { return supervisor_.IsWanted(share); }

    static std::string StateOf(const std::string& share) {
        Json::Value state;
        quivra::fromFile(state, std::string(kRunDirectory) + "/" + share + ".json");
        return state["state"].asString();
    }

    Supervisor supervisor_{Command};
    Clock::time_point now_ = Clock::now();
    std::optional<Controller> controller_;
};

TEST_F(ControllerTest, WorkersFollowTheFoldersAndEndBeforeTheAnswer) {
    Configure({{"/a/x", false}, {"/a/y", true}, {"/b", false}, {"/paused", true}});
    controller_.emplace(supervisor_);
    EXPECT_TRUE(Has("a") && Has("b") && !Has("paused"));
    EXPECT_EQ(Send(R"({"type":"worker_delete","data":{"share_name":"a"}})"), SuccessReply());
    EXPECT_FALSE(supervisor_.IsRunning("a"));
    Send(R"({"type":"notify_setting_changed","data":{"share_name":"b","is_upsert":true}})");
    EXPECT_FALSE(Has("a")) << "its folders are marked as paused only now";
    Configure({{"/a", true}});
    Send(R"({"type":"worker_create","data":{"share_name":"a"}})");
    EXPECT_TRUE(Has("a")) << "its folders are marked as unpaused only later";
    Send(R"({"type":"notify_setting_changed","data":{"share_name":"a","is_upsert":true}})");
    EXPECT_FALSE(Has("a"));
    Send(R"({"type":"notify_setting_changed","data":{"share_name":"b","is_upsert":false}})");
    EXPECT_FALSE(supervisor_.IsRunning("b")) << "it has no folder any more";
}

TEST_F(ControllerTest, ARecordedPauseLastsUntilResumedOrTheTimeIsOver) {
    Configure({{"/a", false}});
    std::ofstream(quivra::fileindex::kFileIndexStatusCfgPath) << R"({"resume_time":0})";
    controller_.emplace(supervisor_);
    EXPECT_FALSE(Has("a"));
    EXPECT_EQ(StateOf("a"), "paused");
    Send(R"({"type":"resume","data":null})");
    EXPECT_TRUE(Has("a"));

    const std::int64_t end = time(nullptr) + 1;
    Send(R"({"type":"pause","data":{"resume_time":)" + std::to_string(end) + "}}");
    EXPECT_FALSE(Has("a"));
    ASSERT_TRUE(controller_->Due(now_));
    EXPECT_LE(*controller_->Due(now_), now_ + seconds(1));
    EXPECT_TRUE(Eventually([&] {
        controller_->Update(now_);
        return Has("a");
    }));
}

TEST(ParseCommandTest, RefusesWhatIsNoCommand) {
    for (const char* text :
         {"", "[]", R"({"type":1})", R"({"type":"reboot"})",
          R"({"type":"pause","data":{"resume_time":"soon"}})", R"({"type":"worker_create"})",
          R"({"type":"worker_create","data":{"share_name":"../etc"}})",
          R"({"type":"worker_create","data":{"share_name":"a\u0000b"}})"}) {
        EXPECT_THROW(ParseCommand(text), quivra::Error) << text;
    }
}

}  // namespace
}  // namespace fileindexd
