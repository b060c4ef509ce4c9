#include "fileindex/optree.h"

#include <gtest/gtest.h>

#include "common/log.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

using Ops = std::vector<std::string>;

constexpr unsigned int kCreate = EVENT_CREATE;
constexpr unsigned int kModify = EVENT_MODIFY;
constexpr unsigned int kDelete = EVENT_DELETE;
constexpr unsigned int kAttr = EVENT_ATTR;
constexpr unsigned int kUpdateCfg = EVENT_UPDATE_CFG;
constexpr unsigned int kReindex = EVENT_REINDEX;
constexpr unsigned int kRename = EVENT_RENAME;

std::string Config(const std::string& data) {
    return Line(kUpdateCfg, "/f", "", false, data);
}

/// An event that leaves one op of the kind on /f.
std::string Pending(FileIndexOP kind) {
    switch (kind) {
        case OP_DELETE:
            return Line(kDelete, "/f");
        case OP_UPSERT:
            return Line(kCreate, "/f");
        case OP_ATTR:
            return Line(kAttr, "/f");
        case OP_UPDATE_CFG:
            return Config(R"({"audio":true})");
        case OP_RENAME:
            return Line(kRename, "/f", "/o");
        default:
            return Line(kReindex, "/f");
    }
}

TEST(OPTreeTest, CoalescesByTheTable) {
    const std::string old_data = R"({"audio":true,"document":false,"photo":true,"video":false})";
    const std::string moved = "[05] /o -> /f";
    const std::string new_data = R"({"photo":true})";
    const std::string configured = "[04] /f, data=" + new_data;
    const std::string pending = R"([04] /f, data={"audio":true})";
    const struct {
        FileIndexOP existing;
        std::vector<Ops> outcome;  // create, modify, delete, attr, update-cfg, reindex
    } rows[] = {
        {OP_DELETE, {{"[02] /f"}, {"[01] /f"}, {"[01] /f"}, {"[01] /f"}, {"[01] /f"}, {"[01] /f"}}},
        {OP_UPSERT,
         {{"[02] /f"}, {"[02] /f"}, {"[01] /f"}, {"[02] /f"}, {configured}, {"[06] /f"}}},
        {OP_ATTR, {{"[02] /f"}, {"[02] /f"}, {"[01] /f"}, {"[03] /f"}, {configured}, {"[06] /f"}}},
        {OP_UPDATE_CFG,
         {{pending},
          {pending},
          {pending, "[01] /f"},
          {pending},
          {"[04] /f, data=" + old_data},
          {"[06] /f"}}},
        {OP_RENAME,
         {{moved, "[02] /f"},
          {moved, "[02] /f"},
          {moved, "[01] /f"},
          {moved, "[03] /f"},
          {moved, configured},
          {moved, "[06] /f"}}},
        {OP_REINDEX,
         {{"[06] /f"}, {"[06] /f"}, {"[06] /f", "[01] /f"}, {"[06] /f"}, {"[06] /f"}, {"[06] /f"}}},
    };
    const std::vector<std::string> incoming = {Line(kCreate, "/f"), Line(kModify, "/f"),
                                               Line(kDelete, "/f"), Line(kAttr, "/f"),
                                               Config(new_data),    Line(kReindex, "/f")};
    for (const auto& row : rows) {
        for (std::size_t i = 0; i < incoming.size(); ++i) {
            const auto tree = TreeOf({Pending(row.existing), incoming[i]});
            VerifyTree(*tree);
            EXPECT_EQ(Surviving(*tree), row.outcome[i]) << row.existing << ", " << incoming[i];
            EXPECT_EQ(tree->ProcessOP([](auto) {}), 2);
        }
    }
}

