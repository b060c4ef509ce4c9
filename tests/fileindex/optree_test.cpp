#include "fileindex/optree.h"

#include <gtest/gtest.h>

#include <ctime>

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

// What the model does not speak of: directories, and lines of several bits.
TEST(OPTreeTest, FoldsSequences) {
    const bool dir = true;
    const struct {
        const char* name;
        std::vector<std::string> lines;
        Ops ops;
        int consumed;
    } rows[] = {
        {"a line without known bits", {Line(0x8, "/f")}, {}, 0},
        {"a directory's delete is a reindex", {Line(kDelete, "/d", "", dir)}, {"[06] /d"}, 1},
        {"a new directory's reindex covers what is below, but no rename and no neighbour",
         {Line(kModify, "/s/d/f"), Line(kModify, "/s/d2"), Line(kRename, "/s/d/n", "/s/x"),
          Line(kModify, "/s/d/n"), Line(kCreate, "/s/d", "", dir)},
         {"[02] /s/d2", "[05] /s/x -> /s/d/n", "[06] /s/d"},
         5},
        {"several bits give one op of the last kind, never merged with itself",
         {Line(kCreate | kModify | kDelete, "/f"), Line(kAttr | kModify, "/g"),
          Line(kCreate | kRename, "/d/e", "/d"), Line(kReindex | kUpdateCfg, "/r")},
         {"[01] /f", "[02] /g", "[05] /d -> /d/e", "[04] /r, data=null"},
         4},
    };
    for (const auto& row : rows) {
        const auto tree = TreeOf(row.lines);
        VerifyTree(*tree);
        EXPECT_EQ(Surviving(*tree), row.ops) << row.name;
        EXPECT_EQ(tree->ProcessOP([](auto) {}), row.consumed) << row.name;
    }
}

std::shared_ptr<OP> NewOP(const std::shared_ptr<OPNode>& node, const std::string& old = "") {
    return std::make_shared<OP>(node, OP_NONE, old, Json::Value());
}

TEST(OPTreeTest, NoDepthOverflowsTheStackAndNothingLeaks) {
    std::string deep;
    for (int i = 0; i < 1000000; ++i) {
        deep += "/a";
    }
    std::shared_ptr<OP> kept;
    std::weak_ptr<OPNode> neighbour;
    {
        const auto tree = EmptyTree();
        const auto node = tree->GetNodeByPath(deep);
        const auto target = tree->GetNodeByPath("/b");
        tree->HandleModify(node, NewOP(node));
        tree->HandleRename(target, NewOP(target, "/a"));
        tree->HandleReindex(target, NewOP(target));
        tree->HandleModify(node, NewOP(node));
        EXPECT_EQ(Surviving(*tree).size(), 3U);
        neighbour = tree->GetNodeByPath(deep + "b");
        kept = tree->ops.back();
    }
    EXPECT_EQ(kept->node->GetPath(), deep);
    EXPECT_TRUE(neighbour.expired());
}

