#include "programs/fileindexd/pass.h"

#include <algorithm>
#include <cerrno>
#include <limits>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/queue_mgr.h"
#include "programs/fileindexd/paths.h"
#include "programs/fileindexd/renames.h"

namespace fileindexd {

using quivra::Error;
using quivra::fileindex::OP;

namespace {

constexpr const char* kUnit = "pass";

/// How much older than its event, in seconds, a change may be: the monitor may lag behind.
constexpr std::int64_t kMonitorLag = 2;

/// With more changes than this at once, none is the one of a file that is too busy.
constexpr std::size_t kMaxChanged = 1000;

constexpr ContentClasses kAllClasses{true, true, true, true};

ContentClasses ClassesOf(const Json::Value& settings) {
    ContentClasses classes;
    quivra::GetJsonValue(classes.document, settings, "document", false);
    quivra::GetJsonValue(classes.audio, settings, "audio", false);
    quivra::GetJsonValue(classes.video, settings, "video", false);
    quivra::GetJsonValue(classes.photo, settings, "photo", false);
    return classes;
}

/// Files that may have changed since their last indexing: all, where the beginning of the working
/// copy is not known.
std::int64_t FreshSince(const WorkingCopy& copy) {
    return copy.created ? *copy.created - kMonitorLag : std::numeric_limits<std::int64_t>::min();
}

}  // namespace

Pass::Pass(std::string queue_path, std::string root, Index& index, const Scope& scope,
           PassListener listener)
    : queue_path_(std::move(queue_path)),
      root_(std::move(root)),
      index_(index),
      scope_(scope),
      listener_(std::move(listener)),
      rules_(scope_.Describe(root_)),
      applied_rules_(queue_path_ + ".rules") {}

PassResult Pass::Run() {
    PassResult result;
    const ShareTree tree(root_);
    quivra::fileindex::QueueMgr queue(queue_path_);
    std::vector<std::shared_ptr<OP>> ops;
    result.consumed =
        queue.ProcessOP([&](std::shared_ptr<OP> op) { ops.push_back(std::move(op)); }, true);
    const std::optional<WorkingCopy> copy = WorkingCopy::At(queue_path_ + ".tmp");
    if (!copy) {
        return result;
    }
    result.had_work = true;
    CheckShare(tree);

    batch_ = std::make_unique<Batch>(index_, tree, scope_, listener_);
    settler_ = std::make_unique<Settler>(*batch_, index_, tree, scope_, FreshSince(*copy));
    progress_ = std::make_unique<Progress>(queue_path_ + ".progress", *copy);
    Sort(ops);
    RunRenames(tree);
    RunSingles();
    RunRoots();
    batch_->Commit();
    tree.CheckMounted();
    applied_rules_.Store(rules_);

    result.changed = ChangedFiles();
    result.counts = batch_->GetCounts();
    if (queue.DeleteTmp() != 0 && errno != ENOENT) {
        const std::string reason = "The working copy cannot be deleted: " + queue_path_ + ".tmp";
        quivra::Fail({kUnit, __LINE__}, "queue.DeleteTmp() != 0",
                     Error(Error::kSystemCallFailed, reason));
    }
    progress_->Remove();
    return result;
}

std::vector<std::string> Pass::ChangedFiles() const {
    std::vector<std::string> changed;
    if (singles_.size() <= kMaxChanged) {
        for (const auto& op : singles_) {
            if (op->op == quivra::fileindex::OP_UPSERT) {
                changed.push_back(op->node->GetPath());
            }
        }
    }
    return changed;
}

void Pass::CheckShare(const ShareTree& tree) const {
    if (tree.IsEmpty() && !index_.ListBelow(root_, 0, 1).empty()) {
        quivra::Fail({kUnit, __LINE__}, "tree.IsEmpty()",
                     Error(Error::kSystemCallFailed,
                           "The share's root is empty, but its index is not; is the volume "
                           "mounted? path=" +
                               root_));
    }
}

void Pass::Sort(const std::vector<std::shared_ptr<OP>>& ops) {
    using namespace quivra::fileindex;
    const ContentClasses reindexed =
        applied_rules_.AreEqualTo(rules_) ? ContentClasses{} : kAllClasses;
    for (const auto& op : ops) {
        const std::string path = op->op == OP_REINDEX_ALL ? root_ : op->node->GetPath();
        switch (op->op) {
            case OP_DELETE:
            case OP_UPSERT:
            case OP_ATTR:
                singles_.push_back(op);
                break;
            case OP_RENAME:
                renames_.push_back({op->path, path, Rename::Plan::kMove});
                break;
            case OP_UPDATE_CFG:
                roots_.push_back({path, ClassesOf(op->data), false});
                break;
            case OP_REINDEX:
            case OP_REINDEX_ALL:
                roots_.push_back({path, reindexed, false});
                break;
            case OP_NONE:
                break;
        }
    }
    batch_->Expect(singles_.size() + renames_.size());
}

bool Pass::HasDocuments(const std::string& path) const {
    return !index_.Find({path}).empty() || !index_.ListBelow(path, 0, 1).empty();
}

void Pass::RunRenames(const ShareTree& tree) {
    if (renames_.empty() && roots_.empty()) {
        return;
    }
    // What an interrupted pass has sent may still be waiting in the search daemon.
    index_.Commit();
    const bool again = progress_->Steps() > 0;
    if (!again) {
        PlanRenames(renames_, [this](const std::string& path) { return HasDocuments(path); });
    }
    const std::vector<bool> moved = again
                                        ? std::vector<bool>(renames_.size(), false)
                                        : CarryOutRenames(renames_, *batch_, index_, tree, scope_);
    for (std::size_t i = 0; i < renames_.size(); ++i) {
        roots_.push_back({renames_[i].from, {}, false});
        roots_.push_back({renames_[i].to, {}, moved[i]});
        batch_->Finish();
    }
    if (!again && !renames_.empty()) {
        Commit(1);
    }
}

void Pass::RunSingles() {
    for (std::size_t i = 0; i < singles_.size(); ++i) {
        const std::size_t step = 2 + i;
        if (step > progress_->Steps()) {
            RunSingle(*singles_[i]);
            StepDone(step);
        }
        batch_->Finish();
    }
}

void Pass::RunSingle(const OP& op) {
    const std::string path = op.node->GetPath();
    std::optional<Attributes> there;
    if (!batch_->Look(there, path)) {
        return;
    }
    const bool covered = there && scope_.Covers(path, there->is_dir);
    const bool only_attributes = op.op == quivra::fileindex::OP_ATTR;
    if (there && there->is_dir && !only_attributes) {
        // A file was to come or go here, and now it is a directory of unknown content.
        batch_->Commit();
        settler_->Settle(path);
    } else if (!covered) {
        batch_->Drop(path);
    } else if (only_attributes) {
        batch_->Refresh(path, there->is_dir);
    } else {
        batch_->Upsert(path, false);
        settler_->NoteIndexed(path);
    }
}

void Pass::MergeRoots() {
    // With "/" behind the path, what lies below a root follows it directly.
    std::sort(roots_.begin(), roots_.end(),
              [](const Root& a, const Root& b) { return a.path + "/" < b.path + "/"; });
    std::vector<Root> merged;
    std::vector<std::size_t> above;  // the roots in `merged` that the present one lies below
    for (Root& root : roots_) {
        while (!above.empty() && !IsAtOrBelow(root.path, merged[above.back()].path)) {
            above.pop_back();
        }
        if (!above.empty() && merged[above.back()].path == root.path) {
            Root& same = merged[above.back()];
            same.again.Add(root.again);
            same.moved = same.moved && root.moved;
            continue;
        }
        const bool implied = std::any_of(above.begin(), above.end(), [&](std::size_t i) {
            return !merged[i].moved && merged[i].again.Includes(root.again);
        });
        if (!implied) {
            above.push_back(merged.size());
            merged.push_back(std::move(root));
        }
    }
    roots_ = std::move(merged);
}

void Pass::RunRoots() {
    MergeRoots();
    const std::size_t steps_before = 1 + singles_.size();
    if (!roots_.empty() && progress_->Steps() <= steps_before) {
        Commit(steps_before);  // settling looks at what is committed
    }
    for (std::size_t i = 0; i < roots_.size(); ++i) {
        const std::size_t step = steps_before + 1 + i;
        if (step <= progress_->Steps()) {
            continue;
        }
        if (roots_[i].moved) {
            settler_->SettleMoved(roots_[i].path);
        } else {
            settler_->Settle(roots_[i].path, roots_[i].again);
        }
        StepDone(step);
    }
}

void Pass::StepDone(std::size_t step) {
    if (batch_->IsCommitDue()) {
        Commit(step);
    }
}

void Pass::Commit(std::size_t steps) {
    batch_->Commit();
    if (steps > progress_->Steps()) {
        progress_->Store(steps);
    }
}

}  // namespace fileindexd