TEST(OPTreeTest, FoldsSequences) {
    const bool dir = true;
    const struct {
        const char* name;
        std::vector<std::string> lines;
        Ops ops;
        int consumed;
    } rows[] = {
        {"repeated work",
         {Line(kCreate, "/f"), Line(kModify, "/f"), Line(kModify, "/f")},
         {"[02] /f"},
         3},
        {"nothing", {}, {}, 0},
        {"a line without known bits", {Line(0x8, "/f")}, {}, 0},
        {"a directory's delete is a reindex", {Line(kDelete, "/d", "", dir)}, {"[06] /d"}, 1},
        {"a reindex covers what is below, but no rename and no neighbour",
         {Line(kModify, "/s/d/f"), Line(kModify, "/s/d2"), Line(kRename, "/s/d/n", "/s/x"),
          Line(kModify, "/s/d/n"), Line(kCreate, "/s/d", "", dir)},
         {"[02] /s/d2", "[05] /s/x -> /s/d/n", "[06] /s/d"},
         5},
        {"a dropped reindex covers too",
         {Line(kReindex, "/d"), Line(kModify, "/d/f"), Line(kReindex, "/d")},
         {"[06] /d"},
         3},
        {"a file takes its work along",
         {Line(kModify, "/v/a"), Line(kRename, "/v/b", "/v/a")},
         {"[05] /v/a -> /v/b", "[02] /v/b"},
         3},
        {"replacing by rename",
         {Line(kCreate, "/t"), Line(kModify, "/f"), Line(kRename, "/f", "/t")},
         {"[05] /t -> /f", "[02] /f"},
         4},
        {"what is pending below a directory moves, a delete does not",
         {Line(kModify, "/d/f"), Line(kDelete, "/d/g"), Line(kReindex, "/d/s/s"),
          Line(kRename, "/e", "/d", dir)},
         {"[02] /e/f", "[01] /d/g", "[06] /e/s/s", "[05] /d -> /e"},
         4},
        {"a rename that is renamed again",
         {Line(kRename, "/b", "/a"), Line(kRename, "/c", "/b")},
         {"[05] /a -> /c", "[05] /b -> /c"},
         2},
        {"the last of several kinds is handed on",
         {Line(kReindex, "/a"), Line(kDelete, "/a"), Line(kRename, "/b", "/c"),
          Line(kRename, "/a", "/b"), Line(kAttr, "/a"), Line(kRename, "/z", "/a")},
         // The delete that waited behind the reindex was superseded by the move onto it.
         {"[05] /c -> /z", "[05] /b -> /z", "[05] /a -> /z", "[06] /z"},
         7},
        {"onto itself",
         {Line(kReindex, "/d"), Line(kModify, "/d/f"), Line(kRename, "/d", "/d")},
         {"[02] /d/f", "[05] /d -> /d", "[06] /d"},
         4},
        {"onto its own descendant",
         {Line(kModify, "/d"), Line(kModify, "/d/f"), Line(kRename, "/d/e", "/d")},
         {"[02] /d/e/f", "[05] /d -> /d/e", "[02] /d/e"},
         4},
        {"onto its own ancestor",
         {Line(kModify, "/d"), Line(kModify, "/d/e/f"), Line(kRename, "/d", "/d/e")},
         {"[02] /d/f", "[05] /d/e -> /d"},
         3},
        {"several bits give one op of the last kind",
         {Line(kCreate | kModify | kDelete, "/f"), Line(kAttr | kModify, "/g")},
         {"[01] /f", "[02] /g"},
         2},
        {"several bits never merge with themselves",
         {Line(kCreate | kRename, "/d/e", "/d"), Line(kReindex | kUpdateCfg, "/r")},
         {"[05] /d -> /d/e", "[04] /r, data=null"},
         2},
    };
    for (const auto& row : rows) {
        const auto tree = TreeOf(row.lines);
        VerifyTree(*tree);
        EXPECT_EQ(Surviving(*tree), row.ops) << row.name;
        EXPECT_EQ(tree->ProcessOP([](auto) {}), row.consumed) << row.name;
    }
}

