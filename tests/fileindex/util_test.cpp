#include "fileindex/util.h"

#include <functional>

#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

class PathTest : public LibraryTest {
  protected:
    PathTest() { AddShare("photo"); }
};

TEST_F(PathTest, SharePathsAndFullPathsTurnIntoEachOther) {
    std::string name;
    for (const char* path : {"/photo", "/photo/", "/photo/a/b"}) {
        GetShareNameByPath(name, path);
        EXPECT_EQ(name, "photo") << path;
    }
    for (const char* path : {"", "photo/a"}) {
        const Error error = ErrorOf([&] { GetShareNameByPath(name, path); });
        EXPECT_EQ(error.code, 120);
        EXPECT_EQ(error.reason, path);
    }
    EXPECT_EQ(
        fake::LogLinesWith("Failed [1 > share_path.size() || '/' != share_path.at(0)]").size(), 2U);

    std::string full_path;
    GetFullPath(full_path, "/photo/a");
    EXPECT_EQ(full_path, "/volume1/photo/a");
    GetFullPath(full_path, "/photo");
    EXPECT_EQ(full_path, "/volume1/photo");
    EXPECT_EQ(ErrorOf([&] { GetFullPath(full_path, "/unknown/a"); }).code, 800);

    std::string root;
    GetShareNamePathByFullPath(name, root, "/volume1/photo/a");
    EXPECT_EQ(name + " " + root, "photo /volume1/photo");
    const Error error = ErrorOf([&] { GetShareNamePathByFullPath(name, root, "/elsewhere"); });
    EXPECT_EQ(error.code, 502);
    EXPECT_EQ(error.reason, "KESTOShareNamePathGet failed, full_path=/elsewhere");
}

TEST_F(PathTest, AShareIsReplacedAsAWholeComponent) {
    struct Row {
        const char* path;
        const char* to;
        const char* from;
        const char* result;
    };
    const Row rows[] = {
        {"/volume1/photo/a", "video", "photo", "/volume1/video/a"},
        {"/volume1/photo", "video", "photo", "/volume1/video"},
        {"/photo/photo/a", "p", "photo", "/p/photo/a"},
        {"/photos/photo/a", "v", "photo", "/photos/v/a"},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(ReplacePathShare(row.path, row.to, row.from), row.result);
    }
    const Error error = ErrorOf([] { ReplacePathShare("/volume1/photos/a", "video", "photo"); });
    EXPECT_EQ(error.code, 120);
    EXPECT_EQ(error.reason, "Cannot find share: photo");
}

TEST_F(PathTest, EachRuleAloneDecidesWhatMayBeIndexed) {
    using fake::ShareFlag;
    struct Row {
        const char* rule;
        std::function<void()> arrange;
        std::string path;
        bool indexable;
    };
    const std::string dir = "/volume1/photo/dir";
    const std::string snapshot = "/volume1/photo/#snapshot";
    const std::string recycle = "/volume1/photo/#recycle";
    const Row rows[] = {
        {"plain", [] {}, dir, true},
        {"snapshot", [&] { fake::SetInSnapshot(snapshot); }, snapshot, false},
        {"no answer about snapshots",
         [&] {
             fake::SetInSnapshot(snapshot);
             fake::FailNext("KLIBFhsPathInSnapshot");
         },
         snapshot, true},
        {"unknown type", [] { fake::FailNext("KESTOGetFSType"); }, dir, false},
        {"remote", [&] { fake::SetFSType(dir, fake::kFSRemote); }, dir, false},
        {"image", [&] { fake::SetFSType(dir, fake::kFSImage); }, dir, false},
        {"virtual", [&] { fake::SetFSType(dir, fake::kFSVirtual); }, dir, false},
        {"read-only share", [] { fake::SetFlag("photo", ShareFlag::kReadOnly); }, dir, false},
        {"locked share", [] { fake::SetFlag("photo", ShareFlag::kEncrypted); }, dir, false},
        {"recycle bin", [] { fake::SetFlag("photo", ShareFlag::kRecycle); }, recycle, false},
        {"recycle bin that is off", [] {}, recycle, true},
        {"named like a recycle bin",
         [&] {
             fake::SetFlag("photo", ShareFlag::kRecycle);
             fake::SetRecycle(recycle, 0);
         },
         recycle, true},
        {"mount point", [&] { fake::SetMountPoint(dir); }, dir, false},
        {"mounted encrypted share",
         [&] {
             fake::SetMountPoint(dir);
             fake::SetFlag("photo", ShareFlag::kEncryption);
         },
         dir, true},
        {"symbolic link", [] {}, "/volume1/photo/link", false},
        {"dot dot", [] {}, "/volume1/photo/dir/../dir", false},
        {"trailing slash", [] {}, dir + "/", false},
    };
    for (const Row& row : rows) {
        fake::ResetPlatform();
        AddShare("photo");
        for (const std::string& made : {dir + "/sub", snapshot, recycle}) {
            std::filesystem::create_directories(made);
        }
        std::filesystem::remove("/volume1/photo/link");
        std::filesystem::create_directory_symlink("dir", "/volume1/photo/link");
        row.arrange();
        EXPECT_EQ(CanFullPathBeIndexed(row.path), row.indexable) << row.rule;
    }
    EXPECT_EQ(ErrorOf([] { CanFullPathBeIndexed("/elsewhere"); }).code, 502);
    EXPECT_EQ(ErrorOf([] { CanPathBeIndexed("/unknown"); }).code, 800);
    fake::FailNext("KLIBShareIsEncryptedGet");
    EXPECT_EQ(ErrorOf([] { CanPathBeIndexed("/photo"); }).code, 502);
}

