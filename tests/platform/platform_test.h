#pragma once

#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>

#include "tests/fake/fake_libc.h"

namespace platform_test {

inline void WriteFile(const std::string& path, const std::string& content) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
}

inline std::string ReadFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline unsigned int ModeOf(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

/// Whether other users than root exist here; a user namespace may map one id only.
inline bool HasOtherUsers() {
    return ReadFile("/proc/self/uid_map").find("4294967295") != std::string::npos;
}

/// What the body returns in a process of its own, where it may change its identity; nothing when it
/// crashes.
inline std::string InChild(const std::function<std::string()>& body) {
    const pid_t pid = fork();
    if (pid == 0) {
        std::ofstream result("/tmp/result");
        result << body() << std::flush;
        _exit(0);
    }
    waitpid(pid, nullptr, 0);
    return ReadFile("/tmp/result");
}

/// Something mounted for the length of a scope.
class Mount {
  public:
    Mount(const char* source, const char* target, const char* type, unsigned long flags = 0,
          const char* options = "")
        : target_(target), is_mounted_(mount(source, target, type, flags, options) == 0) {}
    ~Mount() {
        if (is_mounted_) {
            umount2(target_, MNT_DETACH);
        }
    }
    bool IsMounted() const { return is_mounted_; }

  private:
    const char* target_;
    bool is_mounted_;
};

/// A shares file and a volume that are gone after each test.
class PlatformTest : public testing::Test {
  protected:
    PlatformTest() {
        fake::ResetLibc();
        std::filesystem::create_directories("/volume1");
    }
    ~PlatformTest() override {
        std::filesystem::remove_all("/volume1");
        std::filesystem::remove_all("/etc/kesto");
    }
};

}  // namespace platform_test
