#pragma once

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/optree.h"
#include "tests/fake/fake_libc.h"

namespace quivra::fileindex {

/// The seed of a random test, printed: FILEINDEX_SEED, or another one each time.
inline unsigned int Seed() {
    const char* text = std::getenv("FILEINDEX_SEED");
    const unsigned int seed =
        text != nullptr ? static_cast<unsigned int>(std::atoi(text)) : std::random_device()();
    std::cout << "FILEINDEX_SEED=" << seed << "\n";
    return seed;
}

/// How often a random test repeats; the sanitizers are slow.
#if defined(__SANITIZE_ADDRESS__)
inline constexpr unsigned int kRandomRuns = 3000;
#else
inline constexpr unsigned int kRandomRuns = 30000;
#endif

/// The queue line of an event; `data` is JSON text.
inline std::string Line(unsigned int bits, const std::string& path, const std::string& old = "",
                        bool is_dir = false, const std::string& data = "") {
    Json::Value json;
    json["event"] = bits;
    json["path"] = path;
    if (!old.empty()) {
        json["path_old"] = old;
    }
    if (is_dir) {
        json["is_dir"] = true;
    }
    if (!data.empty()) {
        EXPECT_TRUE(fromString(json["data"], data)) << data;
    }
    return toString(json);
}

inline std::string Printed(const std::shared_ptr<OP>& op) {
    std::ostringstream out;
    out << op;
    return out.str();
}

/// The surviving ops in their printed form.
inline std::vector<std::string> Surviving(OPTree& tree) {
    std::vector<std::string> ops;
    tree.ProcessOP([&](const std::shared_ptr<OP>& op) { ops.push_back(Printed(op)); });
    return ops;
}

/// A tree that was built from nothing.
inline std::unique_ptr<OPTree> EmptyTree() {
    return std::make_unique<OPTree>("/dev/null");
}

inline std::unique_ptr<OPTree> TreeOf(const std::vector<std::string>& lines) {
    auto tree = EmptyTree();
    for (const std::string& line : lines) {
        tree->InsertEvent(std::make_shared<Event>(line));
    }
    return tree;
}

/// Checks what must hold of every tree: links in both directions agree, and every op is on exactly
/// one node and once on the tree's list.
inline void VerifyTree(const OPTree& tree) {
    std::set<const OP*> listed;
    for (const auto& op : tree.ops) {
        EXPECT_TRUE(listed.insert(op.get()).second) << "listed twice: " << op;
    }
    std::vector<std::shared_ptr<OPNode>> pending{tree.root};
    while (!pending.empty()) {
        const auto node = pending.back();
        pending.pop_back();
        std::set<std::string> names;
        for (const auto& child : node->children) {
            EXPECT_EQ(child->parent, node);
            EXPECT_TRUE(names.insert(child->name).second) << "twice below a node: " << child->name;
            pending.push_back(child);
        }
        for (const auto& op : node->ops) {
            EXPECT_EQ(op->node, node) << op;
            EXPECT_EQ(listed.erase(op.get()), 1U) << "not listed, or on two nodes: " << op;
        }
    }
    EXPECT_TRUE(listed.empty()) << listed.size() << " ops are on no node";
}

class QueueTest : public testing::Test {
  protected:
    QueueTest() {
        fake::ResetLibc();
        std::filesystem::remove_all(directory_);
        std::filesystem::create_directories(directory_);
    }

    static void Write(const std::string& path, const std::vector<std::string>& lines) {
        std::ofstream file(path, std::ios::binary);
        for (const std::string& line : lines) {
            file << line << '\n';
        }
    }

    const std::string directory_ = "/tmp/queue_test";
    const std::string queue_ = directory_ + "/queue";
};

/// The code and reason of the Error that a call throws.
inline std::pair<int, std::string> ErrorOf(const std::function<void()>& call) {
    try {
        call();
    } catch (const Error& error) {
        return {error.code, error.reason};
    }
    return {0, "no error"};
}

}  // namespace quivra::fileindex
