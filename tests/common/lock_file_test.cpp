#include "common/lock_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <vector>

#include "common/error.h"
#include "tests/fake/fake_libc.h"

namespace {
/// Runs in the moment between the opening and the locking of a file.
std::function<void()> before_flock;
/// The flags of each opening.
std::vector<int> open_flags;
}  // namespace

extern "C" int openat(int directory, const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    open_flags.push_back(flags);
    return static_cast<int>(syscall(SYS_openat, directory, path, flags, mode));
}

extern "C" int flock(int fd, int operation) noexcept {
    if (before_flock) {
        before_flock();
    }
    return static_cast<int>(syscall(SYS_flock, fd, operation));
}

namespace quivra {
namespace {

class LockFileTest : public testing::Test {
  protected:
    void SetUp() override {
        fake::ResetLibc();
        ASSERT_NE(mkdtemp(directory_.data()), nullptr);
        path_ = directory_ + "/lock";
    }
    void TearDown() override {
        fake::ResetLibc();
        std::filesystem::remove_all(directory_);
    }

    /// A process that holds the lock until it is told to stop, or is destroyed.
    class Holder {
      public:
        explicit Holder(const std::string& path) {
            int ready[2];
            EXPECT_EQ(pipe(ready), 0);
            pid_ = fork();
            if (pid_ == 0) {
                const LockFile lock(path, true);
                (void)!write(ready[1], "x", 1);
                pause();
                _exit(0);
            }
            char byte = 0;
            close(ready[1]);
            EXPECT_EQ(read(ready[0], &byte, 1), 1);
            close(ready[0]);
        }
        void Kill() {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }

      private:
        pid_t pid_ = -1;
    };

    std::string directory_ = "/tmp/lock_test.XXXXXX";
    std::string path_;
};

std::string LockErrorOf(const std::string& path, bool exclusive) {
    try {
        const LockFile lock(path, exclusive);
    } catch (const Error& error) {
        EXPECT_EQ(error.code, 506);
        return error.reason;
    }
    return "no error";
}

TEST_F(LockFileTest, SharedLocksAdmitEachOther) {
    const LockFile first(path_, false);
    const LockFile second(path_, false);
    EXPECT_EQ(LockErrorOf(path_, true), "Exceed max retry");
    EXPECT_TRUE(LockErrorOf(directory_ + "/missing/lock", true).starts_with("open failed"));
}

TEST_F(LockFileTest, WaitsForADyingHolderButNotForEver) {
    Holder holder(path_);
    const int free_before = dup(0);
    close(free_before);
    EXPECT_EQ(LockErrorOf(path_, false), "Exceed max retry");
    EXPECT_EQ(fake::Sleeps().size(), 64U);
    const int free_after = dup(0);
    close(free_after);
    EXPECT_EQ(free_after, free_before);
    fake::OnSleep([&](auto) { holder.Kill(); });
    const LockFile lock(path_, true);
    EXPECT_EQ(fake::Sleeps().size(), 65U);
}

TEST_F(LockFileTest, WhatIsNotAFileIsRefusedAndAFileIsNotMadeTwice) {
    const std::string target = directory_ + "/target";
    std::filesystem::create_symlink(target, path_);
    EXPECT_TRUE(LockErrorOf(path_, true).starts_with("open failed"));
    EXPECT_FALSE(std::filesystem::exists(target)) << "the link was followed";
    std::filesystem::remove(path_);
    ASSERT_EQ(mkfifo(path_.c_str(), 0600), 0);
    EXPECT_TRUE(LockErrorOf(path_, true).starts_with("open failed"));
    std::filesystem::remove(path_);

    umask(022);
    { const LockFile lock(path_, true); }
    EXPECT_EQ(std::filesystem::status(path_).permissions(), std::filesystem::perms(0644));
    open_flags.clear();
    { const LockFile lock(path_, true); }
    ASSERT_EQ(open_flags.size(), 1U);
    EXPECT_EQ(open_flags[0] & O_CREAT, 0) << "root is refused where fs.protected_regular is 2";
}

TEST_F(LockFileTest, LocksTheFileThatIsAtThePathNow) {
    before_flock = [&] {
        before_flock = nullptr;
        std::filesystem::rename(path_, path_ + ".tmp");
    };
    const LockFile lock(path_, true);
    EXPECT_TRUE(fake::Sleeps().empty());
    EXPECT_EQ(LockErrorOf(path_, true), "Exceed max retry");
}

}  // namespace
}  // namespace quivra