TEST(OPTreeTest, PathsAreCanonicalAndAbsolute) {
    const auto tree = EmptyTree();
    for (const std::string path : {"", "/", "//", "a", "a/b", "/a/", "//a", "/a//b", "/a/b//"}) {
        EXPECT_EQ(ErrorOf([&] { tree->GetNodeByPath(path); }),
                  std::make_pair(9999, "GetNodeByPath failed, path=" + path));
        EXPECT_EQ(ErrorOf([&] {
                      tree->InsertEvent(std::make_shared<Event>(Line(kRename, "/new", path)));
                  }).first,
                  9999);
    }
    const std::string odd("/a/.. \0\xff", 8);
    EXPECT_EQ(tree->GetNodeByPath(odd)->GetPath(), odd);
    EXPECT_EQ(tree->GetNodeByPath("/a/b"), tree->GetNodeByPath("/a/b"));
    EXPECT_TRUE(tree->ops.empty());
}

TEST(OPTreeTest, WalksASnapshotParentsFirst) {
    const auto tree = EmptyTree();
    for (const char* path : {"/d/b/x", "/d/a", "/d/b/y"}) {
        tree->GetNodeByPath(path);
    }
    Ops seen;
    const auto visit = [&](const std::shared_ptr<OPNode>& node) {
        seen.push_back(node->GetPath());
        node->GetChild("new")->GetChild("newer");
    };
    tree->TraverseNodeDescendant(tree->GetNodeByPath("/d"), visit, true);
    EXPECT_EQ(seen, (Ops{"/d/b", "/d/b/x", "/d/b/y", "/d/a"}));
    seen.clear();
    tree->TraverseNodeDescendant(tree->GetNodeByPath("/d/a"), visit, false);
    EXPECT_EQ(seen, (Ops{"/d/a", "/d/a/new", "/d/a/new/newer"}));
}

TEST(OPTreeTest, ConsumersErrorPassesThrough) {
    const auto tree = TreeOf({Line(kCreate, "/a"), Line(kCreate, "/b")});
    int calls = 0;
    EXPECT_THROW(tree->ProcessOP([&](auto) {
        ++calls;
        throw std::runtime_error("stop");
    }),
                 std::runtime_error);
    EXPECT_EQ(calls, 1);
}

TEST(OPTreeTest, KeptOpOutlivesTheTree) {
    std::shared_ptr<OP> kept;
    std::weak_ptr<OPNode> neighbour;
    {
        const auto tree = TreeOf({Line(kModify, "/d/f"), Line(kModify, "/d/g")});
        kept = tree->ops[0];
        neighbour = tree->ops[1]->node;
    }
    EXPECT_EQ(Printed(kept), "[02] /d/f");
    EXPECT_TRUE(neighbour.expired());
}

TEST(OPTreeTest, NoDepthOverflowsTheStack) {
    std::string deep;
    for (int i = 0; i < 1000000; ++i) {
        deep += "/a";
    }
    std::shared_ptr<OP> kept;
    {
        const auto tree = TreeOf({Line(kModify, deep), Line(kRename, "/b", "/a"),
                                  Line(kReindex, "/b"), Line(kModify, deep)});
        EXPECT_EQ(Surviving(*tree).size(), 3U);
        kept = tree->ops.back();
    }
    EXPECT_EQ(kept->node->GetPath(), deep);
}

TEST(OPTreeTest, RepeatedRenamesIntoItselfStaySmall) {
    const auto tree = TreeOf({Line(kModify, "/d/f"), Line(kModify, "/d/g")});
    for (int i = 0; i < 64; ++i) {
        tree->InsertEvent(std::make_shared<Event>(Line(kRename, "/d/d", "/d")));
    }
    std::size_t nodes = 0;
    tree->TraverseNodeDescendant(
        tree->root, [&](auto) { ++nodes; }, false);
    EXPECT_LT(nodes, 64U * 16);
    VerifyTree(*tree);
}

class OPTreeFileTest : public QueueTest {};

