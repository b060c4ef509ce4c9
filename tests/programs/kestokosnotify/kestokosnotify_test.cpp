#include <fcntl.h>
#include <gtest/gtest.h>
#include <termios.h>
#include <unistd.h>
#include <utmpx.h>

#include <cstdlib>
#include <cstring>

#include "programs/kestokosnotify/message.h"
#include "programs/kestokosnotify/notice.h"
#include "tests/fake/fake_libc.h"
#include "tests/support/files.h"
#include "tests/support/program.h"

namespace {

void LogIn(const char* user, const char* line) {
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

/// A terminal that somebody is logged in at.
struct Terminal {
    explicit Terminal(const char* user) {
        EXPECT_TRUE(grantpt(master) == 0 && unlockpt(master) == 0);
        slave = open(ptsname(master), O_RDWR | O_NOCTTY | O_CLOEXEC);
        LogIn(user, ptsname(master) + std::strlen("/dev/"));
    }
    ~Terminal() {
        close(slave);
        close(master);
    }
    std::string Shown() const {
        char buffer[4096];
        const ssize_t size = read(master, buffer, sizeof(buffer));
        return size < 0 ? "" : std::string(buffer, static_cast<std::size_t>(size));
    }

    const int master = posix_openpt(O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC);
    int slave = -1;
};

class NotifyTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetLibc();
        support::WriteFile("/run/utmp", "");
        support::WriteFile("/etc/passwd",
                           "root:x:0:0::/root:/bin/sh\nalice:x:1026:100::/:/bin/sh\n"
                           "boss:x:1027:100::/:/bin/sh\n");
        support::WriteFile("/etc/group", "administrators:x:2002:boss\n");
    }
};

TEST_F(NotifyTest, ReachesAdministratorsAsTheLibraryCallsIt) {
    const Terminal root("root");
    const Terminal boss("boss");
    const Terminal alice("alice");
    const auto outcome = support::RunProgram(
        "kestokosnotify",
        {"-c", "KESTO.Quivra.Application", "-b", "true", "-e", "false", "@administrators",
         "app:displayname", "error:index_no_space", "<a data-kesto-fn=\"preference\">", "</a>"});
    EXPECT_EQ(outcome.status, 0) << outcome.output;
    const std::string shown = root.Shown();
    EXPECT_NE(shown.find("Quivra: Files are no longer indexed"), std::string::npos) << shown;
    EXPECT_NE(shown.find("in the index preferences."), std::string::npos) << shown;
    EXPECT_EQ(boss.Shown(), shown);
    EXPECT_EQ(alice.Shown(), "");
    EXPECT_EQ(support::RunProgram("kestokosnotify", {"-c", "x", "@administrators"}).status, 2);
}

TEST_F(NotifyTest, OddLoginsAndStoppedTerminalsAreLeftOut) {
    support::WriteFile("/tmp/file", "old");
    for (const char* line : {"../tmp/file", "/tmp/file", "", "null", "pts/no-such", "pts"}) {
        LogIn("root", line);
    }
    const Terminal stopped("root");
    tcflow(stopped.slave, TCOOFF);
    const Terminal root("root");
    LogIn("root", ttyname(root.slave) + std::strlen("/dev/"));  // once more
    EXPECT_EQ(notify::Send(
                  {"App\n", "root", "<b>title</b>", "a\x1b[2Jc\n\u00fc\xc2\x9b\x9b\xc3<open", {}}),
              1);
    EXPECT_EQ(root.Shown(), "\r\r\n\atitle: a [2Jc \u00fc ??\r\r\n");
    EXPECT_EQ(support::ReadFile("/tmp/file"), "old");
    EXPECT_EQ(fake::LogLinesWith("App  to root: <b>title</b>: a [2Jc").size(),
              1U);  // the log keeps links
}

}  // namespace
