// How a tree takes in one op: the handlers of OPTree.

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <utility>

#include "fileindex/coalescing.h"
#include "fileindex/live_ops.h"
#include "fileindex/node_extra.h"
#include "fileindex/optree.h"
#include "fileindex/pending_below.h"
#include "fileindex/subtree_move.h"

namespace quivra::fileindex {

using NodePtr = std::shared_ptr<OPNode>;
using OPPtr = std::shared_ptr<OP>;

void OPTree::HandleCreate(const NodePtr& node, const OPPtr& op) {
    TakeStock(*node, *op);
    Fold(node, op, OP_UPSERT, Incoming::kCreate);
    Finish(node, op);
}

void OPTree::HandleModify(const NodePtr& node, const OPPtr& op) {
    TakeStock(*node, *op);
    Fold(node, op, OP_UPSERT, Incoming::kModify);
    Finish(node, op);
}

void OPTree::HandleDelete(const NodePtr& node, const OPPtr& op) {
    TakeStock(*node, *op);
    Fold(node, op, OP_DELETE, Incoming::kDelete);
    Finish(node, op);
}

void OPTree::HandleAttr(const NodePtr& node, const OPPtr& op) {
    TakeStock(*node, *op);
    Fold(node, op, OP_ATTR, Incoming::kAttr);
    Finish(node, op);
}

void OPTree::HandleUpdateCfg(const NodePtr& node, const OPPtr& op) {
    TakeStock(*node, *op);
    Fold(node, op, OP_UPDATE_CFG, Incoming::kUpdateCfg);
    Finish(node, op);
}

void OPTree::HandleReindex(const NodePtr& node, const OPPtr& op) {
    TakeStockBelow(node, *op);
    Reindex(node, op);
    Finish(node, op);
}

void OPTree::HandleRename(const NodePtr& node, const OPPtr& op) {
    const NodePtr old_node = GetNodeByPath(op->path);
    TakeStockBelow(old_node, *op);
    TakeStockBelow(node, *op);
    Rename(node, op, old_node);
    Finish(node, op);
}

void OPTree::Fold(const NodePtr& node, const OPPtr& op, FileIndexOP kind, Incoming incoming) {
    ForgetLoadsAbove(*node);
    SetKind(*op, kind);
    LiveOps live(*node);
    if (live.Coalesce(*op, incoming)) {
        op->op = OP_NONE;
    }
    if (live.HasFollowers()) {
        SetStale(*node);
    }
    MarkPending(*node);
    Attach(node, op);
}

void OPTree::Reindex(const NodePtr& node, const OPPtr& op) {
    ForgetLoadsNear(*node);
    Fold(node, op, OP_REINDEX, Incoming::kReindex);
    std::vector<OPNode*> pending{node.get()};
    while (!pending.empty()) {
        OPNode& top = *pending.back();
        pending.pop_back();
        for (OPNode* child : PendingBelow::TakeCancelled(top)) {
            LiveOps(*child).CancelAll();
            pending.push_back(child);
        }
    }
}

void OPTree::Rename(const NodePtr& node, const OPPtr& op, const NodePtr& old_node) {
    ForgetLoadsAbove(*node);
    ForgetLoadsAbove(*old_node);
    SetKind(*op, OP_RENAME);
    // What was at the new place is replaced.
    LiveOps(*node).Cancel({OP_DELETE, OP_UPSERT, OP_ATTR});
    const FileIndexOP work = LiveOps(*old_node).Cancel({OP_UPSERT, OP_ATTR, OP_REINDEX});
    MoveAllOPs(*old_node, node);
    // For this rename and those that came along; before the walk, which may meet the node.
    PendingBelow::Mark(*node, PendingBelow::kMoved);
    MoveOPsBelow(old_node, node, *op);
    Attach(node, op);
    if (work != OP_NONE) {
        const OPPtr again = std::make_shared<OP>(node, work, std::string(), Json::Value());
        Attach(node, again);
        Finish(node, again);
    }
}

void OPTree::Attach(const NodePtr& node, const OPPtr& op) {
    if (!op->counted_) {
        op->counted_ = true;
        ++consumed_;
    }
    if (op->op != OP_NONE && !op->attached_) {
        op->attached_ = true;
        ops.push_back(op);
        node->ops.push_back(op);
    }
}

// An op never coalesces with itself: it becomes a live one when its event has been dealt with.
void OPTree::Finish(const NodePtr& node, const OPPtr& op) {
    if (op->attached_ && op->op != OP_NONE && op->op != OP_RENAME) {
        LiveOps live(*node);
        live.Add(*op);
        PendingBelow::Mark(*node, PendingBelow::BehaviourOf(op->op));
        if (live.HasFollowers()) {
            SetStale(*node);
        }
    }
    if (!building_) {
        Settle();
    }
}

void OPTree::MarkPending(OPNode& node) {
    LiveOps(node).ForEach(
        [&](const OP& op) { PendingBelow::Mark(node, PendingBelow::BehaviourOf(op.op)); });
}

/// Appends all ops of a node to another's. The longer list stays as it is and only changes its
/// owner: files that swap their names for hours gather a long one.
void OPTree::MoveAllOPs(OPNode& from, const NodePtr& to) {
    if (&from == to.get()) {
        return;
    }
    LiveOps(from).MoveTo(*to, true);
    MarkPending(*to);
    if (LiveOps(*to).HasFollowers()) {
        SetStale(*to);
    }
    const auto size = [](const OPNode& node) {
        return node.ops.size() + (node.extra_ == nullptr ? 0 : node.extra_->earlier.size());
    };
    if (size(from) <= size(*to)) {
        Consolidate(from);
        for (OPPtr& op : from.ops) {
            op->node = to;
            to->ops.push_back(std::move(op));
        }
        from.ops.clear();
        from.dead_ = 0;
        return;
    }
    Consolidate(*to);
    const std::vector<OPPtr> first = std::exchange(to->ops, std::exchange(from.ops, {}));
    to->dead_ = std::exchange(from.dead_, 0);
    if (from.extra_ != nullptr && !from.extra_->earlier.empty()) {
        to->NeedExtra().earlier.swap(from.extra_->earlier);
    }
    if (!first.empty()) {
        std::vector<OPPtr>& earlier = to->NeedExtra().earlier;
        earlier.insert(earlier.end(), first.rbegin(), first.rend());
    }
    SetStale(*to);
}

void OPTree::MoveOPsBelow(const NodePtr& old_top, const NodePtr& new_top, const OP& rename) {
    if (!HasMovingBelow(*old_top) || MoveLoad(*old_top, *new_top)) {
        return;
    }
    std::vector<OPNode*> homes = HomesOfLoad(*old_top);
    ForgetLoadsNear(*old_top);
    ForgetLoadsNear(*new_top);
    SubtreeMove move(*old_top, *new_top);
    if (old_top != new_top && IsRelated(*old_top, *new_top)) {
        // An op may move several times then, from node to node of the subtree. No file system
        // renames a directory into itself, so that it may take its time.
        AddDescendants(
            move, [](const OPNode& node) -> const auto& { return node.children; });
        MoveOPs(move, &rename);
        return;
    }
    const bool alone = old_top == new_top || !PendingBelow::HasMoving(*new_top);
    AddDescendants(move, PendingBelow::TakeMoving);
    if (MoveOPs(move, &rename) && alone && building_) {
        homes.push_back(old_top.get());
        homes.push_back(new_top.get());
        AddLoad(*new_top, std::move(homes));
    }
}

bool OPTree::MoveOPs(SubtreeMove& move, const OP* rename) {
    bool moved = false;
    for (std::size_t i = 1; i < move.Size(); ++i) {
        OPNode& from = move.From(i);
        std::vector<OPPtr> moving = DetachMoving(from, rename);
        if (!moving.empty()) {
            AttachMoved(moving, from, move.To(i));
            moved = true;
        }
    }
    return moved;
}

/// Takes those ops off a node that follow the rename of an ancestor. Cancelled ops and deletes
/// stay.
std::vector<OPPtr> OPTree::DetachMoving(OPNode& node, const OP* rename) {
    Consolidate(node);
    while (node.dead_ < node.ops.size() && node.ops[node.dead_]->op == OP_NONE) {
        ++node.dead_;
    }
    std::vector<OPPtr> moving;
    auto kept = node.ops.begin() + node.dead_;
    for (auto op = kept; op != node.ops.end(); ++op) {
        if (LiveOps::KindOf(**op) >= OP_UPSERT && op->get() != rename) {
            moving.push_back(std::move(*op));
        } else {
            if (kept != op) {
                *kept = std::move(*op);
            }
            ++kept;
        }
    }
    node.ops.erase(kept, node.ops.end());
    return moving;
}

void OPTree::AttachMoved(std::vector<OPPtr>& moved, OPNode& from, OPNode& to) {
    const NodePtr node = to.shared_from_this();
    for (OPPtr& op : moved) {
        if (op->op == OP_RENAME) {
            PendingBelow::Mark(to, PendingBelow::kMoved);
        }
        op->node = node;
        to.ops.push_back(std::move(op));
    }
    LiveOps(from).MoveTo(to, false);
    MarkPending(to);
    if (LiveOps(to).HasFollowers()) {
        SetStale(to);
    }
}

void OPTree::Consolidate(OPNode& node) {
    if (node.extra_ == nullptr || node.extra_->earlier.empty()) {
        return;
    }
    std::vector<OPPtr>& earlier = node.extra_->earlier;
    node.ops.insert(node.ops.begin(), std::make_move_iterator(earlier.rbegin()),
                    std::make_move_iterator(earlier.rend()));
    earlier.clear();
    node.dead_ = 0;
}

void OPTree::SetStale(OPNode& node) {
    if (!std::exchange(node.stale_, true)) {
        stale_.push_back(&node);
    }
}

void OPTree::Settle() {
    for (OPNode* node : stale_) {
        node->stale_ = false;
        Consolidate(*node);
        LiveOps(*node).SettleGroups();
        const NodePtr owner = node->shared_from_this();
        for (const OPPtr& op : node->ops) {
            if (op->node != owner) {
                op->node = owner;
            }
        }
    }
    stale_.clear();
}

void OPTree::TakeStock(OPNode& node, const OP& incoming_op) {
    LiveOps live(node);
    live.Reset();
    node.dead_ = 0;
    for (const OPPtr& op : node.ops) {
        if (op.get() == &incoming_op || op->op == OP_NONE) {
            continue;
        }
        PendingBelow::Mark(node, PendingBelow::BehaviourOf(op->op));
        if (op->op != OP_RENAME) {
            live.Add(*op);
        }
    }
}

void OPTree::TakeStockBelow(const NodePtr& top, const OP& incoming_op) {
    TraverseNodeDescendant(
        top, [&](const NodePtr& node) { TakeStock(*node, incoming_op); }, false);
}

}  // namespace quivra::fileindex
