#include "programs/kestotifyd/queue_writer.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "common/lock_file.h"
#include "programs/kestotifyd/queue_set.h"
#include "tests/fake/fake_libc.h"
#include "tests/support/files.h"

namespace kestotifyd {
namespace {

namespace fs = std::filesystem;
using quivra::base::PrivateDirectory;
using Result = QueueWriter::Result;

class QueueWriterTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetLibc();
        fs::create_directories(directory_);
    }
    void TearDown() override { fs::remove_all(directory_); }

    std::string Content() const { return support::ReadFile(queue_); }

    const std::string directory_ = "/tmp/queue_writer_test";
    const std::string queue_ = directory_ + "/queue";
    QueueWriter writer_{queue_, "crash\n", 1000};
};

TEST_F(QueueWriterTest, EndsATornLineOfTheFileThatIsThereNow) {
    std::ofstream(queue_) << "whole\n{\"event\":6";
    writer_.Add({"a\n"});
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "whole\n{\"event\":6\na\n");
    fs::rename(queue_, queue_ + ".tmp");
    writer_.Add({"b\n"});
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "b\n");
    EXPECT_EQ(fs::status(queue_).permissions(), fs::perms(0600));
}

TEST_F(QueueWriterTest, KeepsItsLinesUntilLockAndDirectoryAreThere) {
    writer_.Add({"a\n"});
    {
        const quivra::LockFile reader(queue_, true);
        EXPECT_EQ(writer_.Write(), Result::kBusy);
        EXPECT_TRUE(fake::Sleeps().empty());
    }
    fs::remove_all(directory_);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_EQ(fake::LogLinesWith(queue_).size(), 1U);
    EXPECT_EQ(writer_.Write(PrivateDirectory::Make::kMissing), Result::kDone);
    EXPECT_EQ(writer_.Problem(), "");
    EXPECT_EQ(Content(), "crash\n") << "another directory than before";
}

TEST_F(QueueWriterTest, WhatDoesNotFitInMemoryBecomesACrashMarker) {
    for (const char letter : {'x', 'y'}) {
        writer_.Add({std::string(600, letter) + "\n"});
    }
    writer_.Add({"later\n"});
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "crash\nlater\n");
}

TEST_F(QueueWriterTest, RefusesWhatIsNoRegularFile) {
    writer_.Add({"a\n"});
    fs::create_symlink(directory_ + "/elsewhere", queue_);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_FALSE(fs::exists(directory_ + "/elsewhere"));
    fs::remove(queue_);
    ASSERT_EQ(mkfifo(queue_.c_str(), 0600), 0);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    fs::remove(queue_);
    fs::create_directory(queue_);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_EQ(writer_.Problem(), queue_ + " is not a regular file; remove it");
    EXPECT_EQ(fake::LogLinesWith("not a regular file").size(), 1U);
    fs::remove(queue_);
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "a\n");
}

TEST_F(QueueWriterTest, WhatWentToAnExchangedDirectoryIsOwed) {
    writer_.Add({"a\n"});
    EXPECT_EQ(writer_.Write(), Result::kDone);
    fs::rename(directory_, directory_ + "_away");
    fs::create_directory(directory_);
    EXPECT_EQ(writer_.Write(), Result::kDone) << "looked at although nothing is pending";
    EXPECT_EQ(Content(), "crash\n");
    fs::remove_all(directory_ + "_away");
}

TEST_F(QueueWriterTest, NothingIsWrittenWhereOthersMayWrite) {
    writer_.Add({"a\n", "b\n"});
    fs::permissions(directory_, fs::perms(0777));
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_EQ(writer_.Write(), Result::kFailed);
    EXPECT_TRUE(fs::is_empty(directory_));
    EXPECT_EQ(fake::LogLinesWith("can be written to by other users").size(), 1U);
    fs::permissions(directory_, fs::perms(0755));
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "crash\n");
}

