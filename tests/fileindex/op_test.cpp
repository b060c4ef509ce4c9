#include "fileindex/op.h"

#include <gtest/gtest.h>

#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

TEST(OPTest, MergesSettings) {
    const struct {
        const char* own;
        const char* newer;
        const char* merged;
    } rows[] = {
        {R"({"audio":true,"document":false})", R"({"audio":false,"photo":false,"x":1})",
         R"({"audio":true,"document":false,"photo":false,"video":false})"},
        {R"({"video":"yes","x":1})", R"({"document":true,"audio":1})",
         R"({"audio":false,"document":true,"photo":false,"video":false,"x":1})"},
        {"null", R"({"photo":true})",
         R"({"audio":false,"document":false,"photo":true,"video":false})"},
        {R"("text")", "[1]", R"({"audio":false,"document":false,"photo":false,"video":false})"},
    };
    for (const auto& row : rows) {
        Json::Value own;
        Json::Value newer;
        ASSERT_TRUE(fromString(own, row.own) && fromString(newer, row.newer));
        OP op(nullptr, OP_UPDATE_CFG, "", own);
        op.MergeData(newer);
        op.MergeData(op.data);  // its own data changes nothing
        EXPECT_EQ(toString(op.data), row.merged);
    }
}

TEST(OPTest, Prints) {
    const auto tree = EmptyTree();
    const auto node = tree->GetNodeByPath("/v/s/b");
    Json::Value data;
    data["audio"] = true;
    for (const auto& op : {std::make_shared<OP>(node, OP_RENAME, "/v/s/a", Json::Value()),
                           std::make_shared<OP>(node, OP_UPDATE_CFG, "", data)}) {
        node->ops.push_back(op);
    }
    EXPECT_EQ(Printed(node),
              "Node[b]: \n  [05] /v/s/a -> /v/s/b\n  [04] /v/s/b, data={\"audio\":true}\n");
    EXPECT_EQ(Printed(std::make_shared<OP>(tree->root, OP_REINDEX_ALL, "", Json::Value())),
              "[07] ");
}

TEST(OPNodeTest, TraversesTheOpsOfTheStart) {
    const auto tree = EmptyTree();
    const auto node = tree->GetNodeByPath("/a");
    node->ops.push_back(std::make_shared<OP>(node, OP_ATTR, "", Json::Value()));
    node->ops.push_back(std::make_shared<OP>(node, OP_DELETE, "", Json::Value()));
    std::vector<int> kinds;
    node->TraverseOP([&](const std::shared_ptr<OP>& op) {
        kinds.push_back(op->op);
        node->ops.pop_back();
    });
    EXPECT_EQ(kinds, (std::vector<int>{OP_ATTR, OP_DELETE}));
}

TEST(OPNodeTest, FindsEachChildInDirectoriesOfAnySize) {
    const auto tree = EmptyTree();
    const auto directory = tree->GetNodeByPath("/d");
    std::vector<std::shared_ptr<OPNode>> made;
    for (int i = 0; i < 3000; ++i) {
        const std::string name = (i % 2 == 0 ? "name" : "NAME") + std::to_string(i / 2);
        made.push_back(directory->GetChild(name));
        EXPECT_EQ(directory->GetChild(name), made.back()) << name;
    }
    EXPECT_EQ(directory->children, made);

    // The vector is the authority, also when somebody else changes it.
    directory->children.resize(2000);
    EXPECT_EQ(directory->GetChild("NAME3"), made[7]);
    EXPECT_NE(directory->GetChild("NAME1400"), made[2801]);
    EXPECT_EQ(directory->children.size(), 2001U);
}

}  // namespace
}  // namespace quivra::fileindex
