#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <map>
#include <random>

#include "fileindex/optree.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

#if defined(__SANITIZE_ADDRESS__)
constexpr int kExhaustiveLength = 3;
#else
constexpr int kExhaustiveLength = 4;
#endif

/// One event of one kind. `data` is used by changed settings only.
struct Step {
    unsigned int bits = 0;
    std::string path;
    std::string old;
    bool is_dir = false;
    const char* data = "";

    std::string ToLine() const { return Line(bits, path, old, is_dir, data); }
    std::shared_ptr<Event> ToEvent() const {
        auto event = std::make_shared<Event>(R"({"event":0,"path":""})");
        event->event = bits;
        event->path = path;
        event->path_old = old;
        event->is_dir = is_dir;
        if (*data != '\0') {
            fromString(event->data, data);
        }
        return event;
    }
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
        Know(step.path);
        auto op = std::make_shared<Op>(Op{OP_NONE, step.path, "", Json::Value()});
        ++consumed_;
        switch (step.bits) {
            case EVENT_CREATE:
                return step.is_dir ? Reindex(op) : Simple(op, OP_UPSERT, 'c');
            case EVENT_MODIFY:
                return Simple(op, OP_UPSERT, 'm');
            case EVENT_DELETE:
                return step.is_dir ? Reindex(op) : Simple(op, OP_DELETE, 'd');
            case EVENT_ATTR:
                return Simple(op, OP_ATTR, 'a');
            case EVENT_REINDEX:
                return Reindex(op);
            case EVENT_UPDATE_CFG:
                fromString(op->data, step.data);
                return Simple(op, OP_UPDATE_CFG, 'u');
            default:
                return Rename(op, step.old);
        }
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
    void Simple(const OpPtr& op, int kind, char handler) {
        Coalesce(op, kind, handler);
        Append(op);
    }

    void Coalesce(const OpPtr& op, int kind, char handler) {
        op->kind = kind;
        for (const OpPtr& existing : at_[op->path]) {
            if (Rule(*existing, *op, handler)) {
                op->kind = OP_NONE;
            }
        }
    }

    static bool Rule(Op& existing, const Op& op, char handler) {
        const int kind = existing.kind;
        if (kind == OP_NONE || kind == OP_RENAME) {
            return false;
        }
        const bool busy = kind == OP_UPSERT || kind == OP_ATTR;
        switch (handler) {
            case 'c':
                existing.kind = kind == OP_DELETE || kind == OP_ATTR ? OP_UPSERT : kind;
                return true;
            case 'm':
                existing.kind = kind == OP_ATTR ? OP_UPSERT : kind;
                return true;
            case 'd':
                existing.kind = busy ? OP_DELETE : kind;
                return busy || kind == OP_DELETE;
            case 'u':
                if (busy) {
                    existing.kind = OP_UPDATE_CFG;
                    existing.data = op.data;
                } else if (kind == OP_UPDATE_CFG) {
                    for (const char* key : {"document", "audio", "video", "photo"}) {
                        existing.data[key] = existing.data[key] == Json::Value(true) ||
                                             op.data.get(key, false) == Json::Value(true);
                    }
                }
                return true;
            case 'r':
                existing.kind = kind == OP_DELETE ? kind : OP_REINDEX;
                return true;
            default:
                return true;
        }
    }

    void Reindex(const OpPtr& op) {
        Coalesce(op, OP_REINDEX, 'r');
        for (const std::string& path : Below(op->path)) {
            for (const OpPtr& pending : at_[path]) {
                pending->kind = pending->kind == OP_RENAME ? OP_RENAME : OP_NONE;
            }
        }
        Append(op);
    }

