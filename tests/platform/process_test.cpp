#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/process.h>
#include <kesto/service.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <vector>

#include "platform/standalone/run_program.h"
#include "tests/platform/platform_test.h"
#include "tests/support/program.h"

namespace {

using namespace platform_test;

class ProcessTest : public PlatformTest {};

TEST_F(ProcessTest, ReportsHowTheProgramEnded) {
    EXPECT_EQ(KLIBCExecl("/bin/sh", 187, "-c", "exit 7", nullptr), 7);
    EXPECT_EQ(KLIBCExecl("/bin/sh", 0, "-c", "kill -9 $$", nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    EXPECT_EQ(KLIBCExecl("/bin/no-such-program", 0, "a", nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_INSTALLED);
    EXPECT_EQ(KLIBCExecl("/etc/passwd", 0, nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
    EXPECT_EQ(errno, EACCES);
    std::string output;
    EXPECT_EQ(kesto::RunProgram("/bin/sh", {"-c", "head -c 1000000 /dev/zero; exit 3"}, &output),
              3);
    EXPECT_EQ(output.size(), 65536U);
}

TEST_F(ProcessTest, PassesNoDescriptors) {
    const int leak = open("/etc/passwd", O_RDONLY);  // not close-on-exec
    ASSERT_GE(fcntl(leak, F_DUPFD, 200), 200);
    std::string output;
    EXPECT_EQ(kesto::RunProgram("/bin/ls", {"/proc/self/fd"}, &output), 0);
    EXPECT_EQ(output, "0\n1\n2\n3\n");  // the last one is the directory itself
    close(200);
    close(leak);
}

TEST_F(ProcessTest, ExitStatusSurvivesTheCallersChildHandling) {
    const auto reap_all = [](int /*signal*/) {
        while (waitpid(-1, nullptr, WNOHANG) > 0) {
        }
    };
    for (const sighandler_t handler : {SIG_IGN, static_cast<sighandler_t>(reap_all)}) {
        const auto old_handler = std::signal(SIGCHLD, handler);
        EXPECT_EQ(KLIBCExecl("/bin/sh", 0, "-c", "/bin/true; exit 5", nullptr), 5);
        std::signal(SIGCHLD, old_handler);
    }
    EXPECT_EQ(waitpid(-1, nullptr, WNOHANG | __WALL), -1);  // nothing is left behind
}

TEST_F(ProcessTest, ServicesAreRunByTheirManager) {
    WriteFile("/etc/init.d/pkg-test",
              "#!/bin/sh\nwhile [ ! -e /volume1/go ]; do sleep 0.01; done\n"
              "echo $1 >>/volume1/done\n[ $1 != stop ]\n");
    chmod("/etc/init.d/pkg-test", 0755);
    EXPECT_EQ(KLIBServiceStop("pkg-test", 0), 0);  // does not wait
    EXPECT_FALSE(std::filesystem::exists("/volume1/done"));
    WriteFile("/volume1/go", "");
    EXPECT_TRUE(support::Eventually([] { return ReadFile("/volume1/done") == "stop\n"; }));
    EXPECT_EQ(KLIBServiceRestart("pkg-test"), 0);
    EXPECT_EQ(ReadFile("/volume1/done"), "stop\nrestart\n");
    EXPECT_EQ(KLIBServicectlStop("pkg-test", KLIB_SERVICECTL_UPSTART), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    EXPECT_EQ(KLIBServiceStop("pkg-none", 1), 0);
    EXPECT_EQ(KLIBServiceStart("pkg-none", 1), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_FOUND);
    for (const char* name : {"", "-x", "../evil", "a;b"}) {
        EXPECT_EQ(KLIBServiceStart(name, 1), -1) << name;
        EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_BAD_ARGUMENT);
    }
}

TEST_F(ProcessTest, SystemdIsAskedWhetherThereIsSuchAService) {
    WriteFile("/volume1/systemctl",
              "#!/bin/sh\necho $* >>/volume1/calls\n"
              "case $* in *none) echo not-found;; *) echo loaded;; esac\n");
    chmod("/volume1/systemctl", 0755);
    const Mount fake("/volume1/systemctl", "/usr/bin/systemctl", nullptr, MS_BIND);
    if (!fake.IsMounted()) {
        GTEST_SKIP() << "no systemctl";
    }
    std::filesystem::create_directories("/run/systemd/system");
    EXPECT_EQ(KLIBServicectlStart("pkg-none", KLIB_SERVICECTL_UPSTART), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_FOUND);
    EXPECT_EQ(KLIBServicectlStart("pkg-test", KLIB_SERVICECTL_UPSTART), 0);
    std::filesystem::remove_all("/run/systemd");
    EXPECT_NE(ReadFile("/volume1/calls").find("start pkg-test.service"), std::string::npos)
        << ReadFile("/volume1/calls");
}

}  // namespace
