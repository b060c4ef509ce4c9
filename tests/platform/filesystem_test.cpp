#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <linux/magic.h>
#include <poll.h>
#include <unistd.h>

#include <cerrno>

#include "platform/standalone/fs_types.h"
#include "platform/standalone/mounts.h"
#include "platform/standalone/quota.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
namespace fs = std::filesystem;

class FilesystemTest : public PlatformTest {};

TEST_F(FilesystemTest, SpaceIsWhatTheFileSystemAndTheQuotaLeave) {
    {
        const Mount unlimited("unlimited", "/volume1", "tmpfs", 0, "size=0");
        EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", ~0ULL), 1);
    }
    const Mount tiny("tiny", "/volume1", "tmpfs", 0, "size=1m");
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", 1000000), 1);
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1", ~0ULL), 0);
    WriteFile("/volume1/half", std::string(600000, 'x'));
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1/half", 600000), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_VOLUME_FULL);
    EXPECT_EQ(KESTOQuotaIsEnough(0, "/volume1/gone", 1), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
    dqblk quota{};
    quota.dqb_bhardlimit = 4;
    quota.dqb_curspace = 1024;
    EXPECT_TRUE(kesto::LeavesRoom(quota, 3072));
    EXPECT_FALSE(kesto::LeavesRoom(quota, 3073));
    quota.dqb_curspace = 5000;
    EXPECT_FALSE(kesto::LeavesRoom(quota, 0));
}

TEST_F(FilesystemTest, MountRootsAreTold) {
    for (const char* name : {"source/below", "bound", "tmpfs"}) {
        fs::create_directories(std::string("/volume1/") + name);
    }
    WriteFile("/volume1/bound file", "");
    const Mount bind("/volume1/source", "/volume1/bound", nullptr, MS_BIND);
    const Mount bind_file("/etc/passwd", "/volume1/bound file", nullptr, MS_BIND);
    const Mount tmpfs("tmpfs", "/volume1/tmpfs", "tmpfs");
    fs::create_symlink("/volume1/bound", "/volume1/link");
    const std::pair<const char*, int> rows[] = {
        {"/volume1/bound/", 1}, {"/volume1/bound file", 1},  {"/volume1/tmpfs", 1},
        {"/volume1/source", 0}, {"/volume1/bound/below", 0}, {"/volume1/link", 0},
        {"/volume1/gone", -1},
    };
    for (const auto& [path, expected] : rows) {
        EXPECT_EQ(KESTOFSDirIsMntPoint(path), expected) << path;
        EXPECT_EQ(kesto::IsMountRootByTable(path), expected) << path;
    }
}

TEST_F(FilesystemTest, MountsAreWatched) {
    const char* odd = "/volume1/a b\\\n\t";
    fs::create_directories(odd);
    const quivra::base::UniqueFd watch = kesto::WatchMounts();
    pollfd entry{watch.Get(), POLLPRI, 0};
    EXPECT_EQ(poll(&entry, 1, 0), 0);
    {
        const Mount tmpfs("tmpfs", odd, "tmpfs");
        EXPECT_EQ(poll(&entry, 1, 0), 1);
        EXPECT_EQ(poll(&entry, 1, 0), 0);
        EXPECT_TRUE(kesto::ReadMountPoints().value().contains(odd));
    }
    EXPECT_EQ(poll(&entry, 1, 0), 1);
    EXPECT_FALSE(kesto::ReadMountPoints().value().contains(odd));
}

TEST_F(FilesystemTest, TypesAreClassed) {
    EXPECT_EQ(kesto::TypeCode(SQUASHFS_MAGIC), KESTO_FS_IMAGE);
    EXPECT_EQ(kesto::FuseTypeCode("fuseblk"), KESTO_FS_LOCAL);
    for (const int type : {KESTO_FS_LOCAL, KESTO_FS_VIRTUAL, KESTO_FS_REMOTE, KESTO_FS_IMAGE}) {
        EXPECT_EQ(KESTOFSIsRemoteFS(type) != 0, type == KESTO_FS_REMOTE) << type;
        EXPECT_EQ(KESTOFSIsImageFS(type) != 0, type == KESTO_FS_IMAGE) << type;
    }
    EXPECT_EQ(KESTOGetFSType("/volume1", 0), KESTO_FS_LOCAL);
    EXPECT_EQ(KESTOGetFSType("/proc/self", 0), 12);
    EXPECT_EQ(KESTOGetFSType("/volume1/gone", 0), -1);
    const int device = open("/dev/fuse", O_RDWR | O_CLOEXEC);
    // Nobody serves it, so it must belong to a user that no process has: then the kernel answers.
    const std::string options =
        "fd=" + std::to_string(device) + ",rootmode=40000,user_id=4711,group_id=4711";
    const Mount fuse("somewhere:", "/volume1", "fuse.sshfs", 0, options.c_str());
    if (fuse.IsMounted()) {
        EXPECT_EQ(KESTOGetFSType("/volume1", 0), KESTO_FS_REMOTE);
    }
    close(device);
}

TEST_F(FilesystemTest, PermissionsAreTheEffectiveUsers) {
    WriteFile("/volume1/file", "");
    chmod("/volume1/file", 0640);
    errno = 0;
    EXPECT_EQ(KESTOACLPermGet("/volume1/file"), KESTO_ACL_PERM_READ | KESTO_ACL_PERM_WRITE);
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(KESTOACLPermGet("/volume1/gone"), -1);
    if (HasOtherUsers()) {
        EXPECT_EQ(InChild([] {
                      const bool switched = seteuid(1026) == 0;
                      return switched ? std::to_string(KESTOACLPermGet("/volume1/file")) : "";
                  }),
                  std::to_string(KESTO_ACL_PERM_READ));
    }
}

}  // namespace
