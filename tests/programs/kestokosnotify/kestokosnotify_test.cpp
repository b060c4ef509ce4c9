#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>
#include <utmpx.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>

#include "programs/kestokosnotify/message.h"
#include "programs/kestokosnotify/notice.h"
#include "tests/fake/fake_libc.h"
#include "tests/support/program.h"

namespace {

/// A terminal that somebody is logged in at.
class Terminal {
  public:
    explicit Terminal(const char* user) {
        master_ = posix_openpt(O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC);
        EXPECT_TRUE(grantpt(master_) == 0 && unlockpt(master_) == 0);
        slave_ = open(ptsname(master_), O_RDWR | O_NOCTTY | O_CLOEXEC);
        LogIn(user, ptsname(master_) + std::strlen("/dev/"));
    }
    ~Terminal() {
        close(slave_);
        close(master_);
    }

    static void LogIn(const char* user, const char* line) {
        static char id = 'a';  // a record replaces one of the same id
        utmpx entry{};
        entry.ut_type = USER_PROCESS;
        entry.ut_pid = getpid();
        entry.ut_id[0] = id++;
        std::snprintf(entry.ut_user, sizeof(entry.ut_user), "%s", user);
        std::snprintf(entry.ut_line, sizeof(entry.ut_line), "%s", line);
        setutxent();
        EXPECT_NE(pututxline(&entry), nullptr);
        endutxent();
    }

    std::string Shown() const {
        char buffer[4096];
        const ssize_t size = read(master_, buffer, sizeof(buffer));
        return size < 0 ? "" : std::string(buffer, static_cast<std::size_t>(size));
    }
    int slave() const { return slave_; }

  private:
    int master_;
    int slave_;
};

class NotifyTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetLibc();
        std::ofstream("/run/utmp").flush();  // truncates
        std::ofstream("/etc/passwd") << "root:x:0:0::/root:/bin/sh\nalice:x:1026:100::/:/bin/sh\n"
                                        "boss:x:1027:100::/:/bin/sh\n";
        std::ofstream("/etc/group") << "administrators:x:2002:boss\n";
    }
};

TEST_F(NotifyTest, ReachesAdministratorsAsTheLibraryCallsIt) {
    const Terminal root("root");
    const Terminal boss("boss");
    const Terminal alice("alice");
    const auto outcome = support::RunProgram(
        "kestokosnotify",
        {"-c", "KESTO.Quivra.Application", "-b", "true", "-e", "false", "@administrators",
         "app:displayname", "error:index_no_space",
         "<a data-kesto-app=\"KESTO.Quivra.Application\" data-kesto-fn=\"preference\">", "</a>"});
    EXPECT_EQ(outcome.status, 0) << outcome.output;
    const std::string shown = root.Shown();
    EXPECT_NE(shown.find("Quivra: Files are no longer indexed"), std::string::npos) << shown;
    EXPECT_NE(shown.find("in the index preferences."), std::string::npos) << shown;
    EXPECT_EQ(boss.Shown(), shown);
    EXPECT_EQ(alice.Shown(), "");

    EXPECT_EQ(support::RunProgram("kestokosnotify", {"-c", "KESTO.Quivra.Application", "alice",
                                                     "app:displayname", "error:lack_of_memory"})
                  .status,
              0);
    EXPECT_NE(alice.Shown().find("Quivra: Indexing waits"), std::string::npos);
    EXPECT_EQ(support::RunProgram("kestokosnotify", {"-c", "x", "@administrators"}).status, 2);
    EXPECT_EQ(support::RunProgram("kestokosnotify", {"--help"}).status, 0);
}

TEST_F(NotifyTest, LogKeepsTheLink) {
    EXPECT_EQ(notify::Send({"App",
                            "@administrators",
                            "app:displayname",
                            "error:index_no_space",
                            {"<a href=\"#\">", "</a>"}}),
              0);
    EXPECT_EQ(fake::LogLinesWith("App to @administrators: Quivra: Files are").size(), 1U);
    EXPECT_EQ(fake::LogLinesWith("<a href=\"#\">index preferences</a>").size(), 1U);
}

TEST_F(NotifyTest, OddLoginRecordsAreLeftOut) {
    std::ofstream("/tmp/file") << "old";
    for (const char* line : {"../tmp/file", "/tmp/file", "", "null", "pts/no-such", "pts"}) {
        Terminal::LogIn("root", line);
    }
    const Terminal root("root");
    Terminal::LogIn("root", ttyname(root.slave()) + std::strlen("/dev/"));  // once more
    EXPECT_EQ(notify::Send({"App", "root", "title", "message", {}}), 1);
    EXPECT_EQ(root.Shown(), "\r\r\n\atitle: message\r\r\n");
    std::string content;
    std::ifstream("/tmp/file") >> content;
    EXPECT_EQ(content, "old");
}

TEST_F(NotifyTest, StoppedTerminalHoldsNobodyUp) {
    const Terminal stopped("root");
    const Terminal running("root");
    tcflow(stopped.slave(), TCOOFF);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(notify::Send({"App", "root", "title", "message", {}}), 1);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
    EXPECT_NE(running.Shown(), "");
}

TEST_F(NotifyTest, MessagesResolve) {
    using notify::PlainText;
    using notify::ResolveMessage;
    EXPECT_EQ(ResolveMessage("app:displayname"), "Quivra");
    EXPECT_EQ(ResolveMessage("error:{0}", {"x"}), "error:{0}");  // not a known key
    for (const char* key : {"error:index_no_space", "error:lack_of_memory"}) {
        EXPECT_NE(ResolveMessage(key), key);
        EXPECT_EQ(ResolveMessage(key).find('{'), std::string::npos);
    }
    EXPECT_EQ(PlainText("a\x1b[2J<b>c</b>\n<open"), "a [2Jc ");
}

}  // namespace
