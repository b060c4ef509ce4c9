#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <kesto/share.h>
#include <kesto/user.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <ctime>
#include <memory>

#include "platform/standalone/shares_conf.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;

constexpr const char* kSharesPath = "/etc/kesto/shares.conf";

std::time_t clock_offset = 0;

class SharesTest : public PlatformTest {
  protected:
    ~SharesTest() override { clock_offset = 0; }
};

using Record = std::unique_ptr<KESTOShare, void (*)(KESTOShare*)>;

Record GetShare(const char* name) {
    KESTOShare* share = nullptr;
    KESTOShareGet(name, &share);
    return {share, KESTOShareFree};
}

TEST_F(SharesTest, HostileLinesCostNoGoodShare) {
    const std::string long_name(492, 'n');
    struct Row {
        std::string text;
        std::string extra;  // the share beside the good one
        const char* reason = "";
    };
    const Row rows[] = {
        {"# [a]\n; path = /a\n", ""},
        {"path = /v/a\n", "",
         ":1: the assignment stands before the first section: \"path = /v/a\""},
        {"\xef\xbb\xbf[a]\r\npath = /v/a\r\n", "/v/a"},
        {"[a;b] ; x\npath = /v/a;b ; y ; z\nREAD only=no\t;no\n", "/v/a;b"},
        {"\n[a]\npath = /v/a/\n", "", ":3: the path ends with a slash; remove it: \"/v/a/\""},
        {"[a]\npth = /v/a\npath = /v/a\n", "/v/a", ":2: unknown key \"pth\""},
        {"[a]\npath = /v/a\nusers = ada:rw bob\n", "/v/a", ":3: not NAME:rw or NAME:ro: \"bob\""},
        {"[a]\npath = /v/a\nusers = ada:x\n", "/v/a", ":3: not NAME:rw or NAME:ro: \"ada:x\""},
        {"[a]\npath = /\n", "", "not absolute"},
        {"[a\x1b[2J]\n", "", "no path: \"a?[2J\""},
        {"[a]\nrecycle = yes\n", "", ":1: the section has no path: \"a\""},
        {"[A]\npath = /volume1/a\n", "", "not the last component"},
        {"[a]\npath = v/a\n", "", "not absolute"},
        {"[a]\npath = /v/../a\n", "", "not absolute"},
        {"[a\npath = /v/a\n", "", ":1: the section's closing bracket is missing: \"[a\""},
        {"[a]\nrubbish\npath = /v/a\n", "/v/a", "neither"},
        {std::string("[a]\npath = /v/a\0\npath = /v/a\n", 29), "/v/a", "NUL"},
        {"[a]\npath = /v/a\n[a]\npath = /w/a\n", "/v/a", "exists already"},
        {"[" + long_name + "]\npath = /v/" + long_name + "\n", "", "too long"},
        {"[a]\npath = /v/a\nusers = " + std::string(5000, 'u') + ":rw\n", "", "too long"},
        {"[a]\npath = /v/a\nread only = maybe\n", "/v/a", "neither yes nor no"},
        {"[a]\npath = /v/a\nftp privilege = 7x\n", "/v/a", "not a number: \"7x\""},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.text);
        const auto [shares, problems, is_readable] =
            kesto::ParseShares(row.text + "\n[photo]\npath = /volume1/photo\n");
        ASSERT_EQ(shares.size(), row.extra.empty() ? 1U : 2U);
        EXPECT_EQ(shares.back().path, "/volume1/photo");
        EXPECT_TRUE(row.extra.empty() || shares.front().path == row.extra);
        ASSERT_EQ(problems.size(), *row.reason == '\0' ? 0U : 1U);
        EXPECT_TRUE(problems.empty() || problems[0].find(row.reason) != std::string::npos)
            << problems[0];
    }
    std::string rubbish;
    for (int i = 0; i < 1000; ++i) {
        rubbish += "rubbish\n";
    }
    const kesto::SharesConf conf = kesto::ParseShares(rubbish);
    EXPECT_EQ(conf.problems.size(), 21U);
    EXPECT_EQ(conf.problems.back(), "/etc/kesto/shares.conf: 980 more lines are wrong");
}

