#include "sdk/share.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>

#include "common/error.h"
#include "sdk/credentials.h"
#include "tests/fake/fake_libc.h"
#include "tests/fake/fake_platform.h"

namespace {

using quivra::sdk::SDKShare;
using Strings = std::vector<std::string>;

class ShareTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetPlatform();
        fake::ResetLibc();
        fake::AddShare("photo", "/volume1/photo");
        errno = 0;
    }
};

/// What a throwing call must leave: the code and reason, and one log line with the condition.
void ExpectFailure(const std::function<void()>& call, int code, const std::string& reason,
                   const std::string& condition) {
    fake::ResetLibc();
    try {
        call();
        ADD_FAILURE() << "no error: " << condition;
    } catch (const quivra::Error& error) {
        EXPECT_EQ(static_cast<int>(error.code), code);
        EXPECT_EQ(error.reason, reason);
    }
    ASSERT_EQ(fake::LogLines().size(), 1U);
    const std::string line = fake::LogLines()[0];
    EXPECT_EQ(line.rfind("share:", 0), 0U) << line;
    EXPECT_NE(line.find(" Failed [" + condition + "], reason: " + reason), std::string::npos)
        << line;
}

TEST_F(ShareTest, ConstructorFailsForAnUnknownShare) {
    ExpectFailure([] { SDKShare("music"); }, 800, "music",
                  "0 > KESTOShareGet(share_name.c_str(), &share_info_) || !share_info_");
    EXPECT_TRUE(fake::CallsOf("KESTOShareFree").empty());
}

TEST_F(ShareTest, EveryFlagIsReadAndEveryFailureNamed) {
    struct Row {
        const char* call;
        const char* argument;
        const char* prefix;
        std::function<void(const SDKShare&)> ask;
    };
    const auto can_be_indexed = [](const SDKShare& share) { share.CanBeIndexed(); };
    const Row rows[] = {
        {"KLIBShareIsEncryptionGet", "share_info_, &is_encryption", "KLIBShareIsEncryptionGet",
         [](const SDKShare& share) { share.IsEncryption(); }},
        {"KLIBShareRecycleStatusGet", "share_info_, &is_enabled", "KLIBShareRecycleStatusGet",
         [](const SDKShare& share) { share.IsEnableRecycleBin(); }},
        {"FILEIDXQueuePathCompose", "share_info_->szPath, path, sizeof(path)",
         "FILEIDXQueuePathCompose", [](const SDKShare& share) { share.GetQueuePath(); }},
        {"FILEIDXDBPathCompose", "share_info_->szPath, path, sizeof(path)", "FILEIDXDBPathCompose",
         [](const SDKShare& share) { share.GetDBPath(); }},
        {"KLIBShareIsEncryptedGet", "share_info_, &is_encrypted", "KLIBShareis_encryptedGet",
         can_be_indexed},
        {"KLIBShareIsReadOnlyGet", "share_info_, &is_readonly", "KLIBShareis_readonlyGet",
         can_be_indexed},
    };
    const SDKShare share("photo");
    for (const Row& row : rows) {
        SCOPED_TRACE(row.call);
        fake::FailNext(row.call);
        ExpectFailure([&] { row.ask(share); }, 502,
                      std::string(row.prefix) + " failed, share=photo",
                      std::string("0 > ") + row.call + "(" + row.argument + ")");
        EXPECT_NO_THROW(row.ask(share));
    }
}

TEST_F(ShareTest, CanBeIndexedFollowsNameAndFlags) {
    using fake::ShareFlag;
    for (const char* name : {"surveillance", "NetBackup", "Surveillance", "netbackup", "locked",
                             "frozen", "crypt", "plain"}) {
        fake::AddShare(name, std::string("/volume1/") + name);
    }
    fake::SetFlag("locked", ShareFlag::kEncrypted);
    fake::SetFlag("frozen", ShareFlag::kReadOnly);
    fake::SetFlag("crypt", ShareFlag::kEncryption);
    for (const char* name : {"surveillance", "NetBackup"}) {
        EXPECT_FALSE(SDKShare(name).CanBeIndexed()) << name;
    }
    EXPECT_TRUE(fake::CallsOf("KLIBShareIs").empty());
    for (const char* name : {"locked", "frozen"}) {
        EXPECT_FALSE(SDKShare(name).CanBeIndexed()) << name;
    }
    for (const char* name : {"Surveillance", "netbackup", "crypt", "plain"}) {
        EXPECT_TRUE(SDKShare(name).CanBeIndexed()) << name;
    }
    EXPECT_TRUE(SDKShare("crypt").IsEncryption());
    EXPECT_FALSE(SDKShare("locked").IsEncryption());
}

TEST_F(ShareTest, OnlyAStatedLackOfSpaceCounts) {
    const SDKShare share("photo");
    EXPECT_TRUE(share.IsSpaceEnough());
    EXPECT_EQ(fake::CallsOf("KESTOQuotaIsEnough"),
              Strings{"KESTOQuotaIsEnough(0, /volume1/photo, 104857600)"});
    const std::pair<int, bool> rows[] = {{0x2400, false}, {0x2900, false}, {0, true}, {13, true}};
    for (const auto& [code, enough] : rows) {
        fake::SetSpace(false, code);
        EXPECT_EQ(share.IsSpaceEnough(), enough) << code;
    }
}

TEST_F(ShareTest, PassesValuesThrough) {
    fake::SetFTPPrivilege("photo", 0xdeadbeef);
    fake::SetUserPrivilege("photo", "alice", 2);
    const SDKShare share("photo");
    EXPECT_EQ(share.GetPath(), "/volume1/photo");
    EXPECT_EQ(share.GetQueuePath(), "/volume1/photo/@eaDir/fileindex/queue");
    EXPECT_EQ(share.GetDBPath(), "/volume1/photo/@eaDir/fileindex/db");
    EXPECT_EQ(share.GetFTPPrivilege(), 0xdeadbeefU);
    EXPECT_EQ(share.GetPrivilege("alice"), 2);
    fake::FailNext("KESTOShareUserPrivGet");
    EXPECT_EQ(share.GetPrivilege("alice"), -1);
    for (const auto& [value, hidden] : {std::pair(0, false), {1, true}, {2, false}}) {
        fake::SetFlag("photo", fake::ShareFlag::kHideUnreadable, value);
        EXPECT_EQ(share.IsHideUnReadable(), hidden) << value;
    }
    fake::SetFlag("photo", fake::ShareFlag::kHideUnreadable);
    fake::FailNext("KLIBShareHideUnreadableGet");
    EXPECT_FALSE(share.IsHideUnReadable());
}

TEST_F(ShareTest, HoldsTheSdkMutexExactlyWherePromised) {
    std::map<std::string, bool> locked;
    fake::OnCall([&](const std::string& call) {
        const bool was_free = quivra::sdk::SDKMutex().TryLock();
        if (was_free) {
            quivra::sdk::SDKMutex().Unlock();
        }
        locked[call.substr(0, call.find('('))] = !was_free;
    });
    {
        const SDKShare share("photo");
        share.IsHideUnReadable();
        share.IsSpaceEnough();
        share.GetPrivilege("alice");
        share.IsEncryption();
        share.IsEnableRecycleBin();
        share.GetQueuePath();
        share.GetDBPath();
        share.CanBeIndexed();
    }
    EXPECT_EQ(locked.size(), 11U);
    for (const auto& [call, held] : locked) {
        EXPECT_EQ(held, call != "KLIBShareHideUnreadableGet" && call != "KESTOShareUserPrivGet")
            << call;
    }
}

}  // namespace