/// What is made where a volume is away would make it look like an empty one.
TEST_F(QueueWriterTest, AMissingDirectoryIsMadeOnlyWhileItsFolderIsWatched) {
    using std::chrono::seconds;
    const std::string share = directory_ + "/share";
    const std::string queue = share + "/@eaDir/fileindex/queue";
    fs::create_directories(share);
    WatchedFolders watched(directory_ + "/watched.json");
    QueueSet queues(watched, [](const std::string& name) { return name == "@eaDir"; });
    Time now{seconds(1000)};
    const auto flush_twice = [&] {
        for (int i = 0; i < 2; ++i) {
            now += seconds(5);
            queues.Flush(now);
        }
    };
    queues.Update({{queue, {share}, 65478, {}}}, true, now);
    queues.OnRootComplete(share, now);
    queues.OnRootLost(share, false, now);
    flush_twice();
    EXPECT_TRUE(fs::is_empty(share));
    queues.OnRootComplete(share, now);
    now += seconds(5);
    queues.Flush(now);
    EXPECT_TRUE(fs::exists(queue));
    EXPECT_EQ(queues.States().front().problem, "");
}

/// A user who may write to the share's root puts a directory of their own in the queue's place and
/// back, as fast as they can, until they are killed.
pid_t StartSwapping(const std::string& share) {
    const pid_t pid = fork();
    if (pid != 0) {
        return pid;
    }
    if (setresgid(65534, 65534, 65534) != 0 || setresuid(65534, 65534, 65534) != 0) {
        _exit(1);
    }
    const std::string place = share + "/@eaDir";
    const std::string own = share + "/own";
    const std::string away = share + "/away";
    mkdir(own.c_str(), 0777);
    mkdir((own + "/fileindex").c_str(), 0777);
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    while (true) {
        rename(place.c_str(), away.c_str());
        rename(own.c_str(), place.c_str());
        rename(place.c_str(), own.c_str());
        rename(away.c_str(), place.c_str());
    }
}

TEST_F(QueueWriterTest, AnotherUserWhoSwapsDirectoriesLearnsNothingAndLosesNothing) {
    const std::string share = directory_ + "/share";
    const std::string queue = share + "/@eaDir/fileindex/queue";
    fs::create_directories(fs::path(queue).parent_path());
    if (chown(share.c_str(), 65534, 65534) != 0) {
        GTEST_SKIP() << "this user namespace has no other user";
    }
    QueueWriter writer(queue, "crash\n");
    const pid_t attacker = StartSwapping(share);
    int refused = 0;
    int written = 0;
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(700);
    while (std::chrono::steady_clock::now() < end) {
        writer.Add({"secret\n"});
        const bool is_done = writer.Write() == Result::kDone;
        written += is_done ? 1 : 0;
        refused += is_done || writer.Problem().find("user 65534") == std::string::npos ? 0 : 1;
    }
    kill(attacker, SIGKILL);
    ASSERT_EQ(waitpid(attacker, nullptr, 0), attacker);
    if (fs::exists(share + "/away")) {
        if (fs::exists(share + "/@eaDir")) {
            fs::rename(share + "/@eaDir", share + "/own");
        }
        fs::rename(share + "/away", share + "/@eaDir");
    }
    writer.Add({"last\n"});
    EXPECT_EQ(writer.Write(), Result::kDone);
    EXPECT_TRUE(fs::is_empty(share + "/own/fileindex"));
    std::ifstream file(queue);
    const std::string content(std::istreambuf_iterator<char>(file), {});
    EXPECT_GT(written, 0);
    EXPECT_GT(refused, 0);
    EXPECT_NE(content.find("crash\n"), std::string::npos);
    EXPECT_NE(content.find("last\n"), std::string::npos);
}

TEST_F(QueueWriterTest, AFullDiskTearsNoLine) {
    ASSERT_EQ(mount("none", directory_.c_str(), "tmpfs", 0, "size=16k,mode=755"), 0);
    QueueWriter writer(queue_, "crash\n");
    std::string expected;
    std::vector<std::string> lines;
    for (int i = 0; i < 300; ++i) {
        lines.push_back(std::to_string(i) + std::string(90, 'x') + "\n");
        expected += lines.back();
    }
    writer.Add(std::move(lines));
    EXPECT_EQ(writer.Write(), Result::kFailed);
    const std::string written = Content();
    EXPECT_GT(written.size(), 10000U);
    EXPECT_EQ(written.back(), '\n');
    fs::rename(queue_, queue_ + ".tmp");
    fs::remove(queue_ + ".tmp");
    EXPECT_EQ(writer.Write(), Result::kDone);
    EXPECT_EQ(written + Content(), expected);
    ASSERT_EQ(umount(directory_.c_str()), 0);
}

}  // namespace
}  // namespace kestotifyd
