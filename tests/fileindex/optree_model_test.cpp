#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>

#include "common/log.h"
#include "fileindex/optree.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

struct Step {
    std::string line;
    std::shared_ptr<Event> event;
};

/// What a create, a modify, a delete, an attribute change, changed settings and a reindex make of
/// an op that waits at the same path: '.' leaves both, '=' drops the new one, '+' merges its
/// settings into the old one, a digit is the kind that the old one becomes.
constexpr std::string_view kRules[] = {
    "......",  // nothing
    "2=====",  // delete
    "==1=46",  // upsert
    "221=46",  // attribute change
    "==.=+6",  // changed settings
    "......",  // rename
    "==.===",  // reindex
};
enum Column { kCreate, kModify, kDelete, kAttr, kUpdateCfg, kReindex };

/// The folding rules once more, as plainly as they can be written: every step goes through all ops
/// of a node and all nodes of a subtree.
class Model {
  public:
    void Insert(const Event& event) {
        auto op = std::make_shared<Op>();
        op->path = event.path;
        MakeNode(op->path);
        const auto fold = [&](std::uint32_t bit, int kind, Column column) {
            if ((event.event & bit) != 0) {
                const bool covers = bit == EVENT_CREATE || bit == EVENT_DELETE;
                covers&& event.is_dir ? Fold(op, OP_REINDEX, kReindex) : Fold(op, kind, column);
            }
        };
        fold(EVENT_CREATE, OP_UPSERT, kCreate);
        fold(EVENT_ATTR, OP_ATTR, kAttr);
        fold(EVENT_MODIFY, OP_UPSERT, kModify);
        fold(EVENT_DELETE, OP_DELETE, kDelete);
        if ((event.event & EVENT_RENAME) != 0) {
            Rename(op, event.path_old);
        }
        fold(EVENT_REINDEX, OP_REINDEX, kReindex);
        op->data = event.data;
        fold(EVENT_UPDATE_CFG, OP_UPDATE_CFG, kUpdateCfg);
    }

    /// The nodes in order of their creation, below each the places of its ops on the list; the
    /// list; the count.
    std::string Shown() const {
        std::map<const Op*, std::size_t> places;
        std::string list;
        for (const OpPtr& op : list_) {
            places.emplace(op.get(), places.size());
            list += std::to_string(op->kind) + op->path;
            list += op->kind == OP_RENAME ? "<" + op->old : "";
            list += op->kind == OP_UPDATE_CFG ? toString(op->data) : "";
            list += '\n';
        }
        std::string nodes;
        for (const std::string& path : Subtree("")) {
            nodes += path + ':';
            for (const OpPtr& op : nodes_.at(path).ops) {
                nodes += ' ' + std::to_string(places.at(op.get()));
            }
            nodes += '\n';
        }
        return nodes + list + std::to_string(consumed_);
    }

  private:
    struct Op {
        int kind = OP_NONE;
        std::string path;
        std::string old;
        Json::Value data;
        bool is_listed = false;
        bool is_counted = false;
    };
    using OpPtr = std::shared_ptr<Op>;
    struct Node {
        std::vector<std::string> children;
        std::vector<OpPtr> ops;
    };

    Node& MakeNode(const std::string& path) {
        for (std::size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
            const std::string node = path.substr(0, end);
            if (nodes_.emplace(node, Node()).second) {
                nodes_[node.substr(0, node.rfind('/'))].children.push_back(node);
            }
            if (end == std::string::npos) {
                return nodes_[path];
            }
        }
    }

    std::vector<std::string> Subtree(const std::string& top) const {
        std::vector<std::string> paths{top};
        for (const std::string& child : nodes_.at(top).children) {
            const std::vector<std::string> below = Subtree(child);
            paths.insert(paths.end(), below.begin(), below.end());
        }
        return paths;
    }

