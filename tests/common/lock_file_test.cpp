#include "common/lock_file.h"

#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <functional>
#include <memory>

#include "common/error.h"
#include "common/mutex.h"
#include "tests/fake/fake_libc.h"

namespace {
/// Runs in the moment between the opening and the locking of a file.
std::function<void()> before_flock;
}  // namespace

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
        ~Holder() { Kill(); }
        void Kill() {
            if (pid_ > 0) {
                kill(pid_, SIGKILL);
                waitpid(pid_, nullptr, 0);
                pid_ = -1;
            }
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
}

TEST_F(LockFileTest, GivesUpAfterSixtyFourTries) {
    const Holder holder(path_);
    EXPECT_EQ(LockErrorOf(path_, false), "Exceed max retry");
    const auto sleeps = fake::Sleeps();
    EXPECT_EQ(sleeps.size(), 64U);
    for (const auto sleep : sleeps) {
        EXPECT_LE(sleep, std::chrono::milliseconds(900));
        EXPECT_EQ(sleep.count() % 100000, 0);
    }
}

TEST_F(LockFileTest, WaitsForADyingHolder) {
    Holder holder(path_);
    fake::OnSleep([&](auto) { holder.Kill(); });
    const LockFile lock(path_, true);
    EXPECT_EQ(fake::Sleeps().size(), 1U);
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

TEST_F(LockFileTest, MissingDirectoryFailsAtOnce) {
    EXPECT_EQ(LockErrorOf(directory_ + "/missing/lock", true),
              "open failed, reason=No such file or directory");
    EXPECT_TRUE(fake::Sleeps().empty());
    EXPECT_EQ(fake::LogLinesWith(
                  "Failed [0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))], reason: open")
                  .size(),
              1U);
}

TEST_F(LockFileTest, FileStaysWithItsMode) {
    const mode_t old_mask = umask(0);
    { const LockFile lock(path_, true); }
    umask(old_mask);
    EXPECT_EQ(std::filesystem::status(path_).permissions(), std::filesystem::perms(0644));
}

TEST(MutexTest, ExcludesUntilUnlocked) {
    Mutex mutex;
    {
        const LockMutex lock(mutex);
        EXPECT_FALSE(mutex.TryLock());
    }
    EXPECT_TRUE(mutex.TryLock());
    EXPECT_TRUE(mutex.Unlock());
}

}  // namespace
}  // namespace quivra
