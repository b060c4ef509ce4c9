#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/mount.h>

#include <filesystem>
#include <memory>

#include "common/json.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/service.h"
#include "tests/programs/kestoelasticd/client.h"

namespace elasticd {
namespace {

namespace fs = std::filesystem;

const std::string kState = "/var/lib/move_test";
const std::string kOld = kState + "/old/db";
const std::string kNew = kState + "/new/db";

class MoveTest : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kState);
        fs::create_directories(kState + "/old");
        fs::create_directories(kState + "/new");
        Start();
        ASSERT_EQ(client.Create(kOld, TestMappings()), 0);
        ASSERT_EQ(client.Upsert("/committed"), 0);
        ASSERT_EQ(client.Commit(), 0);
        ASSERT_EQ(client.Upsert("/pending"), 0);
    }
    void TearDown() override {
        service.reset();
        umount2((kState + "/new").c_str(), MNT_DETACH);
        fs::remove_all(kState);
    }
    void Start() {
        ServiceOptions options;
        options.state_directory = kState;
        options.min_free_space = 0;
        service.reset();
        service = std::make_unique<Service>(options);
    }

    int Configure(const std::string& id, const std::string& path) const {
        Json::Value data;
        data["data"] = Json::objectValue;
        if (!id.empty()) {
            data["data"]["id"] = id;
        }
        if (!path.empty()) {
            data["data"]["path"] = path;
        }
        return client.Code("index_config_set", data);
    }

    /// Changes the registry as an interrupted process would have left it.
    void EditEntry(const std::function<void(Json::Value&)>& edit) {
        service.reset();
        Json::Value registry;
        ASSERT_TRUE(quivra::fromFile(registry, kState + "/indexes.json"));
        edit(registry["fileindex_s"]);
        ASSERT_TRUE(quivra::toFile(registry, kState + "/indexes.json"));
    }
    static void RecordMove(Json::Value& entry) {
        entry["move"]["id"] = "fileindex_t";
        entry["move"]["path"] = kNew;
    }

    Client Renamed() const {
        Client renamed = client;
        renamed.index = "fileindex_t";
        return renamed;
    }

    std::unique_ptr<Service> service;
    Client client{[this](const std::string& request) { return service->Handle(request); }};
    const Ids kBoth{"/committed", "/pending"};
};

TEST_F(MoveTest, ANewIdAndANewPlaceKeepTheBatchToo) {
    EXPECT_EQ(Configure("", kNew), 0);
    EXPECT_EQ(Configure("", kNew), 0) << "repeated after success";
    EXPECT_EQ(client.All(), kBoth);
    EXPECT_FALSE(fs::exists(kOld));
    EXPECT_EQ(Configure("fileindex_t", ""), 0);
    EXPECT_EQ(client.Commit(), kNoSuchIndex);
    Start();
    EXPECT_EQ(Renamed().All(), kBoth);
}

TEST_F(MoveTest, AnotherFileSystemThatMayBeFull) {
    const std::string target = kState + "/new";
    if (mount("none", target.c_str(), "tmpfs", 0, "size=32k") != 0) {
        GTEST_SKIP() << "cannot mount here";
    }
    EXPECT_EQ(Configure("fileindex_t", kNew), kNoSpace);
    EXPECT_EQ(client.All(), kBoth);
    EXPECT_TRUE(fs::is_empty(target));
    ASSERT_EQ(mount("none", target.c_str(), "tmpfs", MS_REMOUNT, "size=8m"), 0);
    EXPECT_EQ(Configure("fileindex_t", kNew), 0);
    EXPECT_FALSE(fs::exists(kOld));
    Start();
    EXPECT_EQ(Renamed().All(), kBoth);
}

