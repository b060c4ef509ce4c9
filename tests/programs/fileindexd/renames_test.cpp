#include "programs/fileindexd/renames.h"

#include <gtest/gtest.h>

#include <set>

namespace fileindexd {
namespace {

using Plan = Rename::Plan;

TEST(PlanRenamesTest, TrustsWhatNoOtherRenameTouches) {
    struct Case {
        const char* name;
        std::vector<std::pair<std::string, std::string>> renames;
        std::set<std::string> documents;
        std::vector<Plan> plans;
    };
    const Case cases[] = {
        {"neighbours with a common prefix",
         {{"/a", "/b"}, {"/a-", "/b-"}},
         {"/a", "/a-"},
         {Plan::kMove, Plan::kMove}},
        {"exchange",
         {{"/a", "/b"}, {"/b", "/a"}, {"/t", "/b"}},
         {"/a", "/b"},
         {Plan::kReplace, Plan::kReplace, Plan::kNone}},
        {"chain", {{"/a", "/c"}, {"/b", "/c"}}, {"/a"}, {Plan::kMove, Plan::kNone}},
        {"chain over a replaced object",
         {{"/a", "/c"}, {"/b", "/c"}},
         {"/a", "/b"},
         {Plan::kReplace, Plan::kReplace}},
        {"rotation", {{"/b", "/c"}, {"/a", "/b"}}, {"/a", "/b"}, {Plan::kMove, Plan::kMove}},
        {"only the deeper one is doubted",
         {{"/d/x", "/e/y"}, {"/d", "/e"}},
         {"/d", "/d/x"},
         {Plan::kReplace, Plan::kMove}},
        {"repeats count once", {{"/t", "/a"}, {"/t", "/a"}}, {"/t"}, {Plan::kMove}},
        {"into itself", {{"/a", "/a/b"}}, {"/a"}, {Plan::kReplace}},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.name);
        std::vector<Rename> renames;
        for (const auto& [from, to] : test.renames) {
            renames.push_back({from, to, Plan::kMove});
        }
        PlanRenames(renames,
                    [&](const std::string& path) { return test.documents.contains(path); });
        std::vector<Plan> plans;
        for (const Rename& rename : renames) {
            plans.push_back(rename.plan);
        }
        EXPECT_EQ(plans, test.plans);
    }
}

}  // namespace
}  // namespace fileindexd