/// What KESTOShareEnumProblems tells.
std::string Problems() {
    KLIBCSzList* list = KLIBCSzListAlloc(0);
    EXPECT_EQ(KESTOShareEnumProblems(&list), 0);
    std::string text;
    for (int i = 0; const char* problem = KLIBCSzListGet(list, i); ++i) {
        text += std::string(problem) + "\n";
    }
    KLIBCSzListFree(list);
    return text;
}

TEST_F(SharesTest, MistakesAreToldToProgramsAndLoggedOnce) {
    EXPECT_EQ(Problems(), "");  // no file
    WriteFile(kSharesPath, "[a]\npath = /v/a\nrecycled = yes\n");
    for (int i = 0; i < 3; ++i) {
        EXPECT_TRUE(GetShare("a"));
        EXPECT_EQ(Problems(), "/etc/kesto/shares.conf:3: unknown key \"recycled\"\n");
    }
    EXPECT_EQ(fake::LogLines().size(), 1U);
    WriteFile(kSharesPath, "[a]\npath = /v/a\n");
    EXPECT_EQ(Problems(), "");
    std::filesystem::remove(kSharesPath);
    std::filesystem::create_directory(kSharesPath);
    EXPECT_FALSE(GetShare("a"));
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_SYSTEM);
    EXPECT_EQ(Problems(), "/etc/kesto/shares.conf: Invalid argument\n");
    EXPECT_EQ(fake::LogLines().size(), 2U);
}

TEST_F(SharesTest, RecordHoldsWhatTheSectionSays) {
    WriteFile(kSharesPath,
              "[photo]\npath = /volume1/photo\nREAD ONLY = Yes\nencryption = 1\n"
              "users = alice:rw bob:ro  carol:x\n[plain]\npath = /volume1/plain\n");
    const Record photo = GetShare("photo");
    const Record plain = GetShare("plain");
    ASSERT_TRUE(photo && plain);
    int flag = -1;
    EXPECT_TRUE(KLIBShareIsReadOnlyGet(photo.get(), &flag) == 0 && flag == 1);
    EXPECT_TRUE(KLIBShareIsEncryptedGet(photo.get(), &flag) == 0 && flag == 0);
    EXPECT_TRUE(KLIBShareIsReadOnlyGet(plain.get(), &flag) == 0 && flag == 0);
    WriteFile("/etc/passwd",
              "root:x:0:0::/:/bin/sh\nalice:x:1026:100::/:/bin/sh\nlice:x:1026:100::/:/bin/sh\n"
              "bob:x:1027:100::/:/bin/sh\n");
    EXPECT_EQ(KESTOShareUserPrivGet("alice", photo.get()), KESTO_SHARE_PRIV_WRITE);
    EXPECT_EQ(KESTOShareUserPrivGet("bob", photo.get()), KESTO_SHARE_PRIV_READ);
    EXPECT_EQ(KESTOShareUserPrivGet("lice", photo.get()), KESTO_SHARE_PRIV_NONE);
    EXPECT_LT(KESTOShareUserPrivGet("carol", photo.get()), 0);
    EXPECT_EQ(KLIBCErrGet(), KESTO_ERR_NO_SUCH_USER);
    EXPECT_EQ(KESTOShareUserPrivGet("root", plain.get()), KESTO_SHARE_PRIV_WRITE);
}