TEST_F(MoveTest, WhatIsInTheWayIsKept) {
    fs::create_directories(kNew + "/precious");
    EXPECT_EQ(Configure("", kNew), kPathRefused);
    EXPECT_TRUE(fs::exists(kNew + "/precious"));
    Client second = client;
    second.index = "fileindex_u";
    ASSERT_EQ(second.Create(kState + "/new/u", TestMappings()), 0);
    EXPECT_EQ(Configure("fileindex_u", ""), kIndexExists);
    EXPECT_EQ(Configure("", kState + "/new/u"), kIndexExists);
    EXPECT_EQ(Configure("", kState + "/new/u/below"), kIndexExists);
    EXPECT_EQ(client.Commit(), 0);
    EXPECT_EQ(client.All(), kBoth);
}

TEST_F(MoveTest, AShareThatWasMovedAsAWholeIsFoundWithItsBatch) {
    fs::rename(kState + "/new", kState + "/empty");
    fs::rename(kState + "/old", kState + "/new");
    EXPECT_EQ(Configure("fileindex_t", kNew), 0);
    EXPECT_EQ(Renamed().Commit(), 0);
    EXPECT_EQ(Renamed().All(), kBoth);
}

TEST_F(MoveTest, AnIndexThatIsNowhereStaysUnavailableUntilItIsBack) {
    ASSERT_EQ(client.Commit(), 0);
    service.reset();
    fs::rename(kState + "/old", kState + "/unplugged");
    Start();
    EXPECT_EQ(Configure("", kNew), kIndexUnavailable);
    EXPECT_EQ(client.All(), Ids{"error 1413"});
    fs::rename(kState + "/unplugged", kState + "/old");
    EXPECT_EQ(client.All(), kBoth);
}

/// A recorded move is finished or undone, by where the files are.
TEST_F(MoveTest, InterruptedWhileMoving) {
    const auto copy_to = [](const std::string& place) {
        fs::copy(kOld, place, fs::copy_options::recursive);
    };
    const struct {
        const char* label;
        std::function<void()> files;
        std::function<void(Json::Value&)> edit;
        bool renamed;
    } cases[] = {
        {"in the copy", [&] { copy_to(kNew + ".moving"); }, RecordMove, false},
        {"between copy and switch", [&] { copy_to(kNew); }, RecordMove, false},
        {"before the old files were removed", [&] { copy_to(kNew); },
         [](Json::Value& entry) {
             entry["leftover"] = kOld;
             entry["path"] = kNew;
         },
         false},
        {"after the files moved", [] { fs::rename(kOld, kNew); }, RecordMove, true},
    };
    for (const auto& test : cases) {
        TearDown();
        SetUp();
        ASSERT_EQ(client.Commit(), 0);
        EditEntry(test.edit);
        test.files();
        Start();
        EXPECT_EQ((test.renamed ? Renamed() : client).All(), kBoth) << test.label;
        const auto left = [](const char* side) {
            return std::distance(fs::directory_iterator(kState + side), {});
        };
        EXPECT_EQ(left("/old") + left("/new"), 1) << test.label;
    }
}

TEST_F(MoveTest, InterruptedWhileDeleting) {
    EditEntry([](Json::Value& entry) { entry["deleting"] = true; });
    fs::remove(kOld + "/index.sqlite");
    Start();
    EXPECT_EQ(client.Commit(), kNoSuchIndex);
    EXPECT_FALSE(fs::exists(kOld));
}

TEST_F(MoveTest, InterruptedWhileTheDiskWasMissing) {
    ASSERT_EQ(client.Commit(), 0);
    EditEntry(RecordMove);
    fs::rename(kOld, kState + "/unplugged");
    Start();
    EXPECT_EQ(client.All(), Ids{"error 1413"});
    EXPECT_EQ(Renamed().All(), Ids{"error 1413"});
    EXPECT_EQ(Renamed().Create(kState + "/another", TestMappings()), kIndexExists);
    fs::rename(kState + "/unplugged", kNew);
    EXPECT_EQ(Renamed().All(), kBoth);
}

}  // namespace
}  // namespace elasticd
