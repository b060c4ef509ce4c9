#include "base/file.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <filesystem>
#include <functional>

#include "base/private_directory.h"
#include "base/queue_file.h"
#include "tests/support/files.h"
#include "tests/support/users.h"

namespace {

namespace fs = std::filesystem;
using namespace quivra::base;
using support::ReadFile;
using support::WriteFile;

bool has_openat2 = true;

class FileTest : public testing::Test {
  protected:
    void SetUp() override {
        fs::create_directory(dir_);
        directory_ = OpenDirectory(AT_FDCWD, dir_);
        ASSERT_TRUE(directory_.IsValid());
    }
    void TearDown() override { fs::remove_all(dir_); }

    const std::string dir_ = "/tmp/file_test";
    UniqueFd directory_;
};

TEST_F(FileTest, WhatIsNoRegularFileIsRefusedWithoutWaiting) {
    WriteFile(dir_ + "/file", "x");
    fs::create_symlink("file", dir_ + "/link");
    fs::create_symlink("nowhere", dir_ + "/dangling");
    ASSERT_EQ(mkfifo((dir_ + "/fifo").c_str(), 0600), 0);
    fs::create_directory(dir_ + "/directory");

    EXPECT_TRUE(OpenRegular(directory_.Get(), "file", O_RDONLY).IsValid());
    for (const char* name : {"link", "dangling", "fifo", "directory"}) {
        UniqueFd fd;
        EXPECT_FALSE(OpenRegular(directory_.Get(), name, O_RDONLY).IsValid()) << name;
        EXPECT_EQ(TryLock(directory_.Get(), name, true, 0600, fd), LockAttempt::kOpenFailed);
        EXPECT_FALSE(fd.IsValid());
    }
    EXPECT_FALSE(fs::exists(dir_ + "/nowhere"));
    fs::create_directory_symlink(dir_, "/tmp/file_test_link");
    EXPECT_FALSE(OpenDirectory(AT_FDCWD, "/tmp/file_test_link/directory").IsValid());
    fs::remove("/tmp/file_test_link");
    EXPECT_FALSE(OpenDirectory(directory_.Get(), "../file_test").IsValid());
}

TEST_F(FileTest, WhatWasFoundIsOpenedWhateverHasItsName) {
    fs::create_directories(dir_ + "/a/b");
    WriteFile(dir_ + "/a/b/file", "found");
    fs::create_symlink("b", dir_ + "/a/link");
    ASSERT_EQ(mkfifo((dir_ + "/a/fifo").c_str(), 0600), 0);
    for (const bool has_it : {true, false}) {
        has_openat2 = has_it;
        const auto find = [&](const char* path) { return FindObject(directory_.Get(), path); };
        const UniqueFd file = find("a/b/file");
        const UniqueFd fifo = find("a/fifo");
        const UniqueFd link = find("a/link");
        EXPECT_TRUE(fifo.IsValid() && link.IsValid() && find("a/b").IsValid());
        EXPECT_FALSE(OpenFound(fifo.Get(), O_RDONLY).IsValid());
        EXPECT_FALSE(OpenFound(link.Get(), O_RDONLY).IsValid());
        for (const char* path : {"a/link/file", "../file_test/a", "a/b/file/x", "a/none"}) {
            EXPECT_FALSE(find(path).IsValid()) << path << has_it;
        }
        fs::rename(dir_ + "/a/b", dir_ + "/moved");
        std::string text;
        EXPECT_TRUE(ReadUpTo(OpenFound(file.Get(), O_RDONLY).Get(), 100, text));
        EXPECT_EQ(text, "found");
        fs::rename(dir_ + "/moved", dir_ + "/a/b");
        EXPECT_TRUE(FindObject(AT_FDCWD, "/").IsValid());
    }
    has_openat2 = true;
}

TEST_F(FileTest, ALockIsTakenOnTheFileThatHasTheName) {
    UniqueFd held;
    ASSERT_EQ(TryLock(directory_.Get(), "lock", true, 0600, held), LockAttempt::kTaken);
    UniqueFd other;
    EXPECT_EQ(TryLock(directory_.Get(), "lock", false, 0600, other), LockAttempt::kBusy);
    fs::rename(dir_ + "/lock", dir_ + "/away");
    EXPECT_FALSE(IsStillAt(held.Get(), directory_.Get(), "lock"));
    EXPECT_EQ(TryLock(directory_.Get(), "lock", true, 0640, other), LockAttempt::kTaken);
    EXPECT_EQ(fs::status(dir_ + "/lock").permissions(), fs::perms{0640});
}

TEST_F(FileTest, AReplacementIsWholeAndLeavesNothingBehind) {
    WriteFile(dir_ + "/config.new", "what a killed process left, longer than its successor");
    EXPECT_EQ(ReplaceFile(dir_ + "/config", "one", 0640), Replaced::kYes);
    EXPECT_EQ(ReadFile(dir_ + "/config"), "one");
    EXPECT_EQ(fs::status(dir_ + "/config").permissions(), fs::perms{0640});
    EXPECT_FALSE(fs::exists(dir_ + "/config.new"));

    fs::create_directory(dir_ + "/taken");
    EXPECT_EQ(ReplaceFile(dir_ + "/taken", "two", 0600), Replaced::kNo);
    EXPECT_EQ(errno, EISDIR);
    EXPECT_FALSE(fs::exists(dir_ + "/taken.new"));
    EXPECT_EQ(ReplaceFile(dir_ + "/no/directory", "three", 0600), Replaced::kNo);
}

TEST_F(FileTest, LinesAreAppendedWholeBehindATornOne) {
    WriteFile(dir_ + "/queue", "whole\ntorn");
    const UniqueFd fd = OpenRegular(directory_.Get(), "queue", O_RDWR);
    EXPECT_EQ(AppendLines(fd.Get(), "a\nb\n"), 4U);
    EXPECT_EQ(ReadFile(dir_ + "/queue"), "whole\ntorn\na\nb\n");

    // A disk that is full in the middle of the second line.
    rlimit old{};
    getrlimit(RLIMIT_FSIZE, &old);
    signal(SIGXFSZ, SIG_IGN);
    const rlimit full{fs::file_size(dir_ + "/queue") + 5, old.rlim_max};
    setrlimit(RLIMIT_FSIZE, &full);
    EXPECT_EQ(AppendLines(fd.Get(), "c\nd is long\n"), 2U);
    EXPECT_EQ(errno, EFBIG);
    setrlimit(RLIMIT_FSIZE, &old);
    EXPECT_EQ(ReadFile(dir_ + "/queue"), "whole\ntorn\na\nb\nc\n");
}

TEST_F(FileTest, APrivateDirectoryIsOursAtEachStep) {
    const std::string path = dir_ + "/@eaDir/fileindex";
    const auto open = [&](PrivateDirectory::Make make) {
        return PrivateDirectory::Open(path, make);
    };
    EXPECT_FALSE(open(PrivateDirectory::Make::kNo).IsValid());
    EXPECT_EQ(errno, ENOENT);
    umask(0);
    PrivateDirectory ours = open(PrivateDirectory::Make::kMissing);
    umask(022);
    ASSERT_TRUE(ours.IsValid()) << ours.Problem();
    EXPECT_EQ(fs::status(path).permissions(), fs::perms{0700});
    EXPECT_EQ(fs::status(dir_ + "/@eaDir").permissions(), fs::perms{0755});
    EXPECT_TRUE(ours.IsStillThere());

    constexpr const char* kAnotherUsers = "another user's directory";
    struct Attack {
        const char* what;
        std::function<void()> plant;
        const char* problem;
    };
    const std::string ea_dir = dir_ + "/@eaDir";
    for (const Attack& attack : {
             Attack{kAnotherUsers,
                    [&] {
                        fs::create_directories(path);
                        ASSERT_EQ(chown(ea_dir.c_str(), 1234, 1234), 0);
                    },
                    "/@eaDir belongs to user 1234"},
             Attack{"a link",
                    [&] {
                        fs::create_directories("/tmp/file_test_elsewhere/fileindex");
                        fs::create_symlink("/tmp/file_test_elsewhere", ea_dir);
                    },
                    "/@eaDir is not a directory"},
             Attack{"a directory open to all",
                    [&] {
                        fs::create_directories(path);
                        fs::permissions(path, fs::perms{0777});
                    },
                    "/@eaDir/fileindex can be written to by other users"},
             Attack{"a file", [&] { WriteFile(ea_dir, "x"); }, "/@eaDir is not a directory"},
         }) {
        if (attack.what == kAnotherUsers && !support::HasOtherUsers()) {
            continue;
        }
        fs::rename(ea_dir, dir_ + "/stolen");
        attack.plant();
        EXPECT_FALSE(ours.IsStillThere()) << attack.what;
        const PrivateDirectory found = open(PrivateDirectory::Make::kMissing);
        EXPECT_FALSE(found.IsValid()) << attack.what;
        EXPECT_NE(found.Problem().find(attack.problem), std::string::npos) << found.Problem();
        fs::remove_all(ea_dir);
        fs::rename(dir_ + "/stolen", ea_dir);
        EXPECT_TRUE(ours.IsStillThere()) << "after " << attack.what;
    }
    fs::remove_all("/tmp/file_test_elsewhere");
}

TEST_F(FileTest, WhoRenamesAPrivateDirectoryNeverGetsWhatIsWrittenToIt) {
    constexpr uid_t kAttacker = 1234;
    if (!support::HasOtherUsers()) {
        GTEST_SKIP() << "one user only";
    }
    const std::string ea_dir = dir_ + "/@eaDir";
    const std::string planted = dir_ + "/planted";
    WriteFile("/tmp/file_test_target/queue", "precious");
    ASSERT_EQ(chown(dir_.c_str(), kAttacker, kAttacker), 0);
    const auto plant = [&] {
        fs::create_directory(planted);
        fs::create_directory_symlink("/tmp/file_test_target", planted + "/fileindex");
        return std::string();
    };
    support::AsUser(kAttacker, plant);
    int opened = 0;
    {
        const support::UserLoop attacker(kAttacker, [&] {
            renameat2(AT_FDCWD, ea_dir.c_str(), AT_FDCWD, planted.c_str(), RENAME_EXCHANGE);
        });
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(200);
        while (std::chrono::steady_clock::now() < end) {
            const PrivateDirectory directory =
                PrivateDirectory::Open(ea_dir + "/fileindex", PrivateDirectory::Make::kMissing);
            if (directory.IsValid()) {
                ++opened;
                const UniqueFd queue =
                    OpenRegular(directory.Fd(), "queue", O_WRONLY | O_CREAT | O_TRUNC);
                EXPECT_TRUE(WriteAll(queue.Get(), "ours"));
            }
        }
    }
    EXPECT_GT(opened, 0);
    EXPECT_EQ(ReadFile("/tmp/file_test_target/queue"), "precious");
    fs::remove_all("/tmp/file_test_target");
}

}  // namespace

// Kernels before 5.6 do not have every call.
extern "C" long syscall(long number, ...) noexcept {
    if (number == SYS_openat2 && !has_openat2) {
        errno = ENOSYS;
        return -1;
    }
    va_list list;
    va_start(list, number);
    long arguments[4];
    for (long& argument : arguments) {
        argument = va_arg(list, long);
    }
    va_end(list);
    static const auto real = reinterpret_cast<long (*)(long, ...)>(dlsym(RTLD_NEXT, "syscall"));
    return real(number, arguments[0], arguments[1], arguments[2], arguments[3]);
}