    void Fold(const OpPtr& op, int kind, Column column) {
        op->kind = kind;
        for (const OpPtr& existing : nodes_[op->path].ops) {
            if (existing != op && Rule(*existing, *op, column)) {
                op->kind = OP_NONE;
            }
        }
        for (const std::string& path : Subtree(op->path)) {
            for (const OpPtr& below : nodes_[path].ops) {
                if (column == kReindex && path != op->path && below->kind != OP_RENAME) {
                    below->kind = OP_NONE;
                }
            }
        }
        Append(op);
    }

    /// Whether the old op swallows the new one.
    static bool Rule(Op& existing, const Op& op, Column column) {
        const char rule = kRules[existing.kind][column];
        if (rule >= '1' && rule <= '9') {
            existing.kind = rule - '0';
            existing.data = op.data;
        } else if (rule == '+') {
            for (const char* key : {"document", "audio", "video", "photo"}) {
                existing.data[key] = existing.data[key] == Json::Value(true) ||
                                     op.data.get(key, false) == Json::Value(true);
            }
        }
        return rule != '.';
    }

    void Rename(const OpPtr& op, const std::string& old) {
        MakeNode(old);
        op->kind = OP_RENAME;
        op->old = old;
        for (const OpPtr& replaced : nodes_[op->path].ops) {
            if (replaced->kind >= OP_DELETE && replaced->kind <= OP_ATTR) {
                replaced->kind = OP_NONE;
            }
        }
        auto spare = std::make_shared<Op>();
        spare->path = op->path;
        for (const OpPtr& pending : std::vector<OpPtr>(nodes_[old].ops)) {
            if (pending->kind == OP_UPSERT || pending->kind == OP_ATTR ||
                pending->kind == OP_REINDEX) {
                spare->kind = pending->kind;
                pending->kind = OP_NONE;
            }
            Move(pending, op->path);
        }
        std::vector<std::string> below = Subtree(old);
        below.erase(below.begin());
        for (const std::string& path : below) {
            for (const OpPtr& pending : std::vector<OpPtr>(nodes_[path].ops)) {
                if (pending->kind >= OP_UPSERT && pending != op) {
                    Move(pending, op->path + path.substr(old.size()));
                }
            }
        }
        Append(op);
        if (spare->kind != OP_NONE) {
            Append(spare);
        }
    }

    void Move(const OpPtr& op, const std::string& path) {
        std::vector<OpPtr>& from = nodes_[op->path].ops;
        from.erase(std::find(from.begin(), from.end(), op));
        MakeNode(path).ops.push_back(op);
        op->path = path;
    }

    void Append(const OpPtr& op) {
        consumed_ += std::exchange(op->is_counted, true) ? 0 : 1;
        if (op->kind != OP_NONE && !std::exchange(op->is_listed, true)) {
            list_.push_back(op);
            nodes_[op->path].ops.push_back(op);
        }
    }

    std::map<std::string, Node> nodes_{{"", Node()}};
    std::vector<OpPtr> list_;
    int consumed_ = 0;
};

/// The same of the tree, taken from its public fields only.
std::string Shown(OPTree& tree) {
    std::map<const OP*, std::size_t> places;
    std::string list;
    for (const auto& op : tree.ops) {
        places.emplace(op.get(), places.size());
        list += std::to_string(op->op) + op->node->GetPath();
        list += op->op == OP_RENAME ? "<" + op->path : "";
        list += op->op == OP_UPDATE_CFG ? toString(op->data) : "";
        list += '\n';
    }
    std::string nodes;
    tree.TraverseNodeDescendant(
        tree.root,
        [&](const std::shared_ptr<OPNode>& node) {
            nodes += node->GetPath() + ':';
            for (const auto& op : node->ops) {
                nodes += ' ' + std::to_string(places.at(op.get()));
            }
            nodes += '\n';
        },
        false);
    return nodes + list + std::to_string(tree.ProcessOP([](auto) {}));
}

