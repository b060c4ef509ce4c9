#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/process.h>
#include <kesto/service.h>
#include <sys/mount.h>
#include <sys/wait.h>
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
    errno = 0;
    EXPECT_EQ(KLIBCExecl("/bin/true", 187, nullptr), 0);
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(KLIBCExecl("/bin/sh", 187, "-c", "exit 7", nullptr), 7);
    EXPECT_EQ(KLIBCExecl("/bin/sh", 0, "-c", "kill -9 $$", nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    EXPECT_EQ(KLIBCExecl("/bin/no-such-program", 0, "a", nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_INSTALLED);
    EXPECT_EQ(KLIBCExecl("/etc/passwd", 0, nullptr), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
    EXPECT_EQ(errno, EACCES);
    EXPECT_EQ(KLIBCExecl("true", 0, nullptr), -1);  // no search along PATH
}

TEST_F(ProcessTest, HandsArgumentsOverAsTheyAre) {
    std::string output;
    const std::vector<std::string> arguments{"[%s]", "a b", "", "$HOME; rm *", "'\"\\\n", "\xff"};
    EXPECT_EQ(kesto::RunProgram("/usr/bin/printf", arguments, &output), 0);
    EXPECT_EQ(output, "[a b][][$HOME; rm *]['\"\\\n][\xff]");
    WriteFile("/volume1/dir/with space/x", "");
    const char* const rm[] = {"-rf", "/volume1/dir/with space", "/volume1/absent", nullptr};
    EXPECT_EQ(KLIBCExec("/bin/rm", rm), 0);
    EXPECT_TRUE(std::filesystem::is_empty("/volume1/dir"));
    output.clear();
    EXPECT_EQ(kesto::RunProgram("/bin/sh", {"-c", "head -c 1000000 /dev/zero; exit 3"}, &output),
              3);
    EXPECT_EQ(output.size(), 65536U);
}

TEST_F(ProcessTest, PassesNoDescriptorsAndNoSignalHandling) {
    const int leak = open("/etc/passwd", O_RDONLY);  // not close-on-exec
    ASSERT_GE(fcntl(leak, F_DUPFD, 200), 200);
    const auto old_handler = std::signal(SIGTERM, SIG_IGN);
    sigset_t blocked;
    sigset_t old_mask;
    sigemptyset(&blocked);
    sigaddset(&blocked, SIGINT);
    pthread_sigmask(SIG_BLOCK, &blocked, &old_mask);
    std::string output;
    EXPECT_EQ(kesto::RunProgram("/bin/ls", {"/proc/self/fd"}, &output), 0);
    EXPECT_EQ(output, "0\n1\n2\n3\n");  // the last one is the directory itself
    output.clear();
    EXPECT_EQ(kesto::RunProgram("/bin/grep", {"-E", "Sig(Blk|Ign)", "/proc/self/status"}, &output),
              0);
    ASSERT_EQ(output.substr(0, 33), "SigBlk:\t0000000000000000\nSigIgn:\t");
    // The C library's own two signals, 32 and 33, are none of ours.
    EXPECT_EQ(std::stoull(output.substr(33), nullptr, 16) & 0x7fffffff, 0U) << output;
    sigset_t now;
    pthread_sigmask(SIG_SETMASK, &old_mask, &now);
    EXPECT_TRUE(sigismember(&now, SIGINT) == 1 && sigismember(&now, SIGTERM) == 0);
    std::signal(SIGTERM, old_handler);
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

class ServiceTest : public PlatformTest {
  protected:
    /// A service that notes what it is asked for once /volume1/go is there.
    static void SetUpTestSuite() {
        WriteFile("/etc/init.d/pkg-test",
                  "#!/bin/sh\nwhile [ ! -e /volume1/go ]; do sleep 0.01; done\n"
                  "echo $1 >>/volume1/done\n[ $1 != stop ]\n");
        chmod("/etc/init.d/pkg-test", 0755);
    }
};

TEST_F(ServiceTest, RunsTheServiceManager) {
    WriteFile("/volume1/go", "");
    EXPECT_EQ(KLIBServiceRestart("pkg-test"), 0);
    EXPECT_EQ(KLIBServiceStart("pkg-test", 1), 0);
    EXPECT_EQ(KLIBServicectlStart("pkg-test", KLIB_SERVICECTL_UPSTART), 0);
    EXPECT_EQ(KLIBServicectlStop("pkg-test", KLIB_SERVICECTL_UPSTART), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    EXPECT_EQ(ReadFile("/volume1/done"), "restart\nstart\nstart\nstop\n");
    EXPECT_EQ(KLIBServiceStart("no-such-service", 1), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    for (const char* name : {"", "-x", "../evil", "a b", "a;b", "a/b"}) {
        EXPECT_EQ(KLIBServiceStart(name, 1), -1) << name;
        EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_BAD_ARGUMENT);
    }
}

TEST_F(ServiceTest, ReturnsAtOnceWithoutWait) {
    EXPECT_EQ(KLIBServiceStop("pkg-test", 0), 0);
    EXPECT_EQ(KLIBServiceStart("pkg-test", 0), 0);
    EXPECT_FALSE(std::filesystem::exists("/volume1/done"));
    WriteFile("/volume1/go", "");
    EXPECT_TRUE(support::Eventually([] { return ReadFile("/volume1/done").size() == 11; }));
}

/// Samba's tools, played by scripts that are laid over /usr/bin.
class SpotlightTest : public PlatformTest {
  protected:
    static void AddTool(const std::string& name, const std::string& script) {
        WriteFile("/volume1/tools/" + name, "#!/bin/sh\n" + script);
        chmod(("/volume1/tools/" + name).c_str(), 0755);
    }
    /// False where overlays cannot be mounted.
    bool LayOver() {
        is_mounted_ = mount("tools", "/usr/bin", "overlay", MS_RDONLY,
                            "lowerdir=/volume1/tools:/usr/bin") == 0;
        return is_mounted_;
    }
    void TearDown() override {
        if (is_mounted_) {
            umount2("/usr/bin", MNT_DETACH);
        }
    }

  private:
    bool is_mounted_ = false;
};

TEST_F(SpotlightTest, IsReadAndSwitchedByTheFileServersTools) {
    AddTool("testparm",
            "[ \"$*\" = '--suppress-prompt --parameter-name=spotlight' ] && "
            "cat /volume1/state 2>/dev/null\n");
    AddTool("net",
            "[ \"$1 $2 $3 $4\" = 'conf setparm global spotlight' ] || exit 1\n"
            "[ -e /volume1/no-registry ] && exit 0\n"
            "case $5 in yes) echo Yes ;; no) echo No ;; esac >/volume1/state\n");
    if (!LayOver()) {
        GTEST_SKIP() << "no overlays here";
    }
    EXPECT_EQ(KESTOSMBIsEnableSpotlight(), -1);  // the tool fails
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
    for (const int enabled : {1, 0}) {
        EXPECT_EQ(KESTOSMBSetSpotlight(enabled), 0);
        EXPECT_EQ(KESTOSMBIsEnableSpotlight(), enabled);
    }
    WriteFile("/volume1/no-registry", "");  // the setting is taken and not used
    EXPECT_EQ(KESTOSMBSetSpotlight(1), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_COMMAND_FAILED);
}

TEST_F(SpotlightTest, IsNotThereWithoutAFileServer) {
    if (std::filesystem::exists("/usr/bin/testparm")) {
        GTEST_SKIP() << "Samba is installed";
    }
    EXPECT_EQ(KESTOSMBIsEnableSpotlight(), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_INSTALLED);
    EXPECT_EQ(KESTOSMBSetSpotlight(1), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NOT_INSTALLED);
}

}  // namespace
