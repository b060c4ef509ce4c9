// The whole live stack on a real directory: search daemon, indexing daemon, file monitor, folder
// set. After whatever happens, the index equals the disk and the folder's status says "finished".

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <memory>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/files.h"
#include "tests/support/index_state.h"
#include "tests/support/program.h"
#include "tests/system/file_user.h"

namespace {

namespace fs = std::filesystem;
using namespace quivra::fileindex;
using support::Contents;
using support::Eventually;
using support::Program;
using support::WriteFile;
using Clock = std::chrono::steady_clock;

const std::string kVolume = "/volume1";
const std::string kRoot = kVolume + "/photo";

double MillisecondsSince(Clock::time_point start) {
    return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

void MountVolume(const std::string& path, const char* options) {
    fs::create_directories(path);
    ASSERT_EQ(mount("volume", path.c_str(), "tmpfs", 0, options), 0);
}

void SetShare(const std::string& path) {
    fs::create_directories("/etc/kesto");
    // Replaced, as an administrator's editor does it.
    WriteFile("/etc/kesto/shares.conf.new",
              "[" + fs::path(path).filename().string() + "]\npath = " + path + "\n");
    fs::rename("/etc/kesto/shares.conf.new", "/etc/kesto/shares.conf");
}

Json::Value FolderRequest(const std::string& path) {
    Json::Value folder;
    folder["path"] = path;
    folder["name"] = path;
    for (const char* content : {"document", "audio", "video", "photo"}) {
        folder[content] = true;
    }
    Json::Value list(Json::arrayValue);
    list.append(folder);
    return list;
}

/// What FolderList says of the first folder.
std::string StatusText() {
    Json::Value additional;
    additional.append("status");
    Json::Value result;
    FolderList(result, 0, 1, "path", "", additional);
    return result["folder"][0]["additional"]["status"]["text"].asString();
}

class LiveTest : public testing::Test {
  protected:
    void SetUp() override {
        log_level = 0;
        MountVolume(kVolume, "size=400m");
        fs::create_directories(kRoot);
        fs::create_directories("/var/packages/Quivra/etc");
        SetShare(kRoot);
        StartAll();
        WriteFile(kRoot + "/first.txt", "there before the folder was chosen\n");
        FolderAdd(FolderRequest("/photo"), false);
        ExpectSettled("photo", kRoot);
    }

    void TearDown() override {
        monitor_.reset();
        indexer_.reset();
        engine_.reset();
        umount2(kVolume.c_str(), MNT_DETACH);
        umount2("/volume2", MNT_DETACH);
        for (const char* path : {"/volume1", "/volume2", "/var/packages", "/var/lib/kesto",
                                 "/etc/kesto", "/tmp/outside"}) {
            fs::remove_all(path);
        }
    }

    void StartEngine() {
        engine_ = std::make_unique<Program>(
            support::StartDaemon("kestoelasticd", "/var/run/kestoelasticd.sock"));
    }
    void StartIndexer() {
        indexer_ = std::make_unique<Program>(
            support::StartDaemon("fileindexd", "/var/run/fileindexd.sock"));
    }
    void StartMonitor() {
        monitor_ = std::make_unique<Program>("kestotifyd", std::vector<std::string>());
    }
    void StartAll() {
        StartEngine();
        StartIndexer();
        StartMonitor();
    }

    /// Waits until the index holds what is on disk, and the folder's status says so.
    void ExpectSettled(const std::string& share, const std::string& root) {
        Contents disk;
        Contents index;
        const bool settled = Eventually(
            [&] {
                try {
                    disk = support::ContentsOnDisk(root);
                    index = support::ContentsInIndex(share, root);
                    return disk == index && StatusText() == "finished";
                } catch (const quivra::Error&) {
                    return false;  // a daemon is being restarted, an index is being moved
                }
            },
            std::chrono::seconds(60));
        EXPECT_TRUE(settled) << "status: " << StatusText() << "\n"
                             << support::Difference(disk, index);
    }
    void ExpectSettled() { ExpectSettled("photo", kRoot); }

    bool IsFound(const std::string& path, const std::string& content) {
        const Contents index = support::ContentsInIndex("photo", kRoot);
        const auto found = index.find(path);
        return found != index.end() && found->second == content;
    }

    void MakeDirectory(const std::string& path, int files) {
        fs::create_directories(path);
        for (int i = 0; i < files; ++i) {
            WriteFile(path + "/file " + std::to_string(i) + ".txt", "number " + std::to_string(i));
        }
    }

    std::unique_ptr<Program> engine_;
    std::unique_ptr<Program> indexer_;
    std::unique_ptr<Program> monitor_;
};

TEST_F(LiveTest, ChangesAreFoundSoon) {
    const auto start = Clock::now();
    WriteFile(kRoot + "/fresh.txt", "hello\n");
    EXPECT_TRUE(Eventually([&] { return IsFound(kRoot + "/fresh.txt", "hello\n"); }));
    std::cout << "from close to found: " << MillisecondsSince(start) << " ms\n";

    WriteFile(kRoot + "/fresh.txt", "changed\n");
    fs::create_directories(kRoot + "/a/b/c");
    WriteFile(kRoot + "/a/b/c/deep.txt", "deep\n");
    ExpectSettled();
    fs::rename(kRoot + "/a/b", kRoot + "/b");
    fs::remove(kRoot + "/fresh.txt");
    fs::rename(kRoot + "/first.txt", kRoot + "/b/c/deep.txt");
    ExpectSettled();
}

TEST_F(LiveTest, DirectoryRenameFollowsAndMovesInAndOut) {
    MakeDirectory(kRoot + "/album", 1000);
    ExpectSettled();
    const auto start = Clock::now();
    fs::rename(kRoot + "/album", kRoot + "/renamed album");
    EXPECT_TRUE(
        Eventually([&] { return IsFound(kRoot + "/renamed album/file 999.txt", "number 999"); }));
    std::cout << "renamed directory of 1000 files found: " << MillisecondsSince(start) << " ms\n";
    ExpectSettled();

    fs::rename(kRoot + "/renamed album", kVolume + "/outside");
    ExpectSettled();
    fs::rename(kVolume + "/outside", kRoot + "/back");
    ExpectSettled();
    fs::remove_all(kRoot + "/back");
    ExpectSettled();
}

TEST_F(LiveTest, KilledDaemonsLoseNothing) {
    MakeDirectory(kRoot + "/one", 300);
    engine_->Stop(SIGKILL);
    StartEngine();
    ExpectSettled();

    MakeDirectory(kRoot + "/two", 300);
    indexer_->Stop(SIGKILL);
    fs::rename(kRoot + "/one", kRoot + "/three");
    StartIndexer();
    ExpectSettled();

    MakeDirectory(kRoot + "/four", 300);
    monitor_->Stop(SIGKILL);
    fs::rename(kRoot + "/two", kRoot + "/five");
    WriteFile(kRoot + "/unseen.txt", "written while nobody watched\n");
    fs::remove_all(kRoot + "/three");
    StartMonitor();
    ExpectSettled();
}

TEST_F(LiveTest, StormsAreFollowedWithDaemonsDyingInBetween) {
    fs::create_directory(kVolume + "/outside");
    FileUser user(1, kRoot, kVolume + "/outside", nullptr);
    for (int round = 0; round < 9; ++round) {
        for (int left = 60; left > 0; --left) {
            user.DoSomething();
        }
        if (round % 3 == 0) {
            engine_->Stop(SIGKILL);
            StartEngine();
        } else if (round % 3 == 1) {
            indexer_->Stop(SIGKILL);
            StartIndexer();
        }
        ExpectSettled();
    }
}

TEST_F(LiveTest, PausesAndResumes) {
    for (const bool volume : {false, true}) {
        volume ? VolumePause(kVolume) : SharePause("photo");
        WriteFile(kRoot + "/while paused.txt", volume ? "volume\n" : "share\n");
        fs::rename(kRoot + "/first.txt", kRoot + "/tmp");
        fs::rename(kRoot + "/tmp", kRoot + "/first.txt");
        volume ? VolumeResume(kVolume) : ShareResume("photo");
        ExpectSettled();
    }

    StatusMgr().Pause(0);
    WriteFile(kRoot + "/later.txt", "later\n");
    EXPECT_TRUE(Eventually([] { return StatusText() == "paused"; }));
    EXPECT_FALSE(IsFound(kRoot + "/later.txt", "later\n"));
    indexer_->Stop(SIGTERM);
    StartIndexer();
    EXPECT_EQ(StatusText(), "paused");
    StatusMgr().Resume();
    ExpectSettled();
}

TEST_F(LiveTest, FullVolumeIsSurvived) {
    WriteFile(kRoot + "/before.txt", "before\n");
    ExpectSettled();
    {
        std::ofstream ballast(kVolume + "/ballast");
        const std::string block(1 << 20, 'x');
        while (ballast << block << std::flush) {
        }
    }
    MakeDirectory(kRoot + "/more", 5);  // empty files: there is no room for content
    fs::rename(kRoot + "/before.txt", kRoot + "/after.txt");
    WriteFile(kRoot + "/no room.txt", "");
    fs::remove(kVolume + "/ballast");
    WriteFile(kRoot + "/room again.txt", "room\n");
    ExpectSettled();
}

TEST_F(LiveTest, SharesAreRenamedAndMoved) {
    MakeDirectory(kRoot + "/album", 50);
    ExpectSettled();

    const std::string renamed = kVolume + "/pictures";
    fs::rename(kRoot, renamed);
    SetShare(renamed);
    ShareRename("photo", "pictures");
    ExpectSettled("pictures", renamed);
    WriteFile(renamed + "/under the new name.txt", "new\n");
    ExpectSettled("pictures", renamed);

    MountVolume("/volume2", "size=400m");
    const std::string moved = "/volume2/pictures";
    fs::create_directory(moved);
    for (const auto& entry : fs::directory_iterator(renamed)) {
        if (entry.path().filename() != "@eaDir") {
            fs::copy(entry, moved / entry.path().filename(), fs::copy_options::recursive);
        }
    }
    SetShare(moved);
    ShareMigrate("pictures", renamed);
    ExpectSettled("pictures", moved);
    WriteFile(moved + "/at the new place.txt", "moved\n");
    ExpectSettled("pictures", moved);
}

}  // namespace
