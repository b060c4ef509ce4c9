#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <linux/magic.h>
#include <sys/acl.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <functional>

#include "platform/standalone/fs_types.h"
#include "platform/standalone/mounts.h"
#include "platform/standalone/quota.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
namespace fs = std::filesystem;

class FilesystemTest : public PlatformTest {};

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

/// Runs a check as an ordinary user, in a process of its own.
bool HoldsAs(uid_t uid, const std::function<bool()>& check) {
    const pid_t pid = fork();
    if (pid == 0) {
        _exit(setegid(uid) == 0 && seteuid(uid) == 0 && check() ? 0 : 1);
    }
    int status = -1;
    waitpid(pid, &status, 0);
    return status == 0;
}

TEST_F(FilesystemTest, SpaceIsWhatTheFileSystemAndTheQuotaLeave) {
    const Mount tiny("tiny", "/volume1", "tmpfs", 0, "size=1m");
    ASSERT_TRUE(tiny.IsMounted());
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", 1000000), 1);
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", 100ULL << 20), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_VOLUME_FULL);
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", ~0ULL), 0);
    WriteFile("/volume1/half", std::string(600000, 'x'));
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1/half", 600000), 0);
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1/gone", 1), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(FilesystemTest, UnlimitedFileSystemHasRoom) {
    const Mount unlimited("unlimited", "/volume1", "tmpfs", 0, "size=0");
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", ~0ULL), 1);
}

TEST_F(FilesystemTest, QuotaCountsUpToItsLimit) {
    struct Row {
        unsigned long long hard_blocks, soft_blocks, used, bytes;
        bool leaves_room;
    };
    const Row rows[] = {
        {0, 0, 1ULL << 40, ~0ULL, true}, {4, 0, 1024, 3072, true},  {4, 0, 1024, 3073, false},
        {4, 2, 3000, 1000, true},        {0, 2, 1024, 1025, false}, {4, 0, 5000, 0, false},
        {4, 0, 0, ~0ULL, false},
    };
    for (const Row& row : rows) {
        dqblk quota{};
        quota.dqb_bhardlimit = row.hard_blocks;
        quota.dqb_bsoftlimit = row.soft_blocks;
        quota.dqb_curspace = row.used;
        EXPECT_EQ(kesto::LeavesRoom(quota, row.bytes), row.leaves_room) << &row - rows;
    }
}

TEST_F(FilesystemTest, UserQuotaCounts) {
    const Mount quota("quota", "/volume1", "tmpfs", 0,
                      "size=8m,mode=1777,usrquota,usrquota_block_hardlimit=2m");
    if (!quota.IsMounted()) {
        GTEST_SKIP() << "no quotas on tmpfs here";
    }
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", 4U << 20), 1);  // root has none
    EXPECT_TRUE(HoldsAs(1026, [] {
        WriteFile("/volume1/mine", std::string(1U << 20, 'x'));
        return KESTOQuotaIsEnough(0, "/volume1", 1U << 19) == 1 &&
               KESTOQuotaIsEnough(0, "/volume1", 3U << 19) == 0 &&
               KLIBCErrGet() == KESTO_ERR_QUOTA_EXCEEDED &&
               KESTOQuotaIsEnough(0, "/volume1", 9U << 20) == 0 &&
               KLIBCErrGet() == KESTO_ERR_VOLUME_FULL;
    }));
}

TEST_F(FilesystemTest, MountRootsAreTold) {
    for (const char* name : {"plain", "source/below", "bound", "tmpfs"}) {
        fs::create_directories(std::string("/volume1/") + name);
    }
    WriteFile("/volume1/file", "");
    WriteFile("/volume1/bound file", "");
    const Mount bind("/volume1/source", "/volume1/bound", nullptr, MS_BIND);
    const Mount bind_file("/volume1/file", "/volume1/bound file", nullptr, MS_BIND);
    const Mount tmpfs("tmpfs", "/volume1/tmpfs", "tmpfs");
    fs::create_symlink("/volume1/bound", "/volume1/link");
    const std::pair<const char*, int> rows[] = {
        {"/", 1},
        {"/volume1/bound", 1},
        {"/volume1/bound/", 1},
        {"/volume1/bound file", 1},
        {"/volume1/tmpfs", 1},
        {"/volume1/plain", 0},
        {"/volume1/source", 0},
        {"/volume1/bound/below", 0},
        {"/volume1/link", 0},
        {"/volume1/gone", -1},
    };
    for (const auto& [path, expected] : rows) {
        EXPECT_EQ(KESTOFSDirIsMntPoint(path), expected) << path;
        EXPECT_EQ(kesto::IsMountRootByTable(path), expected) << path;
    }
}

