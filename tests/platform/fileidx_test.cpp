#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <functional>

#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
namespace fs = std::filesystem;

constexpr const char* kRoot = "/volume1/photo";
constexpr const char* kEaDir = "/volume1/photo/@eaDir";
constexpr const char* kDirectory = "/volume1/photo/@eaDir/fileindex";

class FileidxTest : public PlatformTest {
  protected:
    FileidxTest() { fs::create_directories(kRoot); }
    static int Compose() { return FILEIDXQueuePathCompose(kRoot, path_, sizeof(path_)); }
    static inline char path_[4096];
};

TEST_F(FileidxTest, MakesThePrivateDirectoryWhateverTheUmask) {
    const mode_t old_mask = umask(0377);
    EXPECT_EQ(Compose(), 0);
    umask(old_mask);
    EXPECT_STREQ(path_, "/volume1/photo/@eaDir/fileindex/queue");
    EXPECT_EQ(ModeOf(kEaDir), 0755U);
    EXPECT_EQ(ModeOf(kDirectory), 0700U);
    EXPECT_TRUE(fs::is_empty(kDirectory));
    EXPECT_EQ(FILEIDXDBPathCompose(kRoot, path_, sizeof(path_)), 0);
    EXPECT_STREQ(path_, "/volume1/photo/@eaDir/fileindex/db");

    chmod(kDirectory, 0777);
    errno = 0;
    EXPECT_EQ(Compose(), 0);
    EXPECT_EQ(ModeOf(kDirectory), 0700U);
    EXPECT_EQ(errno, 0);
    EXPECT_TRUE(fake::LogLines().empty());
}

TEST_F(FileidxTest, RefusesWhatSomebodyPlanted) {
    const std::string target = "/volume1/target";
    fs::create_directory(target);
    const auto link = [&](const char* place) { fs::create_directory_symlink(target, place); };
    const auto give_away = [](const char* place) {
        fs::create_directories(place);
        ASSERT_EQ(chown(place, 1026, 100), 0);
    };
    struct Row {
        const char* label;
        std::function<void()> plant;
        bool needs_users;
    };
    const Row rows[] = {
        {"@eaDir a link", [&] { link(kEaDir); }, false},
        {"@eaDir a dangling link", [] { fs::create_symlink("/nowhere", kEaDir); }, false},
        {"@eaDir a file", [] { WriteFile(kEaDir, ""); }, false},
        {"@eaDir a FIFO", [] { mkfifo(kEaDir, 0666); }, false},
        {"@eaDir of another user", [&] { give_away(kEaDir); }, true},
        {"fileindex a link", [&] { fs::create_directory(kEaDir), link(kDirectory); }, false},
        {"fileindex a file", [] { WriteFile(kDirectory, ""); }, false},
        {"fileindex of another user", [&] { give_away(kDirectory); }, true},
    };
    for (const Row& row : rows) {
        if (row.needs_users && !HasOtherUsers()) {
            continue;
        }
        SCOPED_TRACE(row.label);
        fake::ResetLibc();
        row.plant();
        EXPECT_EQ(Compose(), -1);
        EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_UNSAFE_PLACE);
        EXPECT_EQ(fake::LogLinesWith("Remove it to have the share indexed").size(), 1U);
        EXPECT_TRUE(fs::is_empty(target));
        fs::remove_all(kEaDir);
    }
}

TEST_F(FileidxTest, ComposesWhereNothingCanBeMade) {
    EXPECT_EQ(FILEIDXDBPathCompose("/volume9/gone", path_, sizeof(path_)), 0);
    EXPECT_STREQ(path_, "/volume9/gone/@eaDir/fileindex/db");
    EXPECT_FALSE(fs::exists("/volume9"));
    ASSERT_EQ(mount("ro", kRoot, "tmpfs", MS_RDONLY, ""), 0);
    EXPECT_EQ(Compose(), 0);
    EXPECT_FALSE(fs::exists(kEaDir));
    umount(kRoot);

    EXPECT_EQ(FILEIDXQueuePathCompose("photo", path_, sizeof(path_)), -1);
    EXPECT_EQ(FILEIDXQueuePathCompose("", path_, sizeof(path_)), -1);
    const int size = static_cast<int>(std::string("/volume1/photo/@eaDir/fileindex/queue").size());
    for (const int too_small : {size, 1, 0, -1}) {
        EXPECT_EQ(FILEIDXQueuePathCompose(kRoot, path_, too_small), -1);
        EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_BUFFER_TOO_SMALL);
    }
    EXPECT_FALSE(fs::exists(kEaDir));
    EXPECT_EQ(FILEIDXQueuePathCompose(kRoot, path_, size + 1), 0);
}

}  // namespace
