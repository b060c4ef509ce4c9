#include "programs/fileindexd/pass.h"

#include <algorithm>
#include <cerrno>
#include <ctime>

#include "base/path.h"
#include "base/queue_file.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/queue_mgr.h"
#include "programs/fileindexd/failures.h"
#include "programs/fileindexd/renames.h"

namespace fileindexd {

using quivra::Error;
using quivra::fileindex::OP;

namespace {

constexpr const char* kUnit = "pass";

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

bool IsUpsert(const OP& op) {
    return op.op == quivra::fileindex::OP_UPSERT;
}

}  // namespace

Pass::Pass(Share share, Index& index, const Scope& scope, PassListener listener)
    : share_(std::move(share)),
      index_(index),
      scope_(scope),
      listener_(std::move(listener)),
      rules_(scope_.Describe(share_.root)),
      until_(std::chrono::steady_clock::now() + share_.files_time) {}

PassResult Pass::Run() {
    PassResult result;
    const ShareTree tree(share_.root);
    quivra::fileindex::QueueMgr queue(share_.queue_path);
    const std::string copy_path = quivra::base::WorkingCopy(share_.queue_path);
    std::vector<std::shared_ptr<OP>> ops;
    result.consumed =
        queue.ProcessOP([&](std::shared_ptr<OP> op) { ops.push_back(std::move(op)); }, true);
    const std::optional<WorkingCopy> copy =
        WorkingCopy::At(share_.directory.Fd(), std::string(quivra::base::Name(copy_path)));
    if (!copy) {
        return result;
    }
    result.had_work = true;
    copy_ = *copy;
    // Merged, but killed before the copy was deleted: everything in it is done, or in the backlog.
    if (!share_.backlog.IsMerged(copy_)) {
        CheckShare(tree);
        CarryOut(tree, ops);
        result.changed = ChangedFiles();
        result.counts = batch_->GetCounts();
        result.left = std::move(addition_);
    }
    if (queue.DeleteTmp() != 0 && errno != ENOENT) {
        quivra::Fail(
            {kUnit, __LINE__}, "queue.DeleteTmp() != 0",
            Error(Error::kSystemCallFailed, "The working copy cannot be deleted: " + copy_path));
    }
    return result;
}

void Pass::CarryOut(const ShareTree& tree, const std::vector<std::shared_ptr<OP>>& ops) {
    batch_ = std::make_unique<Batch>(index_, tree, scope_, listener_);
    settler_ = std::make_unique<Settler>(*batch_, index_, scope_);
    steps_ = share_.backlog.Steps(copy_);
    Sort(ops);
    RunRenames(tree);
    RunSingles();
    RunRoots();
    batch_->Commit();
    // Commit looks only when there was something to commit.
    tree.CheckMounted();
    Leave();
}

/// The index holds what the pass did: what it has left to do must not be lost any more.
void Pass::Leave() {
    addition_.failures = ReadProblems(index_, batch_->Extracted());
    for (const std::string& path : batch_->Extracted()) {
        const bool failed =
            std::any_of(addition_.failures.begin(), addition_.failures.end(),
                        [&](const Problem& problem) { return problem.path == path; });
        if (!failed) {
            addition_.done.push_back(path);
        }
    }
    for (Problem& problem : batch_->TakeProblems()) {
        addition_.failures.push_back(std::move(problem));
    }
    share_.backlog.Merge(addition_, copy_, rules_, time(nullptr));
}

std::vector<std::string> Pass::ChangedFiles() const {
    std::vector<std::string> changed;
    if (singles_.size() <= kMaxChanged) {
        for (const auto& op : singles_) {
            if (IsUpsert(*op)) {
                changed.push_back(op->node->GetPath());
            }
        }
    }
    return changed;
}

void Pass::CheckShare(const ShareTree& tree) const {
    if (tree.IsEmpty() && !index_.ListBelow(share_.root, "", 1).empty()) {
        quivra::Fail({kUnit, __LINE__}, "tree.IsEmpty()",
                     Error(Error::kSystemCallFailed,
                           "The share's root is empty, but its index is not; is the volume "
                           "mounted? path=" +
                               share_.root));
    }
}

/// Anybody may write lines: what concerns another place must not make us drop documents.
bool Pass::IsOurs(const std::string& path) const {
    return quivra::base::IsAtOrBelow(path, share_.root) && quivra::base::IsCanonicalText(path);
}

void Pass::Sort(const std::vector<std::shared_ptr<OP>>& ops) {
    using namespace quivra::fileindex;
    const ContentClasses reindexed =
        share_.backlog.Rules() == rules_ ? ContentClasses{} : kAllClasses;
    for (const auto& op : ops) {
        const std::string path = op->op == OP_REINDEX_ALL ? share_.root : op->node->GetPath();
        if (op->op == OP_RENAME) {
            SortRename(op->path, path);
            continue;
        }
        if (!IsOurs(path)) {
            quivra::LogError({kUnit, __LINE__}, "Queue %s: %s does not lie in the share",
                             share_.queue_path.c_str(), path.c_str());
            continue;
        }
        switch (op->op) {
            case OP_DELETE:
            case OP_UPSERT:
            case OP_ATTR:
                singles_.push_back(op);
                break;
            case OP_UPDATE_CFG:
                roots_.push_back({path, ClassesOf(op->data), false});
                break;
            case OP_REINDEX:
            case OP_REINDEX_ALL:
                roots_.push_back({path, reindexed, false});
                break;
            default:
                break;
        }
    }
    batch_->Expect(singles_.size() + renames_.size());
}

/// The old place may lie outside: the whole share may have been renamed.
void Pass::SortRename(const std::string& from, const std::string& to) {
    const bool is_from_above = quivra::base::IsBelow(share_.root, from);
    if (IsOurs(to) && quivra::base::IsCanonicalText(from) && !is_from_above) {
        renames_.push_back({from, to, Rename::Plan::kMove});
        return;
    }
    for (const std::string& path : {from, to}) {
        if (IsOurs(path)) {
            roots_.push_back({path, {}, false});
        }
    }
}

bool Pass::HasDocuments(const std::string& path) const {
    return !index_.Find({path}).empty() || !index_.ListBelow(path, "", 1).empty();
}

void Pass::RunRenames(const ShareTree& tree) {
    if (renames_.empty() && roots_.empty()) {
        return;
    }
    // What an interrupted pass has sent may still be waiting in the search daemon.
    index_.Commit();
    const bool again = steps_ > 0;
    if (!again) {
        PlanRenames(renames_, [this](const std::string& path) { return HasDocuments(path); });
    }
    const std::vector<bool> moved = again
                                        ? std::vector<bool>(renames_.size(), false)
                                        : CarryOutRenames(renames_, *batch_, index_, tree, scope_);
    for (std::size_t i = 0; i < renames_.size(); ++i) {
        const Rename& rename = renames_[i];
        roots_.push_back({rename.from, {}, false});
        // What was to be extracted again at the old place is owed at the new one.
        roots_.push_back({rename.to, share_.backlog.AgainAt(rename.from), moved[i]});
        if (rename.from != rename.to) {
            addition_.moves.push_back({rename.from, rename.to, !moved[i]});
        }
        batch_->Finish();
    }
    if (!again && !renames_.empty()) {
        Commit(1);
    }
}

void Pass::RunSingles() {
    for (std::size_t i = 0; i < singles_.size(); ++i) {
        const std::size_t step = 2 + i;
        if (step > steps_) {
            RunSingle(*singles_[i]);
            StepDone(step);
        } else if (IsUpsert(*singles_[i])) {
            // The interrupted pass may have left the content for later.
            addition_.files.push_back({singles_[i]->node->GetPath(), 0});
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
        roots_.push_back({path, {}, false});
        if (covered) {
            batch_->Upsert(path, true);
        }
    } else if (!covered) {
        batch_->Drop(path);
        addition_.dropped.push_back(path);
    } else if (only_attributes) {
        batch_->Refresh(path, there->is_dir);
    } else {
        UpsertFile(path, there->size);
    }
}

/// A few files now, many by and by, so that a pass stays short.
void Pass::UpsertFile(const std::string& path, std::int64_t size) {
    if (std::chrono::steady_clock::now() < until_) {
        batch_->Upsert(path, false);
    } else {
        addition_.unnamed.push_back({path, size});
    }
}

void Pass::MergeRoots() {
    // With "/" behind the path, what lies below a root follows it directly.
    std::sort(roots_.begin(), roots_.end(),
              [](const Root& a, const Root& b) { return a.path + "/" < b.path + "/"; });
    std::vector<Root> merged;
    std::vector<std::size_t> above;  // the roots in `merged` that the present one lies below
    for (Root& root : roots_) {
        while (!above.empty() && !quivra::base::IsAtOrBelow(root.path, merged[above.back()].path)) {
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
    if (!roots_.empty() && steps_ <= steps_before) {
        Commit(steps_before);  // settling looks at what is committed
    }
    for (const Root& root : roots_) {
        RunRoot(root);
    }
}

void Pass::RunRoot(const Root& root) {
    if (!IsOurs(root.path)) {
        // The old place of a share that was renamed: its documents have moved, or are nobody's.
        batch_->Drop(root.path);
        addition_.dropped.push_back(root.path);
        return;
    }
    const Settler::Found found =
        root.moved ? settler_->SettleMoved(root.path) : settler_->Settle(root.path, root.again);
    switch (found) {
        case Settler::Found::kNothing:
            addition_.dropped.push_back(root.path);
            break;
        case Settler::Found::kDirectory:
            addition_.trees.push_back({0, root.path, root.again});
            break;
        case Settler::Found::kFile:
            if (root.moved && root.again.Any()) {
                addition_.files.push_back({root.path, 0});
            }
            break;
        case Settler::Found::kUnknown:
            break;
    }
}

void Pass::StepDone(std::size_t step) {
    if (batch_->IsCommitDue()) {
        Commit(step);
    }
}

void Pass::Commit(std::size_t steps) {
    batch_->Commit();
    if (steps > steps_) {
        share_.backlog.StoreSteps(copy_, steps);
        steps_ = steps;
    }
}

}  // namespace fileindexd
