#include "programs/fileindexd/scope.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "common/json.h"
#include "fileindex/folder_mgr.h"

namespace fs = std::filesystem;

namespace fileindexd {
namespace {

using quivra::fileindex::kFileIndexFoldersCfgPath;

/// The machine's own platform, with one share.
class ScopeTest : public testing::Test {
  protected:
    ScopeTest() {
        fs::remove_all("/var/packages/Quivra");
        fs::create_directories("/var/packages/Quivra/etc");
        fs::create_directories("/etc/kesto");
        for (const char* directory : {"in/sub/deep", "out/chosen", "in2"}) {
            fs::create_directories("/volume1/s/" + std::string(directory));
        }
        std::ofstream("/etc/kesto/shares.conf") << "[s]\npath = /volume1/s\nrecycle = yes\n";
    }

    static void Configure() {
        const auto folder = [](const char* path, bool audio) {
            return quivra::fileindex::Folder(path, "", true, audio, false, false, false).GetData();
        };
        Json::Value list(Json::arrayValue);
        list.append(folder("/s/in", true));
        list.append(folder("/s/in/sub/deep", false));
        list.append(folder("/s/out/chosen", true));
        ASSERT_TRUE(quivra::toFile(list, kFileIndexFoldersCfgPath));
    }
};

TEST_F(ScopeTest, FoldersDecideWhatIsIndexedAndHow) {
    EXPECT_TRUE(LoadScope()->Covers("/volume1/s/any", true)) << "no folders were chosen yet";
    Configure();
    const auto scope = LoadScope();
    EXPECT_TRUE(scope->Covers("/volume1/s/in", true));
    EXPECT_TRUE(scope->Covers("/volume1/s/out/chosen/a", false));
    EXPECT_FALSE(scope->Covers("/volume1/s/out", true));
    EXPECT_FALSE(scope->Covers("/volume1/s/in/nowhere/a", false));
    EXPECT_TRUE(scope->NeedsMeta("/volume1/s/in/a.mp3"));
    EXPECT_FALSE(scope->NeedsMeta("/volume1/s/in/sub/deep/a.mp3"));

    using Paths = std::vector<std::string>;
    EXPECT_EQ(scope->RootsWithin("/volume1/s/in/sub"), Paths{"/volume1/s/in/sub"});
    EXPECT_EQ(scope->RootsWithin("/volume1/s/out"), Paths{"/volume1/s/out/chosen"});
    EXPECT_TRUE(scope->RootsWithin("/volume1/s/in2").empty());

    EXPECT_TRUE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/out/chosen/b"));
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in/sub/deep/b"));
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in/sub")) << "deep is in it";
    EXPECT_FALSE(scope->HaveSameRules("/volume1/s/in/a", "/volume1/s/in2/b"));
}

}  // namespace
}  // namespace fileindexd
