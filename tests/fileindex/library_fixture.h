#pragma once

#include <gtest/gtest.h>
#include <json/json.h>
#include <poll.h>

#include <chrono>
#include <filesystem>
#include <string>

#include "common/error.h"
#include "common/json.h"
#include "tests/fake/fake_libc.h"
#include "tests/fake/fake_platform.h"
#include "tests/support/files.h"

namespace quivra::fileindex {

inline constexpr const char* kSearchSocket = "/var/run/kestoelasticd.sock";
inline constexpr const char* kDaemonSocket = "/var/run/fileindexd.sock";

/// A machine with the package's configuration directory and nothing configured.
class LibraryTest : public testing::Test {
  protected:
    LibraryTest() {
        fake::ResetLibc();
        fake::ResetPlatform();
        std::filesystem::remove_all("/var/packages/Quivra");
        std::filesystem::create_directories("/var/packages/Quivra/etc");
        std::filesystem::remove_all("/volume1");
    }

    /// A share with a root directory, so that its queue has a place.
    static void AddShare(const std::string& name, const std::string& volume = "/volume1") {
        std::filesystem::create_directories(volume + "/" + name);
        fake::AddShare(name, volume + "/" + name);
    }
};

/// The Error that the call throws; code 0 when it throws none.
template <typename Call>
Error ErrorOf(Call&& call) {
    try {
        call();
    } catch (const Error& error) {
        return error;
    }
    return Error(0, "nothing was thrown");
}

inline Json::Value Parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(value, text)) << text;
    return value;
}

using support::ReadFile;
using support::WriteFile;

inline std::size_t OpenDescriptors() {
    const std::filesystem::directory_iterator entries("/proc/self/fd");
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

/// Whether no more descriptors are open than before. Waits for the servers' threads, which close
/// their ends some time after the reply.
inline bool NoneLeaked(std::size_t before) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (OpenDescriptors() > before && std::chrono::steady_clock::now() < deadline) {
        poll(nullptr, 0, 1);
    }
    return OpenDescriptors() <= before;
}

}  // namespace quivra::fileindex