TEST_F(PathTest, HomesHaveRecycleBinsOfTheirOwn) {
    AddShare("homes");
    const std::string recycle = "/volume1/homes/alice/#recycle";
    fake::AddHomeRecyclePath(recycle);
    fake::AddHomeRecyclePath("/volume1/photo/x");
    EXPECT_FALSE(IsFullPathInRecycleBin(recycle));  // homes are off
    for (const int kind : {1, 2, 8}) {
        fake::EnableHomes(kind);
        EXPECT_TRUE(IsFullPathInRecycleBin(recycle)) << kind;
        fake::EnableHomes(kind, false);
    }
    fake::EnableHomes(1);
    fake::ClearCalls();
    EXPECT_FALSE(IsFullPathInRecycleBin("/volume1/homes/bob/#recycle"));
    EXPECT_EQ(fake::CallsOf("KESTOServiceUserHomeIsEnabled"),
              (std::vector<std::string>{"KESTOServiceUserHomeIsEnabled(2, 0)",
                                        "KESTOServiceUserHomeIsEnabled(8, 0)",
                                        "KESTOServiceUserHomeIsEnabled(1, 0)"}));
    EXPECT_FALSE(IsFullPathInRecycleBin("/volume1/photo/x"));  // not the share "homes"
    for (const char* call : {"KLIBCSzListAlloc", "KESTORecycleHomeEnumRecyclePath"}) {
        fake::FailNext(call);
        EXPECT_FALSE(IsFullPathInRecycleBin(recycle)) << call;
    }
    EXPECT_EQ(ErrorOf([] { IsFullPathInRecycleBin("/elsewhere"); }).code, 502);
    fake::FailNext("KLIBShareRecycleStatusGet");
    EXPECT_EQ(ErrorOf([] { IsFullPathInRecycleBin("/volume1/photo/#recycle"); }).code, 502);
}

TEST_F(PathTest, SystemNamesAreRecognised) {
    for (const char* name : {".TemporaryItems", ".KESTOPPSDB", ".DS_Store", "@eaDir"}) {
        EXPECT_TRUE(IsSystemPreservedFileName(name)) << name;
    }
    for (const char* name : {"", "x", ".ds_store", "a/.DS_Store"}) {
        EXPECT_FALSE(IsSystemPreservedFileName(name)) << name;
    }
}

TEST(FileTypeTest, ExtensionsDecide) {
    struct Row {
        const char* path;
        FileType type;
    };
    const Row rows[] = {
        {"README", FileType::kDocument},      {"/a/Photo.JPG", FileType::kImage},
        {"a.tar.gz", FileType::kDocument},    {"x.unknownext", FileType::kOther},
        {"dir.v2/file", FileType::kDocument}, {"name.", FileType::kDocument},
        {"a.prc", FileType::kDocument},       {"list.cue", FileType::kAudio},
        {"x.dvr-ms", FileType::kVideo},       {"x.tx?", FileType::kDocument},
        {"x.\xc3\x84\xff", FileType::kOther}, {"x.ts", FileType::kVideo},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(GetFileTypeByFullPath(row.path), row.type) << row.path;
    }
    EXPECT_EQ(GetFileTypes().size(), 735U);  // 736 pairs, "prc" twice
}

TEST(FileTypeTest, CategoriesHaveTheirQueries) {
    for (const auto& [category, size] : {std::pair{"document", 643U},
                                         {"audio", 172U},
                                         {"video", 217U},
                                         {"image", 229U},
                                         {"other", 0U}}) {
        EXPECT_EQ(GetCategoryQuery(category).size(), size) << category;
    }
    EXPECT_NE(GetCategoryQuery("document").find(" OR eml OR msgc OR c OR "), std::string::npos);
}

}  // namespace
}  // namespace quivra::fileindex
