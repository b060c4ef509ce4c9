#include <gtest/gtest.h>

#include <algorithm>
#include <iostream>
#include <map>
#include <random>

#include "base/path.h"
#include "fileindex/optree.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

struct Step {
    unsigned int bits;
    std::string path;
    std::string old;
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

/// The folding rules once more, as plainly as they can be written: no links, no index, no counters.
class Model {
  public:
    struct Op {
        int kind;
        std::string path;
        std::string old;
        Json::Value data;
    };
    using OpPtr = std::shared_ptr<Op>;

    void Insert(const Step& step) {
        ++consumed_;
        auto op = std::make_shared<Op>(Op{OP_RENAME, step.path, step.old, step.event->data});
        if (step.bits == EVENT_RENAME) {
            return Rename(op);
        }
        const std::pair<unsigned int, int> columns[] = {
            {EVENT_CREATE, OP_UPSERT},         {EVENT_MODIFY, OP_UPSERT},
            {EVENT_DELETE, OP_DELETE},         {EVENT_ATTR, OP_ATTR},
            {EVENT_UPDATE_CFG, OP_UPDATE_CFG}, {EVENT_REINDEX, OP_REINDEX}};
        std::size_t column = 0;
        while (columns[column].first != step.bits) {
            ++column;
        }
        op->kind = columns[column].second;
        for (const OpPtr& existing : at_[op->path]) {
            op->kind = Rule(*existing, *op, column) ? OP_NONE : op->kind;
        }
        for (const std::string& path : Below(op->path)) {
            for (const OpPtr& pending : at_[path]) {
                if (step.bits == EVENT_REINDEX && pending->kind != OP_RENAME) {
                    pending->kind = OP_NONE;
                }
            }
        }
        Append(op);
    }

    std::vector<std::string> Surviving() const {
        std::vector<std::string> lines;
        for (const OpPtr& op : list_) {
            if (op->kind != OP_NONE) {
                std::string line = "[0" + std::to_string(op->kind) + "] ";
                line += op->kind == OP_RENAME ? op->old + " -> " + op->path : op->path;
                line += op->kind == OP_UPDATE_CFG ? ", data=" + toString(op->data) : "";
                lines.push_back(line);
            }
        }
        return lines;
    }
    int Consumed() const { return consumed_; }

  private:
    /// Whether the old op swallows the new one.
    static bool Rule(Op& existing, const Op& op, std::size_t column) {
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

    void Rename(const OpPtr& op) {
        const std::string& old = op->old;
        for (const OpPtr& replaced : at_[op->path]) {
            replaced->kind =
                replaced->kind >= OP_DELETE && replaced->kind <= OP_ATTR ? OP_NONE : replaced->kind;
        }
        auto spare = std::make_shared<Op>(Op{OP_NONE, op->path, "", Json::Value()});
        for (const OpPtr& pending : std::vector<OpPtr>(at_[old])) {
            if (pending->kind == OP_UPSERT || pending->kind == OP_ATTR ||
                pending->kind == OP_REINDEX) {
                spare->kind = pending->kind;
                pending->kind = OP_NONE;
            }
            Move(pending, op->path);
        }
        for (const std::string& path : Below(old)) {
            for (const OpPtr& pending : std::vector<OpPtr>(at_[path])) {
                if (pending->kind >= OP_UPSERT) {
                    Move(pending, op->path + path.substr(old.size()));
                }
            }
        }
        Append(op);
        if (spare->kind != OP_NONE) {
            ++consumed_;
            Append(spare);
        }
    }

    void Move(const OpPtr& op, const std::string& path) {
        auto& from = at_[op->path];
        from.erase(std::find(from.begin(), from.end(), op));
        at_[path].push_back(op);
        op->path = path;
    }

    void Append(const OpPtr& op) {
        if (op->kind != OP_NONE) {
            list_.push_back(op);
            at_[op->path].push_back(op);
        }
    }

    /// The paths of the ops below a path.
    std::vector<std::string> Below(const std::string& top) const {
        std::vector<std::string> below;
        for (const auto& [path, ops] : at_) {
            if (path.starts_with(top + "/")) {
                below.push_back(path);
            }
        }
        return below;
    }

    std::map<std::string, std::vector<OpPtr>> at_;
    std::vector<OpPtr> list_;
    int consumed_ = 0;
};

std::vector<Step> StepsOver(const std::vector<std::string>& paths) {
    std::vector<Step> steps;
    const auto add = [&](unsigned int bits, const std::string& path, const std::string& old,
                         const std::string& data) {
        const std::string line = Line(bits, path, old, false, data);
        steps.push_back({bits, path, old, line, std::make_shared<Event>(line)});
    };
    for (const std::string& path : paths) {
        for (const unsigned int bits :
             {EVENT_CREATE, EVENT_MODIFY, EVENT_DELETE, EVENT_ATTR, EVENT_REINDEX}) {
            add(bits, path, "", "");
        }
        add(EVENT_UPDATE_CFG, path, "", R"({"audio":true,"photo":false})");
        for (const std::string& old : paths) {
            if (path == old || !(base::IsAtOrBelow(path, old) || base::IsAtOrBelow(old, path))) {
                add(EVENT_RENAME, path, old, "");
            }
        }
    }
    return steps;
}

/// Folds the steps in both ways. Where they differ, the failure shows the queue lines.
void ExpectAgreement(const std::vector<const Step*>& steps) {
    const auto tree = EmptyTree();
    Model model;
    for (const Step* step : steps) {
        tree->InsertEvent(step->event);
        model.Insert(*step);
    }
    VerifyTree(*tree);
    EXPECT_EQ(Surviving(*tree), model.Surviving());
    EXPECT_EQ(tree->ProcessOP([](auto) {}), model.Consumed());
    if (testing::Test::HasFailure()) {
        for (const Step* step : steps) {
            std::cout << step->line << "\n";
        }
    }
}

// Few paths, so that every pair of ops meets; more of them, so that whole subtrees move.
TEST(OPTreeModelTest, AgreesOnRandomSequences) {
    const std::vector<Step> alphabets[] = {
        StepsOver({"/d", "/d/f", "/e"}),
        StepsOver({"/d", "/d/f", "/d/d", "/d/d/f", "/e", "/e/f", "/e/d/f"})};
    std::mt19937 random(Seed());
    for (unsigned int run = 0; run < 2 * kRandomRuns; ++run) {
        const std::vector<Step>& steps = alphabets[run % 2];
        std::vector<const Step*> sequence(1 + random() % 24);
        for (const Step*& step : sequence) {
            step = &steps[random() % steps.size()];
        }
        ExpectAgreement(sequence);
        ASSERT_FALSE(HasFailure());
    }
}

}  // namespace
}  // namespace quivra::fileindex
