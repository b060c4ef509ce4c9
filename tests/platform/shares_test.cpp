#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <kesto/share.h>
#include <kesto/user.h>

#include <memory>

#include "platform/standalone/shares_conf.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;

class SharesTest : public PlatformTest {};

struct Record {
    explicit Record(const char* name) { result = KESTOShareGet(name, &share); }
    ~Record() { KESTOShareFree(share); }
    int result;
    KESTOShare* share = nullptr;
};

/// "NAME=PATH " for each share.
std::string Summary(const kesto::ShareList& shares) {
    std::string text;
    for (const kesto::ShareConf& share : shares) {
        text += share.name + "=" + share.path + " ";
    }
    return text;
}

TEST_F(SharesTest, HostileLinesCostNoGoodShare) {
    const std::string good = "\n[photo]\npath = /volume1/photo\n";
    const std::string name_of_491(491, 'n');
    struct Row {
        const char* label;
        std::string text;
        std::string extra;  // shares beside the good one
        const char* reason;
    };
    const Row rows[] = {
        {"empty", "", "", nullptr},
        {"comments", "# [a]\n; path = /a\n", "", nullptr},
        {"mark, carriage returns", "\xef\xbb\xbf[a]\r\npath = /v/a\r\n", "a=/v/a ", nullptr},
        {"comments in lines", "[a] ; x\npath = /v/a ; y ; z\nread only=no\t;no\n", "a=/v/a ",
         nullptr},
        {"semicolon in a name", "[a;b]\npath = /v/a;b\n", "a;b=/v/a;b ", nullptr},
        {"lines before a section", "path = /volume1/x\n", "", nullptr},
        {"no path", "[a]\nrecycle = yes\n", "", "no path"},
        {"name differs", "[a]\npath = /volume1/b\n", "", "not the last component"},
        {"name differs in case", "[A]\npath = /volume1/a\n", "", "not the last component"},
        {"relative", "[a]\npath = v/a\n", "", "not absolute"},
        {"parent parts", "[a]\npath = /v/../a\n", "", "not absolute"},
        {"double slash", "[a]\npath = /v//a\n", "", "not absolute"},
        {"trailing slash", "[a]\npath = /v/a/\n", "", "not absolute"},
        {"root", "[]\npath = /\n", "", "not absolute"},
        {"open bracket", "[a\npath = /v/a\n", "", "closing bracket"},
        {"no assignment", "[a]\nrubbish\npath = /v/a\n", "a=/v/a ", "neither"},
        {"NUL", std::string("[a]\npath = /v/a\n[b]\npath = /v/b\0\n", 33), "a=/v/a ", "NUL"},
        {"twice", "[a]\npath = /v/a\n[a]\npath = /w/a\n", "a=/v/a ", "exists already"},
        {"the last path counts", "[a]\npath = /v/b\npath = /v/a\n", "a=/v/a ", nullptr},
        {"blanks and case", "[ my dir ]\n\tPath=/v/my dir  \n", "my dir=/v/my dir ", nullptr},
        {"brackets in the name", "[a]b]\npath = /v/a]b\n", "a]b=/v/a]b ", nullptr},
        {"not UTF-8", "[\xff]\npath = /v/\xff\n", "\xff=/v/\xff ", nullptr},
        {"long name", "[" + name_of_491 + "]\npath = /v/" + name_of_491 + "\n",
         name_of_491 + "=/v/" + name_of_491 + " ", nullptr},
        {"too long a name", "[n" + name_of_491 + "]\npath = /v/n" + name_of_491 + "\n", "",
         "too long"},
        {"too long a path", "[a]\npath = /" + std::string(4100, 'x') + "/a\n", "", "too long"},
        {"too long a list", "[a]\npath = /v/a\nusers = " + std::string(5000, 'u') + "\n", "",
         "too long"},
        {"odd flag", "[a]\npath = /v/a\nread only = maybe\n", "a=/v/a ", "neither yes nor no"},
        {"odd number", "[a]\npath = /v/a\nftp privilege = 1x\n", "a=/v/a ", "no number"},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.label);
        fake::ResetLibc();
        EXPECT_EQ(Summary(kesto::ParseShares(row.text + good)),
                  row.extra + "photo=/volume1/photo ");
        const auto lines = fake::LogLinesWith(row.reason == nullptr ? "" : row.reason);
        EXPECT_EQ(lines.size(), row.reason == nullptr ? 0U : 1U);
    }
    std::string rubbish;
    for (int i = 0; i < 100000; ++i) {
        rubbish += "rubbish\n";
    }
    fake::ResetLibc();
    EXPECT_EQ(Summary(kesto::ParseShares(rubbish + good)), "photo=/volume1/photo ");
    EXPECT_EQ(fake::LogLines().size(), 20U);
}

