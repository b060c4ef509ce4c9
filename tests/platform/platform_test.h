#pragma once

#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <string>

#include "tests/fake/fake_libc.h"
#include "tests/support/files.h"
#include "tests/support/users.h"

namespace platform_test {

using support::HasOtherUsers;
using support::InChild;
using support::ModeOf;
using support::ReadFile;
using support::WriteFile;

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
