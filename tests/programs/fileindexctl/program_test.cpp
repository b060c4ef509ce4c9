// The real program: what only shows between processes.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <thread>

#include "tests/fake/scripted_server.h"
#include "tests/support/files.h"
#include "tests/support/program.h"

namespace {

using support::WriteFile;

TEST(ProgramTest, ShowsAQueueAndReportsFailures) {
    WriteFile("/tmp/queue", "{\"event\":64,\"path\":\"/v/s/a\"}\nbad line\n");
    const support::Outcome shown =
        support::RunProgram("fileindexctl", {"queue", "show", "/tmp/queue"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_EQ(shown.output, "[02] /v/s/a\nconsumed: 1\n");  // the library's log stays in the log
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show", "/tmp/none"}).status, 1);
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show"}).status, 2);
}

TEST(ProgramTest, ShellsCompleteByAskingTheProgram) {
    const std::string script = FILEINDEX_SOURCE_DIR "/packaging/completions/fileindexctl.";
    const std::string path = "PATH=" FILEINDEX_BIN_DIR ":$PATH ";
    const std::pair<const char*, std::string> shells[] = {
        {"bash", "bash -c '. " + script +
                     "bash; COMP_WORDS=(fileindexctl folder re); COMP_CWORD=2; "
                     "_fileindexctl; echo ${COMPREPLY[@]}'"},
        {"fish", "fish --no-config -c 'source " + script +
                     "fish; complete -C \"fileindexctl folder re\" | cut -f1'"},
        {"zsh",
         "zsh -f -c '_describe() { print -r -- ${${(P)2}%%:*}; }; words=(fileindexctl folder re);"
         " CURRENT=3; . " +
             script + "zsh'"},
    };
    for (const auto& [shell, call] : shells) {
        if (std::system((std::string("command -v ") + shell + " >/dev/null").c_str()) != 0) {
            continue;  // bash is always there
        }
        ASSERT_EQ(std::system((path + call + " >/tmp/completed").c_str()), 0) << shell;
        std::string completed;
        std::ifstream("/tmp/completed") >> completed;
        EXPECT_EQ(completed, "reindex") << shell;
    }
}

TEST(ProgramTest, AReaderMayGoAwayButAFullDiskIsAFailure) {
    std::string queue;
    for (int i = 0; i < 20000; ++i) {
        queue += "{\"event\":64,\"path\":\"/v/s/" + std::to_string(i) + "\"}\n";
    }
    WriteFile("/tmp/queue", queue);
    const std::string call = FILEINDEX_BIN_DIR "/fileindexctl queue show /tmp/queue";
    const std::string piped =
        "{ " + call + "; echo $? >/tmp/status; } 2>/tmp/errors | head -1 >/tmp/first";
    ASSERT_EQ(std::system(piped.c_str()), 0);
    std::string status;
    std::ifstream("/tmp/status") >> status;
    EXPECT_EQ(status, "0");
    EXPECT_EQ(std::filesystem::file_size("/tmp/errors"), 0U);
    EXPECT_EQ(WEXITSTATUS(std::system((call + " >/dev/full 2>/tmp/errors").c_str())), 1);
    EXPECT_GT(std::filesystem::file_size("/tmp/errors"), 0U);
}

/// Runs the command beside a daemon that takes the request and then ends: within how many seconds
/// it noticed, and what it said.
class WaitingTest : public testing::Test {
  protected:
    WaitingTest() {
        std::filesystem::remove_all("/var/packages/Quivra");
        std::filesystem::create_directories("/var/packages/Quivra/etc");
        std::filesystem::create_directories("/etc/kesto");
        std::filesystem::create_directories("/volume1/s");
        std::filesystem::create_directories("/var/lib/kesto");
        WriteFile("/etc/kesto/shares.conf", "[s]\npath = /volume1/s\n");
    }

    static support::Outcome RunInTime(const std::vector<std::string>& arguments) {
        const auto begin = std::chrono::steady_clock::now();
        support::Outcome outcome = support::RunProgram("fileindexctl", arguments);
        EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(4));
        return outcome;
    }

    static bool IsFree(const char* lock) {
        const int fd = open(lock, O_RDWR | O_CLOEXEC);
        const bool is_free = fd >= 0 && flock(fd, LOCK_EX | LOCK_NB) == 0;
        close(fd);
        return is_free;
    }
};

TEST_F(WaitingTest, ADaemonThatGoesIsNoticedAndNoLockIsLeft) {
    fake::ScriptedServer search("/var/run/kestoelasticd.sock");
    fake::ScriptedServer indexer("/var/run/fileindexd.sock");
    const std::pair<std::vector<std::string>, const char*> rows[] = {
        {{"pause"}, "/tmp/quivra_cfg_fi_status.lock"},
        {{"folder", "add", "/s"}, "/tmp/quivra_cfg_folder.lock"},
    };
    for (const auto& [arguments, lock] : rows) {
        indexer.Then({"", true, false});  // it reads the request and closes the connection
        const support::Outcome outcome = RunInTime(arguments);
        EXPECT_EQ(outcome.status, 1);
        EXPECT_NE(outcome.output.find("fileindexd has gone"), std::string::npos) << outcome.output;
        EXPECT_TRUE(IsFree(lock));
    }
}

TEST_F(WaitingTest, ABusySearchDaemonThatGoesEndsTheLongSleep) {
    auto search = std::make_unique<fake::ScriptedServer>("/var/run/kestoelasticd.sock");
    std::atomic<bool> asked = false;
    search->SetHandler([&asked](const Json::Value&) {
        asked = true;
        return fake::Frame(R"({"success":false,"error":{"code":1401,"msg":"busy"}})");
    });
    fake::ScriptedServer indexer("/var/run/fileindexd.sock");
    support::Program command("fileindexctl", {"folder", "add", "/s"});
    ASSERT_TRUE(support::Eventually([&asked] { return asked.load(); }));
    std::this_thread::sleep_for(std::chrono::milliseconds(500));  // it has looked at the socket
    search.reset();
    EXPECT_TRUE(
        support::Eventually([&command] { return !command.IsRunning(); }, std::chrono::seconds(3)));
    EXPECT_EQ(command.Wait(), 1);
    EXPECT_TRUE(IsFree("/tmp/quivra_cfg_folder.lock"));
}

TEST(ProgramTest, WhoIsNotRootLearnsThatAndLeavesNothing) {
    const std::string as_nobody = "setpriv --reuid 65534 --clear-groups ";
    if (std::system((as_nobody + "true 2>/dev/null").c_str()) != 0) {
        GTEST_SKIP() << "this namespace has one user only";
    }
    for (const char* command : {"pause", "status", "search x", "folder list", "share list"}) {
        const std::string call =
            as_nobody + FILEINDEX_BIN_DIR "/fileindexctl " + command + " >/tmp/out 2>&1";
        EXPECT_EQ(WEXITSTATUS(std::system(call.c_str())), 1);
        std::ifstream out("/tmp/out");
        std::string line;
        std::getline(out, line);
        EXPECT_NE(line.find("permission denied, run it as root"), std::string::npos) << line;
    }
}

}  // namespace
