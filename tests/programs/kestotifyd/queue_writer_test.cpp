#include "programs/kestotifyd/queue_writer.h"

#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "common/lock_file.h"
#include "tests/fake/fake_libc.h"

namespace kestotifyd {
namespace {

namespace fs = std::filesystem;
using Result = QueueWriter::Result;

class QueueWriterTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetLibc();
        fs::create_directories(directory_);
    }
    void TearDown() override { fs::remove_all(directory_); }

    std::string Content() const {
        std::ifstream file(queue_, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(file), {});
    }

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
    fs::create_directories(directory_);
    EXPECT_EQ(writer_.Write(), Result::kDone);
    EXPECT_EQ(Content(), "a\n");
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
}

TEST_F(QueueWriterTest, AFullDiskTearsNoLine) {
    ASSERT_EQ(mount("none", directory_.c_str(), "tmpfs", 0, "size=16k"), 0);
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
