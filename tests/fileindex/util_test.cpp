#include "fileindex/util.h"

#include <kesto/filesystem.h>

#include <functional>

#include "fileindex/elastic/elastic_control.h"
#include "fileindex/path_rules.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

using PathTest = LibraryTest;

TEST_F(PathTest, AShareIsReplacedAsAWholeComponent) {
    EXPECT_EQ(ReplacePathShare("/volume1/photo", "video", "photo"), "/volume1/video");
    EXPECT_EQ(ReplacePathShare("/photos/photo/photo/a", "p", "photo"), "/photos/p/photo/a");
    EXPECT_EQ(ErrorOf([] { ReplacePathShare("/volume1/photos/a", "video", "photo"); }).code, 120);
}

TEST_F(PathTest, EachRuleAloneDecidesWhatMayBeIndexed) {
    struct Row {
        const char* rule;
        std::function<void()> arrange;
        std::string path;
        bool indexable;
    };
    const std::string dir = "/volume1/photo/dir";
    const std::string snapshot = "/volume1/photo/#snapshot";
    const std::string recycle = "/volume1/photo/#recycle";
    const auto set = [](int KESTOShare::*flag) { fake::Platform()->shares.at("photo").*flag = 1; };
    const auto set_type = [&](int type) { fake::Platform()->fs_types[dir] = type; };
    const Row rows[] = {
        {"plain", [] {}, dir, true},
        {"excluded name", [] {}, "/volume1/NetBackup", false},
        {"snapshot", [] {}, snapshot, false},
        {"no answer", [] { fake::FailNext("KLIBFhsPathInSnapshot"); }, snapshot, true},
        {"unknown type", [] { fake::FailNext("KESTOGetFSType"); }, dir, false},
        {"remote", [&] { set_type(KESTO_FS_REMOTE); }, dir, false},
        {"read-only share", [&] { set(&KESTOShare::read_only); }, dir, false},
        {"locked share", [&] { set(&KESTOShare::encrypted); }, dir, false},
        {"recycle bin", [&] { set(&KESTOShare::recycle); }, recycle, false},
        {"recycle bin that is off", [] {}, recycle, true},
        {"mount point", [&] { fake::Platform()->mount_points.insert(dir); }, dir, false},
        {"mounted encrypted share",
         [&] {
             fake::Platform()->mount_points.insert(dir);
             set(&KESTOShare::encryption);
         },
         dir, true},
        {"symbolic link", [] {}, "/volume1/photo/link", false},
        {"dot dot", [] {}, "/volume1/photo/dir/../dir", false},
        {"trailing slash", [] {}, dir + "/", false},
    };
    for (const Row& row : rows) {
        fake::ResetPlatform();
        AddShare("photo");
        AddShare("NetBackup");
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
}

TEST_F(PathTest, AnExaminedPathNamesTheRulesUpToTheFirstThatFails) {
    AddShare("photo");
    std::filesystem::create_directories("/volume1/photo/dir/#recycle");
    std::filesystem::create_directory_symlink("dir", "/volume1/photo/link");
    const struct {
        const char* path;
        std::size_t rules;
        const char* last;
        bool passed;
    } rows[] = {
        {"/volume1/photo/dir", 8, "system names", true},
        {"/volume1/photo", 8, "system names", true},
        {"/volume1/photo/dir/#recycle", 8, "system names", false},
        {"/volume1/photo/gone", 1, "exists", false},
        {"/volume1", 4, "share", false},  // no share: a finding, where the question throws
        {"/volume1/photo/link", 7, "reached without links", false},
    };
    for (const auto& row : rows) {
        const std::vector<PathFinding> findings = ExaminePath(row.path);
        ASSERT_EQ(findings.size(), row.rules) << row.path;
        EXPECT_EQ(findings.back().rule, row.last) << row.path;
        EXPECT_EQ(findings.back().passed, row.passed) << row.path << findings.back().detail;
    }
}

/// FNV-1a: says that a table has changed, without a second copy of it.
std::uint64_t Digest(const std::string& text) {
    std::uint64_t hash = 0xcbf29ce484222325;
    for (const char c : text) {
        hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3;
    }
    return hash;
}

TEST(TablesTest, WhatOthersReadIsFixed) {
    std::string types;
    for (const auto& [extension, type] : GetFileTypes()) {
        types += std::string(extension) + ":" + std::to_string(static_cast<int>(type)) + " ";
    }
    std::string keys;
    for (const std::string_view key : elastic::GetMetadataKeys()) {
        keys += std::string(key) + " ";
    }
    EXPECT_EQ(Digest(types), 0x5e08e8994848fcb3U);
    EXPECT_EQ(Digest(keys), 0x302a655ffdf11b52U);
    EXPECT_EQ(Digest(toString(elastic::GetFileIndexMappings())), 0xc6b44b2fe3f02866U);
    EXPECT_EQ(Digest(GetCategoryQuery("document") + GetCategoryQuery("audio") +
                     GetCategoryQuery("video") + GetCategoryQuery("image")),
              0x5a3e927dee073181U);
}

TEST_F(PathTest, HomesHaveRecycleBinsOfTheirOwn) {
    AddShare("homes");
    AddShare("photo");
    const std::string recycle = "/volume1/homes/alice/#recycle";
    fake::Platform()->home_recycle_paths = {recycle, "/volume1/photo/x"};
    EXPECT_FALSE(IsFullPathInRecycleBin(recycle));  // homes are off
    fake::Platform()->home_kinds = {8};
    EXPECT_TRUE(IsFullPathInRecycleBin(recycle));
    EXPECT_FALSE(IsFullPathInRecycleBin("/volume1/homes/bob/#recycle"));
    EXPECT_FALSE(IsFullPathInRecycleBin("/volume1/photo/x"));  // not the share "homes"
    fake::FailNext("KESTORecycleHomeEnumRecyclePath");
    EXPECT_FALSE(IsFullPathInRecycleBin(recycle));
}

}  // namespace
}  // namespace quivra::fileindex
