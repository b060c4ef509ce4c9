// The whole live stack: whatever happens to files, shares and daemons, nothing is lost.

#include "tests/system/file_user.h"
#include "tests/system/live_fixture.h"

namespace {

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
        } else {
            KillWorkerAtWork();
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
