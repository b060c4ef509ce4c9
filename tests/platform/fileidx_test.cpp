#include <kesto/error.h>
#include <kesto/fileidx.h>

#include <cerrno>

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
    static int Compose(const char* root = kRoot, int size = sizeof(path_)) {
        return FILEIDXQueuePathCompose(root, path_, size);
    }
    static inline char path_[4096];
};

TEST_F(FileidxTest, MakesThePrivateDirectoryWhateverTheUmask) {
    const mode_t old_mask = umask(0377);
    EXPECT_EQ(Compose(), 0);
    umask(old_mask);
    EXPECT_STREQ(path_, "/volume1/photo/@eaDir/fileindex/queue");
    EXPECT_EQ(ModeOf(kEaDir), 0755U);
    EXPECT_EQ(ModeOf(kDirectory), 0700U);
    chmod(kDirectory, 0755);
    errno = 0;
    EXPECT_EQ(FILEIDXDBPathCompose(kRoot, path_, sizeof(path_)), 0);
    EXPECT_STREQ(path_, "/volume1/photo/@eaDir/fileindex/db");
    EXPECT_EQ(ModeOf(kDirectory), 0700U);
    EXPECT_EQ(errno, 0);
}

TEST_F(FileidxTest, RefusesWhatSomebodyPlanted) {
    using Plant = void (*)(const char* place);
    const Plant plants[] = {
        [](const char* place) { fs::create_directory_symlink("/volume1/target", place); },
        [](const char* place) { fs::create_symlink("/nowhere", place); },
        [](const char* place) { WriteFile(place, ""); },
        [](const char* place) {
            fs::create_directory(place);
            chmod(place, 0777);
        },
        [](const char* place) {
            fs::create_directory(place);
            EXPECT_EQ(chown(place, 1026, 100), 0);
        },
    };
    fs::create_directory("/volume1/target");
    for (const Plant& plant : plants) {
        if (&plant == std::end(plants) - 1 && !HasOtherUsers()) {
            continue;
        }
        for (const char* place : {kEaDir, kDirectory}) {
            fake::ResetLibc();
            fs::create_directories(fs::path(place).parent_path());
            plant(place);
            EXPECT_EQ(Compose(), -1) << place << &plant - plants;
            EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_UNSAFE_PLACE);
            EXPECT_EQ(Compose(), -1);
            const auto lines = fake::LogLinesWith(place);
            ASSERT_EQ(lines.size(), 1U);  // once for both questions
            EXPECT_EQ(FILEIDXProblem(kRoot, path_, sizeof(path_)), 1);
            EXPECT_EQ(lines[0], std::string("The share is not indexed: ") + path_);
            EXPECT_TRUE(fs::is_empty("/volume1/target"));
            fs::remove_all(kEaDir);
            EXPECT_EQ(FILEIDXProblem(kRoot, path_, sizeof(path_)), 0);
            EXPECT_STREQ(path_, "");
            EXPECT_EQ(Compose(), 0);  // it heals by itself
            fs::remove_all(kEaDir);
        }
    }
}

TEST_F(FileidxTest, ComposesWhereNothingCanBeMade) {
    EXPECT_EQ(Compose("/volume9/gone"), 0);
    EXPECT_STREQ(path_, "/volume9/gone/@eaDir/fileindex/queue");
    {
        const Mount read_only("ro", kRoot, "tmpfs", MS_RDONLY);
        EXPECT_EQ(Compose(), 0);
    }
    EXPECT_EQ(Compose("photo"), -1);
    const int size = sizeof("/volume1/photo/@eaDir/fileindex/queue");
    EXPECT_EQ(Compose(kRoot, size - 1), -1);
}

}  // namespace
