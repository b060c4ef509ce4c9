#include "common/util.h"

#include <gtest/gtest.h>
#include <kesto/filesystem.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

namespace {
int granted_permissions = 0;
int mount_point_answer = 0;
}  // namespace

int KESTOACLPermGet(const char* /*path*/) {
    return granted_permissions;
}
int KESTOFSDirIsMntPoint(const char* /*path*/) {
    return mount_point_answer;
}

namespace quivra {
namespace {

TEST(UtilTest, SplitsNames) {
    const struct {
        const char* path;
        const char* dirname;
        const char* basename;
        const char* extension;
    } rows[] = {
        {"file", "file", "file", ""},
        {"/file", "", "file", ""},
        {"dir/", "dir", "", ""},
        {"/a.b/c", "/a.b", "c", ""},
        {"/a/B.TAR.Gz", "/a", "B.TAR.Gz", "gz"},
        {".profile", ".profile", ".profile", "profile"},
        {"name.", "name.", "name.", ""},
        {"", "", "", ""},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(Dirname(row.path), row.dirname) << row.path;
        EXPECT_EQ(Basename(row.path), row.basename) << row.path;
        EXPECT_EQ(GetFileExtension(row.path, true), row.extension) << row.path;
    }
    EXPECT_EQ(GetFileExtension("a.JPG", false), "JPG");
    EXPECT_TRUE(StringStartWith("abc", ""));
    EXPECT_TRUE(StringStartWith("/volume10", "/volume1"));
    EXPECT_FALSE(StringStartWith("ab", "abc"));
}

TEST(UtilTest, PlatformAnswersDecide) {
    for (const auto& [granted, asked, answer] :
         {std::tuple{-1, 7, false}, {4, 6, true}, {4, 2, false}, {0, 7, false}}) {
        granted_permissions = granted;
        EXPECT_EQ(CheckACLPerm("/x", asked), answer) << granted << " " << asked;
    }
    for (const auto& [raw, answer] : {std::pair{-1, false}, {0, false}, {1, true}}) {
        mount_point_answer = raw;
        EXPECT_EQ(IsMountPoint("/x"), answer) << raw;
    }
}

class FileTestsTest : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_NE(mkdtemp(root_.data()), nullptr);
        std::filesystem::create_directory(root_ + "/dir");
        std::ofstream(root_ + "/file") << "x";
        Link("dir_link", root_ + "/dir");
        Link("file_link", root_ + "/file");
        Link("chain", root_ + "/dir_link");
        Link("relative", "dir");
        Link("loop", root_ + "/loop2");
        Link("loop2", root_ + "/loop");
        Link("dangling", root_ + "/missing");
    }
    void TearDown() override { std::filesystem::remove_all(root_); }
    void Link(const std::string& name, const std::string& target) {
        std::filesystem::create_symlink(target, root_ + "/" + name);
    }

    std::string root_ = "/tmp/util_test.XXXXXX";
};

TEST_F(FileTestsTest, LinksAreNoFiles) {
    EXPECT_TRUE(IsFileExist(root_ + "/file"));
    for (const char* name : {"/dir", "/file_link", "/dangling", "/missing"}) {
        EXPECT_FALSE(IsFileExist(root_ + name)) << name;
    }
}

TEST_F(FileTestsTest, LinksToDirectoriesAreFollowedOnRequest) {
    for (const char* name : {"/dir_link", "/chain"}) {
        EXPECT_FALSE(IsDirExist(root_ + name, false)) << name;
        EXPECT_TRUE(IsDirExist(root_ + name, true)) << name;
    }
    for (const char* name : {"/file_link", "/loop", "/dangling", "/missing", "/file"}) {
        EXPECT_FALSE(IsDirExist(root_ + name, true)) << name;
    }
    EXPECT_TRUE(IsDirExist(root_ + "/dir", false));
}

TEST_F(FileTestsTest, RelativeLinkIsLookedUpFromTheCurrentDirectory) {
    const auto before = std::filesystem::current_path();
    EXPECT_FALSE(IsDirExist(root_ + "/relative", true));
    std::filesystem::current_path(root_);
    EXPECT_TRUE(IsDirExist(root_ + "/relative", true));
    std::filesystem::current_path(before);
}

TEST_F(FileTestsTest, EntryOfUnknownTypeIsNoDirectory) {
    dirent entry{};
    entry.d_type = DT_DIR;
    EXPECT_TRUE(IsDirentDir(entry, root_ + "/dir"));
    for (const unsigned char type : {DT_REG, DT_LNK, DT_UNKNOWN}) {
        entry.d_type = type;
        EXPECT_FALSE(IsDirentDir(entry, root_ + "/dir"));
    }
}

}  // namespace
}  // namespace quivra