    void Rename(const OpPtr& op, const std::string& old) {
        Know(old);
        op->kind = OP_RENAME;
        op->old = old;
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
                    Know(op->path + path.substr(old.size()));
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

    /// Notes a path and its ancestors, in the order in which they are first named.
    void Know(const std::string& path) {
        for (std::size_t end = path.find('/', 1); end != path.npos; end = path.find('/', end + 1)) {
            Note(path.substr(0, end));
        }
        Note(path);
    }
    void Note(const std::string& path) {
        if (std::find(known_.begin(), known_.end(), path) == known_.end()) {
            known_.push_back(path);
        }
    }

    /// What is known below a path: parents first, brothers as they were first named.
    std::vector<std::string> Below(const std::string& top) const {
        std::vector<std::string> below;
        for (const std::string& path : known_) {
            if (path.rfind('/') == top.size() && path.compare(0, top.size(), top) == 0) {
                below.push_back(path);
                const auto deeper = Below(path);
                below.insert(below.end(), deeper.begin(), deeper.end());
            }
        }
        return below;
    }

    std::map<std::string, std::vector<OpPtr>> at_;
    std::vector<OpPtr> list_;
    std::vector<std::string> known_;
    int consumed_ = 0;
};

std::vector<Step> StepsOver(const std::vector<std::string>& paths) {
    std::vector<Step> steps;
    for (const std::string& path : paths) {
        for (const unsigned int bits :
             {EVENT_CREATE, EVENT_MODIFY, EVENT_DELETE, EVENT_ATTR, EVENT_REINDEX}) {
            steps.push_back({bits, path, "", false, ""});
        }
        steps.push_back({EVENT_UPDATE_CFG, path, "", false, R"({"audio":true,"photo":false})"});
        for (const std::string& old : paths) {
            steps.push_back({EVENT_RENAME, path, old, true, ""});
        }
    }
    return steps;
}

/// Folds the steps in both ways. False, with the queue lines that show it, when they differ.
bool Agree(const std::vector<const Step*>& steps) {
    static const auto no_consumer = [](const std::shared_ptr<OP>&) {};
    const auto tree = EmptyTree();
    Model model;
    for (const Step* step : steps) {
        tree->InsertEvent(step->ToEvent());
        model.Insert(*step);
    }
    VerifyTree(*tree);
    const auto folded = Surviving(*tree);
    const auto expected = model.Surviving();
    EXPECT_EQ(folded, expected);
    EXPECT_EQ(tree->ProcessOP(no_consumer), model.Consumed());
    if (testing::Test::HasFailure()) {
        for (const Step* step : steps) {
            std::cout << step->ToLine() << "\n";
        }
    }
    return !testing::Test::HasFailure();
}

TEST(OPTreeModelTest, AgreesOnEveryShortSequence) {
    const std::vector<Step> steps = StepsOver({"/d", "/d/f", "/e"});
    for (int length = 1; length <= kExhaustiveLength; ++length) {
        std::vector<std::size_t> digits(static_cast<std::size_t>(length), 0);
        for (std::size_t position = 0; position < digits.size();) {
            std::vector<const Step*> sequence;
            for (const std::size_t digit : digits) {
                sequence.push_back(&steps[digit]);
            }
            ASSERT_TRUE(Agree(sequence));
            for (position = 0; position < digits.size() && ++digits[position] == steps.size();) {
                digits[position++] = 0;
            }
        }
    }
}

TEST(OPTreeModelTest, AgreesOnARenameOntoItself) {
    // It moves the reindex behind the delete, which then is not the last work to be taken along.
    const Step steps[] = {{EVENT_REINDEX, "/d/d", "", false, ""},
                          {EVENT_DELETE, "/d/d", "", false, ""},
                          {EVENT_RENAME, "/d", "/d", true, ""},
                          {EVENT_CREATE, "/d/d", "", false, ""},
                          {EVENT_RENAME, "/e", "/d/d", true, ""}};
    std::vector<const Step*> sequence;
    for (const Step& step : steps) {
        sequence.push_back(&step);
    }
    EXPECT_TRUE(Agree(sequence));
}

TEST(OPTreeModelTest, AgreesOnLongRandomSequences) {
    const std::vector<Step> steps =
        StepsOver({"/d", "/d/f", "/d/d", "/d/d/f", "/e", "/e/f", "/e/d/f"});
    std::mt19937 random(Seed());
    for (unsigned int run = 0; run < kRandomRuns; ++run) {
        std::vector<const Step*> sequence(5 + random() % 20);
        for (const Step*& step : sequence) {
            step = &steps[random() % steps.size()];
        }
        ASSERT_TRUE(Agree(sequence)) << "run " << run;
    }
}

}  // namespace
}  // namespace quivra::fileindex
