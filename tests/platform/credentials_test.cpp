#include <grp.h>
#include <kesto/error.h>
#include <kesto/user.h>
#include <linux/capability.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

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
                  "root:x:0:\nusers:x:100:\nfilm:x:2001:alice,boss\n"
                  "administrators:x:2002:boss\n");
    }
};

/// "EUID:EGID:GROUPS " of the process.
std::string Identity() {
    std::vector<gid_t> groups(64);
    groups.resize(static_cast<std::size_t>(getgroups(64, groups.data())));
    std::sort(groups.begin(), groups.end());
    std::string text = std::to_string(geteuid()) + ":" + std::to_string(getegid()) + ":";
    for (const gid_t group : groups) {
        text += std::to_string(group) + ",";
    }
    return text + " ";
}

/// What the body returns in a process that starts as root with the groups 0 and 7.
std::string AsRoot(const std::function<std::string()>& body) {
    return InChild([&] {
        const gid_t groups[] = {0, 7};
        return setgroups(2, groups) == 0 ? body() : "no setgroups";
    });
}

TEST_F(RealCredentialsTest, ScopesSwitchDownAndBack) {
    EXPECT_EQ(AsRoot([] {
                  std::string trace;
                  {
                      SDKCredentials credentials;
                      for (const char* user : {"alice", "bob", "boss"}) {
                          credentials.AsUser(user);
                          trace += Identity();
                      }
                  }
                  return trace + Identity();
              }),
              "1026:100:100,2001, 1027:101:101, 0:0:0, 0:0:0, ");
}

TEST_F(RealCredentialsTest, FailuresLeaveTheIdentityWhole) {
    EXPECT_TRUE(ResetCredentialsByName("root", true));  // nothing to do
    EXPECT_EQ(
        AsRoot([] { return ResetCredentialsByName("mallory", true) ? "switched" : Identity(); }),
        "0:0:0,7, ");
    for (const int capability : {CAP_SETGID, CAP_SETUID}) {
        EXPECT_EQ(AsRoot([&] {
                      __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
                      __user_cap_data_struct data[2];
                      syscall(SYS_capget, &header, data);
                      data[0].effective = data[0].permitted &= ~(1U << capability);
                      syscall(SYS_capset, &header, data);
                      const bool switched = ResetCredentialsByName("alice", true);
                      return !switched && errno == EPERM && KLIBCErrGet() == KESTO_ERR_SYSTEM
                                 ? Identity()
                                 : "no failure";
                  }),
                  "0:0:0,7, ")
            << capability;
    }
}

}  // namespace