TEST_F(SharesTest, RecordHoldsWhatTheSectionSays) {
    WriteShares(
        "[photo]\npath = /volume1/photo\nREAD ONLY = Yes\nhide unreadable = true\n"
        "encryption = 1\nencrypted = yes\nrecycle = yes\nftp privilege = 4294967295\n"
        "users = alice:rw bob:ro  carol:x root2:rwx\n[plain]\npath = /volume1/plain\n");
    const Record photo("photo");
    ASSERT_EQ(photo.result, 0);
    EXPECT_STREQ(photo.share->szPath, "/volume1/photo");
    EXPECT_EQ(photo.share->ftp_privilege, 4294967295U);
    const Record plain("plain");
    ASSERT_EQ(plain.result, 0);
    const auto getters = {KLIBShareHideUnreadableGet, KLIBShareIsEncryptionGet,
                          KLIBShareIsEncryptedGet, KLIBShareIsReadOnlyGet,
                          KLIBShareRecycleStatusGet};
    for (const auto& getter : getters) {
        int flag = -1;
        EXPECT_EQ(getter(photo.share, &flag), 0);
        EXPECT_EQ(flag, 1);
        EXPECT_EQ(getter(plain.share, &flag), 0);
        EXPECT_EQ(flag, 0);
        EXPECT_LT(getter(nullptr, &flag), 0);
    }
    EXPECT_EQ(KESTOShareUserPrivGet("root", plain.share), KESTO_SHARE_PRIV_WRITE);
    EXPECT_LT(KESTOShareUserPrivGet("nobody-of-that-name", photo.share), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NO_SUCH_USER);
    std::ofstream("/etc/passwd", std::ios::app) << "alice:x:1026:100::/:/bin/sh\n"
                                                   "bob:x:1027:100::/:/bin/sh\n"
                                                   "carol:x:1028:100::/:/bin/sh\n"
                                                   "lice:x:1029:100::/:/bin/sh\n";
    EXPECT_EQ(KESTOShareUserPrivGet("alice", photo.share), KESTO_SHARE_PRIV_WRITE);
    EXPECT_EQ(KESTOShareUserPrivGet("bob", photo.share), KESTO_SHARE_PRIV_READ);
    EXPECT_EQ(KESTOShareUserPrivGet("carol", photo.share), KESTO_SHARE_PRIV_NONE);
    EXPECT_EQ(KESTOShareUserPrivGet("lice", photo.share), KESTO_SHARE_PRIV_NONE);
}

TEST_F(SharesTest, EveryChangeOfTheFileIsSeen) {
    EXPECT_LT(Record("a").result, 0);  // no file: no shares
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NO_SUCH_SHARE);
    EXPECT_STREQ(KLIBCErrorGetFile(), "share.cpp");
    EXPECT_GT(KLIBCErrorGetLine(), 0);
    for (int i = 0; i < 20; ++i) {  // in place, of one size, within one tick of the clock
        const bool is_a = i % 2 == 0;
        WriteShares(is_a ? "[a]\npath = /v/a\n" : "[b]\npath = /v/b\n");
        EXPECT_EQ(Record("a").result, is_a ? 0 : -1) << i;
    }
    timespec old[2] = {{1000, 0}, {1000, 0}};
    utimensat(AT_FDCWD, "/etc/kesto/shares.conf", old, 0);
    EXPECT_EQ(Record("b").result, 0);
    WriteFile("/etc/kesto/new", "[a]\npath = /v/a\n");  // another file of that size and time
    utimensat(AT_FDCWD, "/etc/kesto/new", old, 0);
    std::filesystem::rename("/etc/kesto/new", "/etc/kesto/shares.conf");
    EXPECT_EQ(Record("a").result, 0);

    std::filesystem::remove("/etc/kesto/shares.conf");
    EXPECT_EQ(Record("a").result, -1);
    std::filesystem::create_directory("/etc/kesto/shares.conf");
    EXPECT_EQ(Record("a").result, -1);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
}

