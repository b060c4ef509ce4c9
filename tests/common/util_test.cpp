#include "common/util.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

namespace quivra {
namespace {

TEST(UtilTest, SplitsNames) {
    const char* const rows[][4] = {
        {"file", "file", "file", ""},
        {"/file", "", "file", ""},
        {"dir/", "dir", "", ""},
        {"/a.b/c", "/a.b", "c", ""},
        {"/a/B.TAR.Gz", "/a", "B.TAR.Gz", "gz"},
        {".profile", ".profile", ".profile", "profile"},
        {"name.", "name.", "name.", ""},
        {"", "", "", ""},
    };
    for (const auto& [path, dirname, basename, extension] : rows) {
        EXPECT_EQ(Dirname(path), dirname) << path;
        EXPECT_EQ(Basename(path), basename) << path;
        EXPECT_EQ(GetFileExtension(path, true), extension) << path;
    }
}

TEST(UtilTest, LinksAreNoFilesAndAreFollowedToDirectoriesOnRequest) {
    const std::string root = "/tmp/util_test";
    std::filesystem::create_directories(root + "/dir");
    std::ofstream(root + "/file") << "x";
    for (const auto& [name, target] : {std::pair{"/dir_link", "/dir"},
                                       {"/chain", "/dir_link"},
                                       {"/file_link", "/file"},
                                       {"/loop", "/loop2"},
                                       {"/loop2", "/loop"},
                                       {"/dangling", "/missing"}}) {
        std::filesystem::create_symlink(root + target, root + name);
    }
    EXPECT_TRUE(IsFileExist(root + "/file"));
    EXPECT_TRUE(IsDirExist(root + "/dir", false));
    for (const char* name : {"/dir_link", "/chain"}) {
        EXPECT_FALSE(IsFileExist(root + name)) << name;
        EXPECT_FALSE(IsDirExist(root + name, false)) << name;
        EXPECT_TRUE(IsDirExist(root + name, true)) << name;
    }
    for (const char* name : {"/file_link", "/loop", "/dangling", "/missing"}) {
        EXPECT_FALSE(IsFileExist(root + name)) << name;
        EXPECT_FALSE(IsDirExist(root + name, true)) << name;
    }
    std::filesystem::remove_all(root);
}

}  // namespace
}  // namespace quivra