// The fields are public, so a handler believes them more than what it knows of them.
TEST(OPTreeTest, HandlersSeeOpsThatWereAttachedByHand) {
    const auto tree = EmptyTree();
    const auto file = tree->GetNodeByPath("/d/f");
    const auto directory = tree->GetNodeByPath("/d");
    const auto pending = std::make_shared<OP>(file, OP_ATTR, "", Json::Value());
    file->ops.push_back(pending);
    tree->HandleModify(file, NewOP(file));
    EXPECT_EQ(pending->op, OP_UPSERT);
    const auto target = tree->GetNodeByPath("/e");
    tree->HandleRename(target, NewOP(target, "/d"));
    EXPECT_EQ(pending->node, tree->GetNodeByPath("/e/f"));
    pending->op = OP_DELETE;
    tree->HandleReindex(target, NewOP(target));
    EXPECT_EQ(pending->op, OP_NONE);
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

TEST(OPTreeTest, FindsEachChildInDirectoriesOfAnySize) {
    const auto tree = EmptyTree();
    const auto directory = tree->GetNodeByPath("/d");
    std::vector<std::shared_ptr<OPNode>> made;
    for (int i = 0; i < 3000; ++i) {
        const std::string name = (i % 2 == 0 ? "name" : "NAME") + std::to_string(i / 2);
        made.push_back(directory->GetChild(name));
        EXPECT_EQ(directory->GetChild(name), made.back()) << name;
    }
    EXPECT_EQ(directory->children, made);
}

class OPTreeFileTest : public QueueTest {};

TEST_F(OPTreeFileTest, BadLinesAreLoggedAndSkipped) {
    const std::string longest = "/" + std::string(64 * 1024 - 1, 'x');
    const std::string nul(1, '\0');
    const std::string good = R"({"event":64,"path":"/f"})";
    std::vector<std::string> bad = {"",
                                    "{",
                                    "[]",
                                    std::string(5000, '['),
                                    nul,
                                    "{\"event\":64}",
                                    Line(kRename, "/new", ""),
                                    Line(kRename, "/new", "/old/"),
                                    Line(kRename, "/new", longest + "x"),
                                    R"({"event":-64,"path":"/f"})",
                                    R"({"event":1e400,"path":"/f"})",
                                    R"({"event":64,"path":{"a":1}})",
                                    good + " {}",
                                    good + std::string(1024 * 1024, ' '),
                                    std::string(1024 * 1024 + 1, '{')};
    for (const std::string& path : {std::string(), std::string("/"), std::string("//"),
                                    std::string("a/b"), std::string("/a/"), std::string("//a"),
                                    std::string("/a//b"), longest + "x", longest + "\t"}) {
        bad.push_back(Line(kCreate, path));
    }
    std::vector<std::string> lines;
    Ops expected;
    for (std::size_t i = 0; i < bad.size(); ++i) {
        lines.insert(lines.end(), {bad[i], Line(kCreate, "/good" + std::to_string(i))});
        expected.push_back("[02] /good" + std::to_string(i));
    }
    lines.push_back("{\"event\":64,\"path\":\"/\xff\xfe\"}");
    lines.push_back(Line(kCreate, longest) + std::string(900 * 1024, ' '));
    for (const char* data : {"1", "\"text\"", "[]", "null", R"({"audio":true,"photo":1})"}) {
        lines.push_back(Line(kUpdateCfg, "/cfg", "", false, data));
    }
    expected.insert(expected.end(), {"[02] /\xff\xfe", "[02] " + longest,
                                     R"([04] /cfg, data={"audio":true,"document":false,)"
                                     R"("photo":false,"video":false})"});
    Write(queue_, lines);
    std::filesystem::resize_file(queue_, std::filesystem::file_size(queue_) - 1);

    OPTree tree(queue_);
    VerifyTree(tree);
    EXPECT_TRUE(Surviving(tree) == expected);
    EXPECT_EQ(fake::LogLinesWith("InsertEvent failed, event_raw=").size(), bad.size());
    const auto line = fake::LogLinesWith("InsertEvent failed, event_raw={, code=906");
    ASSERT_EQ(line.size(), 1U);
    EXPECT_TRUE(line[0].starts_with("optree:198 ("));
    EXPECT_TRUE(line[0].ends_with(", reason=Malformed event_raw: {")) << line[0];
}

TEST_F(OPTreeFileTest, ALineBeyondTheLimitCostsLittle) {
    Write(queue_, {std::string(100 * 1024 * 1024, 'x'),
                   Line(kCreate, "/" + std::string(40 * 1024 * 1024, '/')), Line(kCreate, "/f")});
    OPTree tree(queue_);
    EXPECT_EQ(Surviving(tree), Ops{"[02] /f"});
    for (const std::string& line : fake::LogLinesWith("")) {
        EXPECT_LT(line.size(), 10000U) << line.substr(0, 100);
    }
}

/// Processor time: other processes must not count.
double Seconds(const std::function<void()>& work) {
    const std::clock_t start = std::clock();
    work();
    return static_cast<double>(std::clock() - start) / CLOCKS_PER_SEC;
}

// A step that walks what earlier lines have left takes hundreds of times as long as the parse here.
TEST_F(OPTreeFileTest, WhatIsDoneOverAndOverTakesLinearTime) {
    constexpr std::size_t kFiles = 20000;
    const bool dir = true;
    std::vector<std::string> files;
    std::vector<std::string> gone;
    for (std::size_t i = 0; i < kFiles; ++i) {
        files.push_back(Line(kCreate, "/d/" + std::to_string(i)));
        gone.insert(gone.end(), {files.back(), Line(kDelete, "/d/" + std::to_string(i))});
    }
    const struct {
        const char* name;
        std::vector<std::string> begin;
        std::vector<std::string> loop;
    } rows[] = {
        {"rmdir, mkdir", gone, {Line(kDelete, "/d", "", dir), Line(kCreate, "/d", "", dir)}},
        {"one file, reindex above many", gone, {Line(kCreate, "/d/f"), Line(kReindex, "/d")}},
        {"swap of two names",
         {},
         {Line(kRename, "/t", "/a"), Line(kRename, "/a", "/b"), Line(kRename, "/b", "/t")}},
        {"to and fro, written to",
         {},
         {Line(kModify, "/a"), Line(kRename, "/a", "/b"), Line(kModify, "/b"),
          Line(kRename, "/b", "/a")}},
        {"directory to and fro", files, {Line(kRename, "/e", "/d"), Line(kRename, "/d", "/e")}},
        {"directory swapped",
         files,
         {Line(kRename, "/t", "/d"), Line(kRename, "/d", "/e"), Line(kRename, "/e", "/t")}},
        {"directory onto itself", files, {Line(kRename, "/d", "/d")}},
        {"piles of settings",
         {},
         {Line(kUpdateCfg, "/a", "", false, "{}"), Line(kRename, "/b", "/a"),
          Line(kUpdateCfg, "/b", "", false, "{}")}},
        {"piles of upserts",
         {},
         {Line(kCreate, "/d/f"), Line(kRename, "/e", "/d"), Line(kDelete, "/e/f"),
          Line(kCreate, "/e/f")}},
    };
    log_level = 0;
    for (const auto& row : rows) {
        std::vector<std::string> lines = row.begin;
        while (lines.size() < 3 * kFiles) {
            lines.insert(lines.end(), row.loop.begin(), row.loop.end());
        }
        Write(queue_, lines);
        const double parse = Seconds([&] {
            for (const std::string& line : lines) {
                Json::Value json;
                fromString(json, line);
            }
        });
        EXPECT_LT(Seconds([&] { OPTree tree(queue_); }), 20 * parse) << row.name;
    }
    log_level = kLogLevelDebug;
}

TEST_F(OPTreeFileTest, ACrashMarkerReplacesEverythingAndAnUnreadableQueueIsNotAnEmptyOne) {
    EXPECT_EQ(ErrorOf([&] { OPTree tree(queue_); }).first, 502);
    const std::vector<std::string> markers = {
        Line(EVENT_QUEUE_CRASH, "/b"),
        Line(EVENT_QUEUE_CRASH | kCreate, "/b"),
        Line(EVENT_QUEUE_CRASH, ""),
        Line(EVENT_QUEUE_CRASH, "no path"),
        Line(EVENT_QUEUE_CRASH, "/" + std::string(70000, 'x')),
        Line(EVENT_QUEUE_CRASH | kRename, "/b", "old/"),
        R"({"event":512})",
        R"({"event":512,"path":[]})",
    };
    for (const std::string& marker : markers) {
        Write(queue_, {Line(kCreate, "/a"), marker, Line(kCreate, "/c")});
        OPTree tree(queue_);
        EXPECT_EQ(Surviving(tree), Ops{"[07] "}) << marker;
        EXPECT_EQ(tree.ProcessOP([](auto) {}), 1);
    }
    // What cannot be read does not count, nor does what the line before it has said.
    Write(queue_, {Line(kCreate, "/a"), R"({"event":512,"path":"/b")", "512"});
    OPTree tree(queue_);
    EXPECT_EQ(Surviving(tree), Ops{"[02] /a"});
}

TEST_F(OPTreeFileTest, OnlyARenameHasAnOldPath) {
    Write(queue_, {Line(kCreate | kRename, "/f", "bad"), Line(kCreate, "/g", "bad"),
                   Line(kCreate | kRename, "/h", "/old"), Line(kRename | kReindex, "/r", "/old")});
    OPTree tree(queue_);
    EXPECT_EQ(Surviving(tree), (Ops{"[02] /f", "[02] /g", "[05] /old -> /h", "[06] /r"}));
    tree.ProcessOP([](const std::shared_ptr<OP>& op) {
        EXPECT_EQ(op->path, op->op == OP_RENAME ? "/old" : "");
    });
}

}  // namespace
}  // namespace quivra::fileindex
