#include "sdk/credentials.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "common/error.h"
#include "tests/fake/fake_libc.h"
#include "tests/fake/fake_platform.h"

namespace {

using quivra::sdk::SDKCredentials;

class CredentialsTest : public testing::Test {
  protected:
    CredentialsTest() {
        fake::ResetPlatform();
        fake::ResetLibc();
        fake::Platform()->users = {{"root", {0, 0}}, {"alice", {1026, 100}}, {"boss", {1027, 101}}};
        fake::Platform()->administrators.insert("boss");
        fake::Platform()->effective_ids = {0, 0};
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
    fake::Platform()->effective_ids = {1026, 100};
    {
        SDKCredentials credentials;
        credentials.AsUser("boss");
        EXPECT_EQ(geteuid(), 0U);  // an administrator acts as root
    }
    EXPECT_EQ(geteuid(), 1026U);
    EXPECT_EQ(Resets(), "(root, 1) (alice, 1) ");
}

TEST_F(CredentialsTest, UnchangedIdsNeedNoRestoreAndANamedUserIsAppliedAgain) {
    { const SDKCredentials credentials; }
    { const SDKCredentials credentials("root"); }
    EXPECT_EQ(Resets(), "(root, 1) ");
    { const SDKCredentials credentials("alice"); }
    EXPECT_EQ(geteuid(), 1026U);
    EXPECT_EQ(Resets(), "(root, 1) (alice, 1) (alice, 1) ");
}

TEST_F(CredentialsTest, LookupFailureCutsItsReasonByTheCode) {
    const std::pair<int, std::string> rows[] = {{0, "KESTOUserGetByUID failed, err="},
                                                {18, "failed, err="},
                                                {30, ""},
                                                {0x7fffffff, ""},
                                                {-5, "KESTOUserGetByUID failed, err="}};
    for (const auto& [code, reason] : rows) {
        fake::FailNext("KESTOUserGetByUID", code);
        try {
            const SDKCredentials credentials;
            ADD_FAILURE() << code;
        } catch (const quivra::Error& error) {
            EXPECT_EQ(error.code, 503);
            EXPECT_EQ(error.reason, reason);
        }
    }
}

TEST_F(CredentialsTest, SwitchFailureLeavesTheIdentity) {
    fake::FailNext("ResetCredentialsByName");
    EXPECT_THROW(SDKCredentials("alice"), quivra::Error);
    EXPECT_EQ(geteuid(), 0U);
}

TEST_F(CredentialsTest, FailedRestoreEndsTheProcess) {
    testing::GTEST_FLAG(death_test_style) = "fast";
    const auto fail_to_restore = [] {
        SDKCredentials credentials;
        credentials.AsUser("alice");
        fake::FailNext("ResetCredentialsByName");
    };
    EXPECT_DEATH(fail_to_restore(), "terminate called");
}

}  // namespace