TEST_F(SharesTest, LongestRootByComponentsHoldsAPath) {
    WriteShares("[a]\npath = /volume1/a\n[b]\npath = /volume1/a/x/b\n[ab]\npath = /volume1/ab\n");
    const std::pair<const char*, const char*> rows[] = {
        {"/volume1/a", "a"},      {"/volume1/a/", "a"},
        {"/volume1/a/x/bc", "a"}, {"/volume1/a/x/b/c/d", "b"},
        {"/volume1/abc", ""},     {"/volume1/ab/#recycle", "ab"},
        {"/volume1", ""},         {"", ""},
        {"volume1/a", ""},
    };
    for (const auto& [path, expected] : rows) {
        char name[492] = "";
        char root[4096] = "";
        const int result = KESTOShareNamePathGet(path, name, sizeof(name), root, sizeof(root));
        EXPECT_EQ(result, *expected == '\0' ? -1 : 0) << path;
        EXPECT_STREQ(name, expected) << path;
    }
    KLIBCSzList* list = KLIBCSzListAlloc(0);
    EXPECT_EQ(KESTOShareEnum(&list), 0);
    EXPECT_STREQ(KLIBCSzListGet(list, 0), "a");
    EXPECT_STREQ(KLIBCSzListGet(list, 2), "ab");
    EXPECT_EQ(KLIBCSzListGet(list, 3), nullptr);
    EXPECT_EQ(KLIBCSzListGet(list, -1), nullptr);
    KLIBCSzListFree(list);
    char name[3];
    char root[13];
    EXPECT_EQ(KESTOShareNamePathGet("/volume1/ab", name, 3, root, 12), 0);
    for (const auto& [name_size, root_size] : {std::pair(2, 12), {3, 11}, {0, 12}, {3, -1}}) {
        EXPECT_EQ(KESTOShareNamePathGet("/volume1/ab", name, name_size, root, root_size), -1);
        EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_BUFFER_TOO_SMALL);
    }
}

TEST_F(SharesTest, RecycleAndSnapshotDirectoriesLieInTheRoot) {
    WriteShares("[a]\npath = /volume1/a\n");
    const std::pair<const char*, bool> rows[] = {
        {"/volume1/a/#recycle", true},    {"/volume1/a/#recycle/x/y", true},
        {"/volume1/a/#recycled", false},  {"/volume1/a/x/#recycle", false},
        {"/volume1/b/#recycle/x", false},
    };
    for (const auto& [path, is_in] : rows) {
        EXPECT_EQ(KESTOShareIsShareRecycle(path), is_in) << path;
        std::string snapshot = path;
        snapshot.replace(snapshot.find("recycle"), 7, "snapshot");
        int flag = -1;
        EXPECT_EQ(KLIBFhsPathInSnapshot(snapshot.c_str(), &flag), 0);
        EXPECT_EQ(flag, is_in) << snapshot;
        EXPECT_EQ(KLIBFhsPathInSnapshot(path, &flag), 0);
        EXPECT_EQ(flag, 0);
    }
    for (const auto& [name, hidden] : {std::pair("@eaDir", 1),
                                       {"#recycle", 1},
                                       {"#snapshot", 1},
                                       {"@tmp", 1},
                                       {"@EADIR", 0},
                                       {"", 0},
                                       {"@eaDir2", 0}}) {
        EXPECT_EQ(KESTOEAIsHiddenDir(name), hidden) << name;
    }
}

TEST_F(SharesTest, HomesRecycleDirectoriesAreEnumerated) {
    KLIBCSzList* list = KLIBCSzListAlloc(1024);
    const std::unique_ptr<KLIBCSzList, void (*)(KLIBCSzList*)> owner(list, KLIBCSzListFree);
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_LOCAL, 0), 0);
    EXPECT_NE(KESTORecycleHomeEnumRecyclePath(&list), 0);
    WriteShares("[homes]\npath = /volume1/homes\n");
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_LOCAL, 0), 1);
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_DOMAIN, 0), 0);
    EXPECT_NE(KESTORecycleHomeEnumRecyclePath(&list), 0);  // the directory is missing
    for (const char* directory : {"alice/#recycle", "bob/#recycle/x", "carol", "#recycle"}) {
        std::filesystem::create_directories(std::string("/volume1/homes/") + directory);
    }
    std::filesystem::create_directory_symlink("/volume1/homes/bob/#recycle",
                                              "/volume1/homes/carol/#recycle");
    EXPECT_EQ(KESTORecycleHomeEnumRecyclePath(&list), 0);
    EXPECT_GE(KLIBCSzListFind(list, "/volume1/homes/alice/#recycle"), 0);
    EXPECT_GE(KLIBCSzListFind(list, "/volume1/homes/bob/#recycle"), 0);
    for (const char* absent : {"/volume1/homes/carol/#recycle", "/volume1/homes/#recycle/#recycle",
                               "/volume1/homes/alice/#recycle/", "", "alice"}) {
        EXPECT_LT(KLIBCSzListFind(list, absent), 0) << absent;
    }
}

}  // namespace