TEST_F(FilesystemTest, TypesAreClassed) {
    const std::pair<unsigned long, int> magics[] = {
        {0x6969, KESTO_FS_REMOTE},
        {0x517b, KESTO_FS_REMOTE},
        {0xff534d42, KESTO_FS_REMOTE},
        {0xfe534d42, KESTO_FS_REMOTE},
        {0x00c36400, KESTO_FS_REMOTE},
        {0x5346414f, KESTO_FS_REMOTE},
        {0x01021997, KESTO_FS_REMOTE},
        {0x9660, KESTO_FS_IMAGE},
        {0x15013346, KESTO_FS_IMAGE},
        {0x73717368, KESTO_FS_IMAGE},
        {0xe0f5e1e2, KESTO_FS_IMAGE},
        {0x9fa0, 12},
        {0x62656572, 12},
        {0x63677270, 12},
        {0x1cd1, 12},
        {0x64626720, 12},
        {EXT4_SUPER_MAGIC, KESTO_FS_LOCAL},
        {BTRFS_SUPER_MAGIC, KESTO_FS_LOCAL},
        {OVERLAYFS_SUPER_MAGIC, KESTO_FS_LOCAL},
        {0, KESTO_FS_LOCAL},
    };
    for (const auto& [magic, type] : magics) {
        EXPECT_EQ(kesto::TypeCode(magic), type) << std::hex << magic;
    }
    const std::pair<const char*, int> names[] = {
        {"fuse.sshfs", KESTO_FS_REMOTE},
        {"fuse.glusterfs", KESTO_FS_REMOTE},
        {"fuse.rclone", KESTO_FS_REMOTE},
        {"fuse.squashfuse", KESTO_FS_IMAGE},
        {"fuse.mergerfs", KESTO_FS_LOCAL},
        {"fuseblk", KESTO_FS_LOCAL},
        {"", KESTO_FS_LOCAL},
    };
    for (const auto& [name, type] : names) {
        EXPECT_EQ(kesto::FuseTypeCode(name), type) << name;
    }
    EXPECT_TRUE(KESTOFSIsRemoteFS(KESTO_FS_REMOTE) && !KESTOFSIsImageFS(KESTO_FS_REMOTE));
    EXPECT_TRUE(KESTOFSIsImageFS(KESTO_FS_IMAGE) && !KESTOFSIsRemoteFS(KESTO_FS_IMAGE));
    EXPECT_FALSE(KESTOFSIsRemoteFS(KESTO_FS_LOCAL) || KESTOFSIsImageFS(12));
    EXPECT_EQ(KESTOGetFSType("/volume1", 0), KESTO_FS_LOCAL);
    EXPECT_EQ(KESTOGetFSType("/proc/self", 0), 12);
    EXPECT_EQ(KESTOGetFSType("/volume1/gone", 0), -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
}

TEST_F(FilesystemTest, NetworkFuseIsKnownByItsName) {
    const int device = open("/dev/fuse", O_RDWR | O_CLOEXEC);
    // Nobody serves it, so it must belong to a user that no process has: then the kernel answers.
    const std::string options =
        "fd=" + std::to_string(device) + ",rootmode=40000,user_id=4711,group_id=4711";
    const Mount fuse("somewhere:", "/volume1", "fuse.sshfs", 0, options.c_str());
    if (fuse.IsMounted()) {
        EXPECT_EQ(KESTOGetFSType("/volume1", 0), KESTO_FS_REMOTE);
    }
    close(device);
    if (!fuse.IsMounted()) {
        GTEST_SKIP() << "no FUSE here";
    }
}

/// An empty EROFS file system: a superblock and the inode of the root directory.
std::string ErofsImage() {
    std::string image(8192, '\0');
    const auto put = [&](std::size_t offset, std::uint32_t value, std::size_t size) {
        std::memcpy(image.data() + offset, &value, size);
    };
    put(1024, 0xe0f5e1e2, 4);  // magic
    put(1024 + 12, 12, 1);     // log2 of the block size
    put(1024 + 14, 0, 2);      // number of the root inode
    put(1024 + 16, 1, 4);      // inodes
    put(1024 + 36, 2, 4);      // blocks
    put(1024 + 40, 1, 4);      // block of the inodes
    put(4096 + 4, 040755, 2);  // mode
    put(4096 + 6, 2, 2);       // links
    return image;
}

TEST_F(FilesystemTest, MountedImageIsAnImage) {
    WriteFile("/volume1/image", ErofsImage());
    fs::create_directory("/volume1/mounted");
    if (std::system("mount -t erofs -o loop,ro /volume1/image /volume1/mounted 2>/dev/null") != 0) {
        GTEST_SKIP() << "no loop devices or no EROFS here";
    }
    EXPECT_EQ(KESTOGetFSType("/volume1/mounted", 0), KESTO_FS_IMAGE);
    EXPECT_EQ(KESTOFSDirIsMntPoint("/volume1/mounted"), 1);
    umount("/volume1/mounted");
}

TEST_F(FilesystemTest, PermissionsAreTheEffectiveUsers) {
    WriteFile("/volume1/file", "");
    chmod("/volume1/file", 0640);
    errno = 0;
    EXPECT_EQ(KESTOACLPermGet("/volume1/file"), KESTO_ACL_PERM_READ | KESTO_ACL_PERM_WRITE);
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(KESTOACLPermGet("/volume1"), 7);
    EXPECT_EQ(KESTOACLPermGet("/volume1/gone"), -1);
    if (!HasOtherUsers()) {
        GTEST_SKIP() << "one user only";
    }
    EXPECT_TRUE(HoldsAs(1026, [] { return KESTOACLPermGet("/volume1/file") == 0; }));
    const acl_t acl = acl_from_text("u::rw,u:1026:rx,g::r,m::rwx,o::-");
    const bool is_set = acl_set_file("/volume1/file", ACL_TYPE_ACCESS, acl) == 0;
    acl_free(acl);
    if (!is_set) {
        GTEST_SKIP() << "no ACLs on this file system";
    }
    EXPECT_TRUE(HoldsAs(1026, [] {
        return KESTOACLPermGet("/volume1/file") == (KESTO_ACL_PERM_READ | KESTO_ACL_PERM_EXEC);
    }));
    EXPECT_TRUE(HoldsAs(1027, [] { return KESTOACLPermGet("/volume1/file") == 0; }));
}

}  // namespace
