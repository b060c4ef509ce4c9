#include "sdk/credentials.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "common/error.h"
#include "tests/fake/fake_libc.h"
#include "tests/fake/fake_platform.h"

namespace {

using quivra::sdk::SDKCredentials;
using Strings = std::vector<std::string>;

class CredentialsTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetPlatform();
        fake::ResetLibc();
        fake::AddUser("alice", 1026, 100);
        fake::AddUser("boss", 1027, 101);
        fake::AddAdministrator("boss");
        fake::SetEffectiveIds(0, 0);
        errno = 0;
    }
    static std::string Resets() {
        std::string text;
        for (const std::string& call : fake::CallsOf("ResetCredentialsByName")) {
            text += call.substr(call.find('(')) + " ";
        }
        return text;
    }
};

TEST_F(CredentialsTest, ReturnsToTheUserOfTheStart) {
    fake::SetEffectiveIds(1026, 100);
    {
        SDKCredentials credentials;
        credentials.AsUser("boss");
        EXPECT_EQ(geteuid(), 0U);  // an administrator acts as root
    }
    EXPECT_EQ(geteuid(), 1026U);
    EXPECT_EQ(Resets(), "(root, 1) (alice, 1) ");
}

TEST_F(CredentialsTest, UnchangedIdsNeedNoRestore) {
    { const SDKCredentials credentials; }
    { const SDKCredentials credentials("root"); }
    EXPECT_EQ(Resets(), "(root, 1) ");
    EXPECT_EQ(fake::CallsOf("KESTOUserFree"), Strings{"KESTOUserFree(root)"});
}

TEST_F(CredentialsTest, NamedUserIsAppliedAgainAtTheEnd) {
    { const SDKCredentials credentials("alice"); }
    EXPECT_EQ(geteuid(), 1026U);
    EXPECT_EQ(Resets(), "(alice, 1) (alice, 1) ");
}

TEST_F(CredentialsTest, LookupFailureCutsItsReasonByTheCode) {
    const std::pair<int, std::string> rows[] = {
        {0, "KESTOUserGetByUID failed, err="},
        {18, "failed, err="},
        {29, "="},
        {30, ""},
        {0x7fffffff, ""},
        {-5, "KESTOUserGetByUID failed, err="},
    };
    for (const auto& [code, reason] : rows) {
        fake::FailNext("KESTOUserGetByUID", 1, code);
        try {
            const SDKCredentials credentials;
            ADD_FAILURE() << code;
        } catch (const quivra::Error& error) {
            EXPECT_EQ(static_cast<int>(error.code), 503);
            EXPECT_EQ(error.reason, reason);
        }
    }
    const Strings lines = fake::LogLinesWith(
        " Failed [0 > KESTOUserGetByUID(euid_, &user_info) || !user_info], reason: ");
    ASSERT_EQ(lines.size(), std::size(rows));
    EXPECT_EQ(lines[0].rfind("credentials:", 0), 0U);
}

TEST_F(CredentialsTest, SwitchFailureIsLoggedAndLeavesTheIdentity) {
    fake::FailNext("ResetCredentialsByName");
    errno = EPERM;
    try {
        const SDKCredentials credentials("alice");
        ADD_FAILURE();
    } catch (const quivra::Error& error) {
        EXPECT_STREQ(error.what(), "Quivra error, code=503");
    }
    EXPECT_EQ(geteuid(), 0U);
    ASSERT_EQ(fake::LogLines().size(), 1U);
    EXPECT_NE(fake::LogLines()[0].find(") Failed [!ResetCredentialsByName(target_username)], "
                                       "reason:  [err: "),
              std::string::npos)
        << fake::LogLines()[0];
    EXPECT_EQ(errno, 0);
}

TEST_F(CredentialsTest, FailedRestoreEndsTheProcess) {
    testing::GTEST_FLAG(death_test_style) = "fast";
    fake::OnCall([](const std::string& call) {
        if (call == "ResetCredentialsByName(root, 1)") {
            fake::OnCall(nullptr);
            fake::FailNext("ResetCredentialsByName");
        }
    });
    const auto print_log_and_die = [] {
        std::set_terminate([] {
            for (const std::string& line : fake::LogLines()) {
                fprintf(stderr, "%s\n", line.c_str());
            }
            std::abort();
        });
        SDKCredentials credentials;
        credentials.AsUser("alice");
    };
    EXPECT_DEATH(print_log_and_die(),
                 "Failed .!ResetCredentialsByName\\(username_\\)., reason: Quivra error, code=503");
}

}  // namespace