std::vector<Step> StepsOver(const std::vector<std::string>& paths, bool with_many_bits) {
    std::vector<Step> steps;
    const auto add = [&](unsigned int bits, const std::string& path, const std::string& old,
                         const std::string& data) {
        const std::string line = Line(bits, path, old, false, data);
        steps.push_back({line, std::make_shared<Event>(line)});
    };
    for (const std::string& path : paths) {
        for (const unsigned int bits :
             {EVENT_CREATE, EVENT_MODIFY, EVENT_DELETE, EVENT_ATTR, EVENT_REINDEX}) {
            add(bits, path, "", "");
        }
        add(EVENT_UPDATE_CFG, path, "", R"({"audio":true,"photo":false})");
        add(EVENT_UPDATE_CFG, path, "", R"({"photo":true})");
        for (const std::string& old : paths) {
            add(EVENT_RENAME, path, old, "");
            if (with_many_bits) {
                add(EVENT_CREATE | EVENT_RENAME, path, old, "");
                add(EVENT_RENAME | EVENT_UPDATE_CFG | EVENT_ATTR, path, old, R"({"video":true})");
                add(EVENT_DELETE | EVENT_RENAME | EVENT_REINDEX, path, old, "");
            }
        }
    }
    return steps;
}

class OPTreeModelTest : public QueueTest {
  protected:
    OPTreeModelTest() { log_level = 0; }
    ~OPTreeModelTest() override { log_level = kLogLevelDebug; }

    /// Folds the steps in all ways: line by line, when the public fields are looked at after each
    /// of them, and from a file, when much is put off to the end.
    void ExpectAgreement(const std::vector<const Step*>& steps) {
        const auto tree = EmptyTree();
        Model model;
        std::vector<std::string> lines;
        for (const Step* step : steps) {
            tree->InsertEvent(step->event);
            model.Insert(*step->event);
            lines.push_back(step->line);
        }
        Write(queue_, lines);
        OPTree from_file(queue_);
        VerifyTree(*tree);
        VerifyTree(from_file);
        EXPECT_EQ(Shown(*tree), model.Shown()) << testing::PrintToString(lines);
        EXPECT_EQ(Shown(from_file), model.Shown()) << testing::PrintToString(lines);
    }
};

// Few paths, so that every pair of ops meets; more of them, so that whole subtrees move. What runs
// in a loop piles up.
TEST_F(OPTreeModelTest, AgreesOnRandomSequencesAndLoops) {
    const std::vector<std::string> few = {"/d", "/d/f", "/e"};
    const std::vector<std::string> many = {"/d", "/d/f", "/d/g",   "/d/d", "/d/d/f",
                                           "/e", "/e/f", "/e/d/f", "/t",   "/t/d"};
    const std::vector<Step> alphabets[] = {StepsOver(few, false), StepsOver(many, false),
                                           StepsOver(few, true)};
    std::mt19937 random(Seed());
    for (unsigned int run = 0; run < kRandomRuns / 2; ++run) {
        const std::vector<Step>& steps = alphabets[run % 3];
        const auto some = [&](std::size_t count) {
            std::vector<const Step*> chosen(count);
            for (const Step*& step : chosen) {
                step = &steps[random() % steps.size()];
            }
            return chosen;
        };
        std::vector<const Step*> sequence = some(random() % 8);
        const std::vector<const Step*> loop = some(1 + random() % 5);
        for (std::size_t rounds = 1 + random() % 6; rounds > 0; --rounds) {
            sequence.insert(sequence.end(), loop.begin(), loop.end());
        }
        ExpectAgreement(sequence);
        ASSERT_FALSE(HasFailure());
    }
}

TEST_F(OPTreeModelTest, AgreesOnAllShortSequences) {
    const std::vector<Step> steps = StepsOver({"/d", "/d/f", "/e"}, false);
    for (const Step& first : steps) {
        for (const Step& second : steps) {
            for (const Step& third : steps) {
                ExpectAgreement({&first, &second, &third});
            }
        }
        ASSERT_FALSE(HasFailure());
    }
}

}  // namespace
}  // namespace quivra::fileindex