TEST_F(SharesTest, EveryChangeOfTheFileIsSeen) {
    const auto write = [](const char* path, const std::string& share, std::time_t modified) {
        WriteFile(path, "[" + share + "]\npath = /v/" + share + "\n");
        const timespec times[2] = {{modified, 0}, {modified, 7}};
        utimensat(AT_FDCWD, path, times, 0);
    };
    EXPECT_FALSE(GetShare("a"));  // no file: no shares
    write(kSharesPath, "a", 1000);
    EXPECT_TRUE(GetShare("a"));
    write(kSharesPath, "b", 1000);  // in place, of one size, perhaps within one tick of the clock
    EXPECT_FALSE(GetShare("a"));
    clock_offset = 10;  // now it counts as known, and is not read again
    EXPECT_TRUE(GetShare("b"));
    write(kSharesPath, "a", 1001);
    EXPECT_TRUE(GetShare("a"));
    write("/etc/kesto/new", "b", 1001);  // another file of that size and time
    std::filesystem::rename("/etc/kesto/new", kSharesPath);
    EXPECT_TRUE(GetShare("b"));
    write(kSharesPath, "longer", 1001);
    EXPECT_TRUE(GetShare("longer"));
    std::filesystem::remove(kSharesPath);
    EXPECT_FALSE(GetShare("longer"));
}

TEST_F(SharesTest, HomesHaveRecycleBinsOfTheirOwn) {
    KLIBCSzList* list = KLIBCSzListAlloc(0);
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_LOCAL, 0), 0);
    EXPECT_LT(KESTORecycleHomeEnumRecyclePath(&list), 0);
    WriteFile(kSharesPath, "[homes]\npath = /volume1/homes\n");
    for (const char* name : {"alice/#recycle", "bob", "carol/#recycle", ".trash/#recycle"}) {
        std::filesystem::create_directories(std::string("/volume1/homes/") + name);
    }
    std::filesystem::create_directory_symlink("/volume1", "/volume1/homes/bob/#recycle");
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_LOCAL, 0), 1);
    EXPECT_EQ(KESTOServiceUserHomeIsEnabled(KESTO_USER_HOME_DOMAIN, 0), 0);
    EXPECT_EQ(KESTORecycleHomeEnumRecyclePath(&list), 0);
    EXPECT_GE(KLIBCSzListFind(list, "/volume1/homes/alice/#recycle"), 0);
    EXPECT_GE(KLIBCSzListFind(list, "/volume1/homes/carol/#recycle"), 0);
    EXPECT_EQ(KLIBCSzListGet(list, 2), nullptr);
    KLIBCSzListFree(list);
}

TEST_F(SharesTest, LongestRootByComponentsHoldsAPath) {
    WriteFile(kSharesPath,
              "[a]\npath = /volume1/a\n[b]\npath = /volume1/a/x/b\n[ab]\npath = /volume1/ab\n");
    struct Row {
        const char* path;
        const char* share;
        bool is_recycled;
    };
    const Row rows[] = {
        {"/volume1/a/", "a", false},          {"/volume1/a/x/bc", "a", false},
        {"/volume1/a/x/b/c/d", "b", false},   {"/volume1/abc", "", false},
        {"/volume1/ab/#recycle", "ab", true}, {"/volume1/a/#recycle/x/y", "a", true},
        {"/volume1/a/#recycled", "a", false}, {"/volume1/a/x/#recycle", "a", false},
        {"/volume1/abc/#recycle", "", false}, {"", "", false},
    };
    char name[492];
    char root[4096];
    for (const Row& row : rows) {
        *name = '\0';
        KESTOShareNamePathGet(row.path, name, sizeof(name), root, sizeof(root));
        EXPECT_STREQ(name, row.share) << row.path;
        EXPECT_EQ(KESTOShareIsShareRecycle(row.path), row.is_recycled) << row.path;
    }
    int is_in_snapshot = -1;
    EXPECT_EQ(KLIBFhsPathInSnapshot("/volume1/a/#snapshot/x", &is_in_snapshot), 0);
    EXPECT_EQ(is_in_snapshot, 1);
    EXPECT_EQ(KESTOShareNamePathGet("/volume1/ab", name, 2, root, 12), -1);
    EXPECT_EQ(KESTOShareNamePathGet("/volume1/ab", name, 3, root, 11), -1);
}

}  // namespace

extern "C" int clock_gettime(clockid_t clock, timespec* now) noexcept {
    const long result = syscall(SYS_clock_gettime, clock, now);
    now->tv_sec += clock == CLOCK_REALTIME ? clock_offset : 0;
    return static_cast<int>(result);
}