TEST_F(OPTreeFileTest, BadLinesAreLoggedAndSkipped) {
    const std::string huge(10 * 1024 * 1024, 'x');
    std::string components;
    for (int i = 0; i < 5000; ++i) {
        components += "/component";
    }
    const std::vector<std::string> bad = {"",
                                          "{",
                                          "[]",
                                          "42",
                                          std::string(5000, '['),
                                          std::string("\0", 1),
                                          "{\"event\":64}",
                                          Line(kCreate, "/a/"),
                                          Line(kRename, "/new", ""),
                                          Line(kRename, "/new", "/old/"),
                                          R"({"event":-64,"path":"/f"})",
                                          R"({"event":1e400,"path":"/f"})",
                                          R"({"event":123456789012345678901234567890,"path":"/f"})",
                                          R"({"event":64,"path":{"a":1}})",
                                          R"({"event":64,"path":"/f"} {})"};
    std::vector<std::string> lines;
    for (std::size_t i = 0; i < bad.size(); ++i) {
        lines.push_back(bad[i]);
        lines.push_back(Line(kCreate, "/good" + std::to_string(i)));
    }
    lines.push_back("{\"event\":64,\"path\":\"/\xff\xfe\"}");
    lines.push_back(Line(kCreate, "/" + huge));
    lines.push_back(Line(kCreate, components));
    for (const char* data : {"1", "\"text\"", "[]", "null"}) {
        lines.push_back(Line(kUpdateCfg, "/cfg", "", false, data));
    }
    Write(queue_, lines);
    std::filesystem::resize_file(queue_, std::filesystem::file_size(queue_) - 1);

    OPTree tree(queue_);
    VerifyTree(tree);
    Ops expected;
    for (std::size_t i = 0; i < bad.size(); ++i) {
        expected.push_back("[02] /good" + std::to_string(i));
    }
    expected.insert(expected.end(), {"[02] /\xff\xfe", "[02] /" + huge, "[02] " + components,
                                     R"([04] /cfg, data={"audio":false,"document":false,)"
                                     R"("photo":false,"video":false})"});
    EXPECT_TRUE(Surviving(tree) == expected);
    EXPECT_EQ(fake::LogLinesWith("InsertEvent failed, event_raw=").size(), bad.size());
    EXPECT_EQ(fake::LogLinesWith("code=120, reason=Missing property: path").size(), 1U);
    const auto line = fake::LogLinesWith("InsertEvent failed, event_raw={, code=906");
    ASSERT_EQ(line.size(), 1U);
    EXPECT_TRUE(line[0].starts_with("optree:198 ("));
    EXPECT_TRUE(line[0].ends_with(", reason=Malformed event_raw: {")) << line[0];
}

TEST_F(OPTreeFileTest, CrashMarkerReplacesEverything) {
    Write(queue_, {Line(kCreate, "/a"), Line(EVENT_QUEUE_CRASH, "/b"), Line(kCreate, "/c")});
    OPTree tree(queue_);
    EXPECT_EQ(Surviving(tree), Ops{"[07] "});
    EXPECT_EQ(tree.ProcessOP([](auto) {}), 1);
    EXPECT_EQ(fake::LogLinesWith("optree:144 Queue crashed: " + queue_).size(), 2U);
}

TEST_F(OPTreeFileTest, TracesEventsAtDebugLevelOnly) {
    Write(queue_, {Line(kCreate, "/a")});
    const OPTree traced(queue_);
    log_level = 6;
    const OPTree silent(queue_);
    log_level = kLogLevelDebug;
    EXPECT_EQ(fake::LogLinesWith("optree:194 Got event: " + Line(kCreate, "/a")).size(), 1U);
}

TEST_F(OPTreeFileTest, UnreadableQueueIsNoEmptyQueue) {
    EXPECT_EQ(ErrorOf([&] { OPTree tree(queue_); }),
              std::make_pair(502, std::string("Failed to open queue, reason=No such file or "
                                              "directory")));
    const auto lines = fake::LogLinesWith("Failed [!input_stream], reason: Failed to open queue");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_TRUE(lines[0].starts_with("optree:190 ("));
    EXPECT_EQ(ErrorOf([&] { OPTree tree(directory_); }).first, 502);
}

}  // namespace
}  // namespace quivra::fileindex
