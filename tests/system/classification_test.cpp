// Which paths may be indexed, asked of the library on the real platform, with real mounts and
// links.

#include <gtest/gtest.h>
#include <kesto/filesystem.h>
#include <sys/mount.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/util.h"
#include "tests/support/files.h"

namespace {

namespace fs = std::filesystem;
using namespace quivra::fileindex;

/// An empty EROFS file system: a superblock and the inode of the root directory.
std::string ErofsImage() {
    std::string image(8192, '\0');
    const auto put = [&](std::size_t offset, std::uint32_t value, std::size_t size) {
        std::memcpy(image.data() + offset, &value, size);
    };
    put(1024, 0xe0f5e1e2, 4);  // magic
    put(1024 + 12, 12, 1);     // log2 of the block size
    put(1024 + 16, 1, 4);      // inodes
    put(1024 + 36, 2, 4);      // blocks
    put(1024 + 40, 1, 4);      // block of the inodes
    put(4096 + 4, 040755, 2);  // mode
    put(4096 + 6, 2, 2);       // links
    return image;
}

class ClassificationTest : public testing::Test {
  protected:
    void SetUp() override {
        log_level = 0;
        for (const char* path :
             {"/etc/kesto", "/volume1/photo/dir", "/volume1/photo/#recycle", "/volume1/photo/bound",
              "/volume1/photo/tmpfs", "/volume1/photo/image", "/volume1/photo/#snapshot/day",
              "/volume1/keeper/#recycle", "/volume1/vault", "/volume1/locked", "/volume1/fixed",
              "/volume1/NetBackup", "/volume1/homes/ada/#recycle"}) {
            fs::create_directories(path);
        }
        support::WriteFile("/etc/kesto/shares.conf",
                           "[photo]\npath = /volume1/photo\nrecycle = yes\n"
                           "[keeper]\npath = /volume1/keeper\n"
                           "[vault]\npath = /volume1/vault\nencryption = yes\n"
                           "[locked]\npath = /volume1/locked\nencryption = yes\nencrypted = yes\n"
                           "[fixed]\npath = /volume1/fixed\nread only = yes\n"
                           "[NetBackup]\npath = /volume1/NetBackup\n"
                           "[homes]\npath = /volume1/homes\n");
        support::WriteFile("/volume1/photo/dir/a.jpg", "x");
        fs::create_directory_symlink("/volume1/photo/dir", "/volume1/photo/link");
        fs::create_directory_symlink("/volume1/nowhere", "/volume1/photo/dangling");
        Mount("/volume1/photo/dir", "/volume1/photo/bound", "", MS_BIND);
        Mount("none", "/volume1/photo/tmpfs", "tmpfs", 0);
        support::WriteFile("/volume1/photo/tmpfs/file", "x");
        Mount("none", "/volume1/vault", "tmpfs", 0);
    }

    void TearDown() override {
        for (const char* path : {"/volume1/photo/bound", "/volume1/photo/tmpfs", "/volume1/vault",
                                 "/volume1/photo/image"}) {
            umount2(path, MNT_DETACH);
        }
        fs::remove_all("/volume1");
        fs::remove_all("/etc/kesto");
    }

    static void Mount(const char* source, const char* target, const char* type,
                      unsigned long flags) {
        ASSERT_EQ(mount(source, target, type, flags, nullptr), 0) << target;
    }
};

TEST_F(ClassificationTest, EveryRule) {
    const struct {
        const char* path;
        bool indexable;
        const char* rule;
    } rows[] = {
        {"/volume1/photo", true, "a share's root"},
        {"/volume1/photo/dir/a.jpg", true, "a file"},
        {"/volume1/photo/dir/", false, "a trailing slash"},
        {"/volume1/photo/dir/../dir", false, "dots"},
        {"/volume1/photo/link", false, "a link"},
        {"/volume1/photo/link/a.jpg", false, "through a link"},
        {"/volume1/photo/dangling", false, "a link to nowhere"},
        {"/volume1/photo/gone", false, "a missing file"},
        {"/volume1/photo/#snapshot/day", false, "a snapshot"},
        {"/volume1/photo/#recycle", false, "a recycle bin"},
        {"/volume1/photo/#recycle/x", false, "below a recycle bin"},
        {"/volume1/keeper/#recycle", true, "the bin of a share that has it switched off"},
        {"/volume1/homes/ada/#recycle", false, "a user's bin"},
        {"/volume1/photo/bound", false, "a bind mount in a share"},
        {"/volume1/photo/tmpfs", false, "a mounted file system in a share"},
        {"/volume1/photo/tmpfs/file", true, "a file below one"},
        {"/volume1/vault", true, "an unlocked encryption share is a mount point itself"},
        {"/volume1/locked", false, "a locked share"},
        {"/volume1/fixed", false, "a read-only share"},
        {"/volume1/NetBackup", false, "an excluded share"},
        {"/proc/self/status", false, "the kernel's own file system"},
    };
    support::WriteFile("/volume1/photo/#recycle/x", "x");
    for (const auto& row : rows) {
        EXPECT_EQ(CanFullPathBeIndexed(row.path), row.indexable) << row.rule << ": " << row.path;
    }
    EXPECT_THROW(CanFullPathBeIndexed("/volume1"), quivra::Error) << "in no share";
    EXPECT_TRUE(CanPathBeIndexed("/photo/dir"));
}

TEST_F(ClassificationTest, AMountedImageIsNotIndexed) {
    support::WriteFile("/volume1/image", ErofsImage());
    if (std::system("mount -t erofs -o loop,ro /volume1/image /volume1/photo/image 2>/dev/null") !=
        0) {
        GTEST_SKIP() << "no loop devices or no EROFS here";
    }
    // Not only because something is mounted there.
    EXPECT_NE(KESTOFSIsImageFS(KESTOGetFSType("/volume1/photo/image", 0)), 0);
    EXPECT_FALSE(CanFullPathBeIndexed("/volume1/photo/image"));
}

}  // namespace
