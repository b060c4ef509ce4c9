#include "sdk/share.h"

#include <gtest/gtest.h>

#include <map>

#include "common/error.h"
#include "sdk/credentials.h"
#include "tests/fake/fake_libc.h"
#include "tests/fake/fake_platform.h"

namespace {

using quivra::sdk::SDKShare;

class ShareTest : public testing::Test {
  protected:
    ShareTest() {
        fake::ResetPlatform();
        fake::ResetLibc();
        fake::AddShare("photo", "/volume1/photo");
    }
};

TEST_F(ShareTest, OnlyAStatedLackOfSpaceCounts) {
    const SDKShare share("photo");
    EXPECT_TRUE(share.IsSpaceEnough());
    EXPECT_EQ(fake::CallsOf("KESTOQuotaIsEnough(0, /volume1/photo, 104857600)").size(), 1U);
    const std::pair<int, bool> rows[] = {{0x2400, false}, {0x2900, false}, {0, true}, {13, true}};
    for (const auto& [code, enough] : rows) {
        fake::Platform()->space_code = code;
        EXPECT_EQ(share.IsSpaceEnough(), enough) << code;
    }
}

TEST_F(ShareTest, FlagsAreRead) {
    fake::Platform()->shares.at("photo").hide_unreadable = 1;
    const SDKShare share("photo");
    EXPECT_TRUE(share.IsHideUnReadable());
    EXPECT_FALSE(share.IsEncryption());
    fake::FailNext("KLIBShareHideUnreadableGet");
    EXPECT_FALSE(share.IsHideUnReadable());
    for (const char* call : {"KLIBShareIsEncryptedGet", "KLIBShareIsReadOnlyGet"}) {
        fake::FailNext(call);
        EXPECT_THROW(share.CanBeIndexed(), quivra::Error) << call;
    }
}

TEST_F(ShareTest, HoldsTheSdkMutexExactlyWherePromised) {
    std::map<std::string, bool> locked;
    fake::Platform()->on_call = [&](const std::string& call) {
        const bool was_free = quivra::sdk::SDKMutex().TryLock();
        if (was_free) {
            quivra::sdk::SDKMutex().Unlock();
        }
        locked[call.substr(0, call.find('('))] = !was_free;
    };
    const SDKShare share("photo");
    share.IsHideUnReadable();
    share.IsSpaceEnough();
    share.IsEncryption();
    share.IsEnableRecycleBin();
    share.GetQueuePath();
    share.GetDBPath();
    share.CanBeIndexed();
    EXPECT_EQ(locked.size(), 9U);
    for (const auto& [call, held] : locked) {
        EXPECT_EQ(held, call != "KLIBShareHideUnreadableGet") << call;
    }
    fake::Platform()->on_call = nullptr;
}

}  // namespace
