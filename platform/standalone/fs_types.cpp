#include "platform/standalone/fs_types.h"

#include <kesto/filesystem.h>
#include <linux/magic.h>

#include <algorithm>
#include <iterator>

namespace kesto {
namespace {

// Numbers that <linux/magic.h> does not have.
constexpr unsigned long kCifsMagic = 0xff534d42;
constexpr unsigned long kLustreMagic = 0x0bd00bd0;
constexpr unsigned long kFuseControlMagic = 0x65735543;
constexpr unsigned long kMqueueMagic = 0x19800202;
constexpr unsigned long kConfigFsMagic = 0x62656570;
constexpr unsigned long kRpcPipeFsMagic = 0x67596969;
constexpr unsigned long kRomFsMagic = 0x7275;

constexpr unsigned long kRemote[] = {
    NFS_SUPER_MAGIC, SMB_SUPER_MAGIC,  SMB2_SUPER_MAGIC, kCifsMagic,
    V9FS_MAGIC,      CEPH_SUPER_MAGIC, AFS_SUPER_MAGIC,  AFS_FS_MAGIC,
    NCP_SUPER_MAGIC, CODA_SUPER_MAGIC, kLustreMagic,
};

constexpr unsigned long kImage[] = {
    ISOFS_SUPER_MAGIC, UDF_SUPER_MAGIC,   SQUASHFS_MAGIC, EROFS_SUPER_MAGIC_V1,
    CRAMFS_MAGIC,      CRAMFS_MAGIC_WEND, kRomFsMagic,
};

constexpr unsigned long kVirtual[] = {
    PROC_SUPER_MAGIC,   SYSFS_MAGIC,          CGROUP_SUPER_MAGIC, CGROUP2_SUPER_MAGIC,
    DEVPTS_SUPER_MAGIC, DEBUGFS_MAGIC,        TRACEFS_MAGIC,      SECURITYFS_MAGIC,
    SELINUX_MAGIC,      SMACK_MAGIC,          PSTOREFS_MAGIC,     EFIVARFS_MAGIC,
    BPF_FS_MAGIC,       HUGETLBFS_MAGIC,      NSFS_MAGIC,         BINFMTFS_MAGIC,
    AUTOFS_SUPER_MAGIC, RDTGROUP_SUPER_MAGIC, kFuseControlMagic,  kMqueueMagic,
    kConfigFsMagic,     kRpcPipeFsMagic,
};

// A FUSE file system that is in neither list counts as local: a wrong "remote" would take a disk
// out of the index without a word.
constexpr std::string_view kRemoteFuse[] = {
    "sshfs",
    "glusterfs",
    "s3fs",
    "rclone",
    "davfs",
    "davfs2",
    "curlftpfs",
    "goofys",
    "gcsfuse",
    "ceph",
    "ceph-fuse",
    "juicefs",
    "JuiceFS",
    "mfs",
    "mfsmount",
    "lizardfs",
    "seaweedfs",
    "smbnetfs",
    "gvfsd-fuse",
    "blobfuse",
    "blobfuse2",
    "cvmfs2",
    "afpfs",
    "afpfs-ng",
    "nfs",
    "obexfs",
    "hubicfuse",
    "mount-s3",
    "google-drive-ocamlfuse",
    "onedriver",
    "beegfs",
    "ipfs",
};

constexpr std::string_view kImageFuse[] = {
    "squashfuse", "squashfuse_ll", "fuseiso",   "archivemount", "ratarmount",
    "avfsd",      "mount-zip",     "erofsfuse", "fuse-archive",
};

template <typename Table, typename Value>
bool Holds(const Table& table, const Value& value) {
    return std::find(std::begin(table), std::end(table), value) != std::end(table);
}

}  // namespace

int TypeCode(unsigned long magic) {
    return Holds(kRemote, magic)    ? KESTO_FS_REMOTE
           : Holds(kImage, magic)   ? KESTO_FS_IMAGE
           : Holds(kVirtual, magic) ? KESTO_FS_VIRTUAL
                                    : KESTO_FS_LOCAL;
}

int FuseTypeCode(std::string_view name) {
    const std::string_view subtype = name.substr(name.find('.') + 1);  // npos + 1 is 0
    return Holds(kRemoteFuse, subtype)  ? KESTO_FS_REMOTE
           : Holds(kImageFuse, subtype) ? KESTO_FS_IMAGE
                                        : KESTO_FS_LOCAL;
}

}  // namespace kesto
