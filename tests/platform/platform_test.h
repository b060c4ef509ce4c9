#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
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

inline void WriteShares(const std::string& text) {
    WriteFile("/etc/kesto/shares.conf", text);
}

inline unsigned int ModeOf(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

/// Whether other users than root exist here; a user namespace may map one id only.
inline bool HasOtherUsers() {
    return ReadFile("/proc/self/uid_map").find("4294967295") != std::string::npos;
}

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
