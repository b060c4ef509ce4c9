#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "base/private_directory.h"
#include "programs/sqlite/statement.h"

namespace sqlite {
namespace {

namespace fs = std::filesystem;
using quivra::base::PrivateDirectory;

const std::string kRoot = "/var/lib/sqlite_test";
const std::string kPlace = kRoot + "/@eaDir/store";
constexpr char kFile[] = "store.sqlite";

class SqliteTest : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kRoot);
        fs::create_directories(kRoot);
        directory = PrivateDirectory::Open(kPlace, PrivateDirectory::Make::kMissing);
        ASSERT_TRUE(directory.IsValid());
    }
    void TearDown() override {
        umount2(kRoot.c_str(), MNT_DETACH);
        fs::remove_all(kRoot);
    }
    Database Open(bool read_only = false) const {
        return Database(directory.Fd(), kFile, {.read_only = read_only});
    }
    static std::int64_t Count(Database& database) {
        Statement count(database, "SELECT count(*) FROM t");
        EXPECT_TRUE(count.Step());
        return count.Int(0);
    }
    static int CodeOf(const std::function<void()>& work) {
        try {
            work();
            return SQLITE_OK;
        } catch (const Error& error) {
            return error.code & 0xff;
        }
    }

    PrivateDirectory directory;
};

TEST_F(SqliteTest, KeepsValuesOfEveryKindAndCommitsAsAWhole) {
    Database database = Open();
    database.Execute("CREATE TABLE t(i, d, s, b, n)");
    const std::string bytes("a\0\xff", 3);
    {
        Transaction transaction(database);
        Statement insert(database, "INSERT INTO t VALUES(?, ?, ?, ?, ?)");
        insert.Bind(1, std::int64_t{1} << 62).Bind(2, 0.5).BindText(3, bytes).BindBlob(4, {});
        insert.BindNull(5).Run();
        Database reader = Open(true);
        EXPECT_EQ(Count(reader), 0);
        transaction.Commit();
        EXPECT_EQ(Count(reader), 1);
    }
    {
        Transaction dropped(database);
        database.Execute("DELETE FROM t");
        EXPECT_TRUE(CodeOf([&] { Transaction second(database); }) != SQLITE_OK);
    }
    Statement row(database, "SELECT * FROM t");
    ASSERT_TRUE(row.Step());
    EXPECT_EQ(row.Int(0), std::int64_t{1} << 62);
    EXPECT_EQ(row.Double(1), 0.5);
    EXPECT_EQ(row.Bytes(2), bytes);
    EXPECT_FALSE(row.IsNull(3));
    EXPECT_TRUE(row.IsNull(4));
    EXPECT_FALSE(row.Step());
}

/// Whoever may write to the share's root can rename @eaDir and put another in its place.
TEST_F(SqliteTest, StaysWithItsDirectoryWhenThatIsSwapped) {
    Database database = Open();
    fs::rename(kRoot + "/@eaDir", kRoot + "/away");
    fs::create_directories(kPlace);
    database.Execute("CREATE TABLE t(i); INSERT INTO t VALUES(1)");
    Database reader = Open(true);  // opens the log and its index, too
    EXPECT_EQ(Count(reader), 1);
    EXPECT_TRUE(fs::is_empty(kPlace));
    EXPECT_TRUE(fs::exists(kRoot + "/away/store/" + kFile + "-wal"));
}

TEST_F(SqliteTest, RefusesWhatIsNotItsFile) {
    const std::string path = kPlace + "/" + kFile;
    EXPECT_EQ(CodeOf([&] { Open(true); }), SQLITE_CANTOPEN) << "missing";
    std::ofstream(kRoot + "/victim");
    fs::create_symlink(kRoot + "/victim", path);
    EXPECT_EQ(CodeOf([&] { Open(); }), SQLITE_CANTOPEN) << "a link";
    fs::remove(path);
    ASSERT_EQ(mkfifo(path.c_str(), 0600), 0);
    EXPECT_EQ(CodeOf([&] { Open(); }), SQLITE_CANTOPEN) << "a FIFO";
    fs::remove(path);
    std::ofstream(path) << std::string(9000, 'x');
    EXPECT_EQ(CodeOf([&] { Open(); }), SQLITE_NOTADB) << "no database";
    fs::remove(path);
    Open();
    struct stat status {};
    ASSERT_EQ(stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(SqliteTest, AFullDiskRollsBackAndIsTold) {
    if (mount("none", kRoot.c_str(), "tmpfs", 0, "size=256k") != 0) {
        GTEST_SKIP() << "cannot mount here";
    }
    directory = PrivateDirectory::Open(kPlace, PrivateDirectory::Make::kMissing);
    Database database = Open();
    database.Execute("CREATE TABLE t(b)");
    EXPECT_EQ(CodeOf([&] {
                  Transaction transaction(database);
                  database.Execute("INSERT INTO t VALUES(zeroblob(600000))");
                  transaction.Commit();
              }),
              SQLITE_FULL);
    EXPECT_EQ(Count(database), 0);
    database.Execute("INSERT INTO t VALUES(1)");
    EXPECT_EQ(Count(database), 1);
}

}  // namespace
}  // namespace sqlite
