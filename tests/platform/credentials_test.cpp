#include <grp.h>
#include <kesto/error.h>
#include <kesto/user.h>
#include <linux/capability.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <vector>

#include "common/error.h"
#include "sdk/credentials.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using quivra::sdk::SDKCredentials;

class RealCredentialsTest : public PlatformTest {
  protected:
    void SetUp() override {
        if (!HasOtherUsers()) {
            GTEST_SKIP() << "one user only";
        }
        WriteFile("/etc/passwd",
                  "root:x:0:0::/root:/bin/sh\nalice:x:1026:100::/:/bin/sh\n"
                  "bob:x:1027:101::/:/bin/sh\nboss:x:1028:100::/:/bin/sh\n");
        WriteFile("/etc/group",
                  "root:x:0:\nusers:x:100:\nstaff:x:101:\nfilm:x:2001:alice,boss\n"
                  "administrators:x:2002:boss\n");
    }
};

/// "EUID:EGID:GROUPS" of the process.
std::string Identity() {
    std::vector<gid_t> groups(64);
    groups.resize(static_cast<std::size_t>(getgroups(64, groups.data())));
    std::sort(groups.begin(), groups.end());
    std::string text = std::to_string(geteuid()) + ":" + std::to_string(getegid()) + ":";
    for (const gid_t group : groups) {
        text += std::to_string(group) + ",";
    }
    return text;
}

/// What a process of its own, which starts as root with the groups 0 and 7, returns.
std::string InChild(const std::function<std::string()>& body) {
    int ends[2];
    EXPECT_EQ(pipe(ends), 0);
    const pid_t pid = fork();
    if (pid == 0) {
        const gid_t groups[] = {0, 7};
        const std::string result = setgroups(2, groups) == 0 ? body() : "no setgroups";
        const bool is_written = write(ends[1], result.data(), result.size()) >= 0;
        _exit(is_written ? 0 : 1);
    }
    close(ends[1]);
    std::string result(4096, '\0');
    result.resize(
        static_cast<std::size_t>(std::max<ssize_t>(read(ends[0], result.data(), 4096), 0)));
    close(ends[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFSIGNALED(status) ? "signal " + std::to_string(WTERMSIG(status)) : result;
}

void DropCapability(int capability) {
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct data[2];
    syscall(SYS_capget, &header, data);
    data[0].effective &= ~(1U << capability);
    data[0].permitted &= ~(1U << capability);
    syscall(SYS_capset, &header, data);
}

TEST_F(RealCredentialsTest, ScopesSwitchDownAndBack) {
    EXPECT_EQ(InChild([] {
                  std::string trace;
                  {
                      SDKCredentials credentials;
                      credentials.AsUser("alice");
                      trace += Identity() + " ";
                      credentials.AsUser("bob");
                      trace += Identity() + " ";
                      credentials.AsUser("boss");
                      trace += Identity() + " ";
                      credentials.AsUser("alice");
                  }
                  return trace + Identity();
              }),
              "1026:100:100,2001, 1027:101:101, 0:0:0, 0:0:0,");
    EXPECT_EQ(InChild([] {
                  { const SDKCredentials credentials("root"); }
                  return Identity();
              }),
              "0:0:0,7,");  // the super-user needs no switch
    EXPECT_EQ(InChild([] {
                  { const SDKCredentials credentials("alice"); }
                  return Identity();
              }),
              "1026:100:100,2001,");
}

TEST_F(RealCredentialsTest, GroupsStayWhereTheyAreNotAskedFor) {
    EXPECT_EQ(InChild([] {
                  const std::string answer = ResetCredentialsByName("alice", false) ? "" : "failed";
                  return answer + Identity();
              }),
              "1026:0:0,7,");
}

TEST_F(RealCredentialsTest, FailuresLeaveTheIdentityWhole) {
    EXPECT_EQ(InChild([] {
                  const bool switched = ResetCredentialsByName("mallory", true);
                  return std::to_string(switched) + " " +
                         std::to_string(KLIBCErrGet() == KESTO_ERR_NO_SUCH_USER) + " " + Identity();
              }),
              "0 1 0:0:0,7,");
    for (const int capability : {CAP_SETGID, CAP_SETUID}) {
        EXPECT_EQ(InChild([&] {
                      DropCapability(capability);
                      const bool switched = ResetCredentialsByName("alice", true);
                      return std::to_string(switched) + " " + std::to_string(errno == EPERM) + " " +
                             std::to_string(KLIBCErrGet() == KESTO_ERR_SYSTEM) + " " + Identity();
                  }),
                  "0 1 1 0:0:0,7,")
            << capability;
    }
    EXPECT_EQ(InChild([] {
                  setresuid(1026, 1026, 1026);  // for good
                  return std::to_string(ResetCredentialsByName("root", true)) + " " + Identity();
              }),
              "0 1026:0:0,7,");
}

TEST_F(RealCredentialsTest, AdministratorsAreRootAndTheGroup) {
    const std::pair<const char*, int> rows[] = {
        {"root", 1}, {"boss", 1}, {"alice", 0}, {"mallory", -1}, {"", -1}};
    for (const auto& [user, expected] : rows) {
        EXPECT_EQ(KLIBGroupIsAdminGroupMem(user, 0), expected) << user;
    }
    WriteFile("/etc/group", "");
    EXPECT_EQ(KLIBGroupIsAdminGroupMem("boss", 0), 0);
    KESTOUser* user = nullptr;
    ASSERT_EQ(KESTOUserGetByUID(1026, &user), 0);
    EXPECT_STREQ(user->szName, "alice");
    EXPECT_EQ(user->gid, 100U);
    KESTOUserFree(user);
    EXPECT_EQ(KESTOUserGetByUID(4711, &user), -1);
    EXPECT_EQ(user, nullptr);
}

}  // namespace
