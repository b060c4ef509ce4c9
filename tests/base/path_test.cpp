#include "base/path.h"

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

namespace {

using namespace quivra::base;

TEST(PathTest, WholeComponentsCountAndTheRootIsAboveAll) {
    struct Row {
        const char* path;
        const char* top;
        bool below;
        bool at_or_below;
    };
    for (const Row& row : {
             Row{"/a/b", "/a", true, true},
             Row{"/a", "/a", false, true},
             Row{"/ab", "/a", false, false},
             Row{"/a", "/a/b", false, false},
             Row{"/a", "/", true, true},
             Row{"/a", "", true, true},
             Row{"/", "/", false, true},
             Row{"relative", "/", false, false},
         }) {
        EXPECT_EQ(IsBelow(row.path, row.top), row.below) << row.path << " below " << row.top;
        EXPECT_EQ(IsAtOrBelow(row.path, row.top), row.at_or_below) << row.path << " " << row.top;
    }
}

TEST(PathTest, OnlyWhatTheKernelWouldGiveIsCanonical) {
    using namespace std::string_literals;
    for (const std::string& path : {"/"s, "/a"s, "/a/..b/.c"s, "/a b/\xff"s}) {
        EXPECT_TRUE(IsCanonicalText(path)) << path;
    }
    for (const std::string& path :
         {""s, "a"s, "//"s, "/a/"s, "/a//b"s, "/."s, "/.."s, "/a/."s, "/a/../b"s, "/a\0b"s}) {
        EXPECT_FALSE(IsCanonicalText(path)) << path;
    }
}

TEST(PathTest, Parts) {
    EXPECT_EQ(Name("/a/b.tar.gz"), "b.tar.gz");
    EXPECT_EQ(Directory("/a/b"), "/a");
    EXPECT_EQ(Directory("/a"), "/");
    EXPECT_EQ(Directory("a"), ".");
    EXPECT_EQ(Extension("/a.b/c"), "");
    EXPECT_EQ(Extension("/a/b.tar.gz"), "gz");
    EXPECT_EQ(Join("/", "a"), "/a");
    EXPECT_EQ(Join("/a", "b"), "/a/b");
    EXPECT_EQ(Moved("/a/b/c", "/a/b", "/x"), "/x/c");
}

TEST(PathTest, SubtreeLeavesOutNeighboursThatSortBetween) {
    const std::set<std::string> paths{"/", "/a", "/a b", "/a-b", "/a/b", "/a/b/c", "/a0", "/b"};
    const auto below = [&](const char* top) {
        const auto [begin, end] = Subtree(paths, top);
        return std::vector<std::string>(begin, end);
    };
    EXPECT_EQ(below("/a"), (std::vector<std::string>{"/a/b", "/a/b/c"}));
    EXPECT_EQ(below("/a/b/c"), std::vector<std::string>());
    EXPECT_EQ(below("/").size(), paths.size() - 1);
}

}  // namespace
