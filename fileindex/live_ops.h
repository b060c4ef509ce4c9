#pragma once

#include <array>
#include <cstddef>
#include <initializer_list>
#include <iterator>
#include <vector>

#include "fileindex/coalescing.h"
#include "fileindex/op.h"

namespace quivra::fileindex {

/// The followers of a leader, and what they have missed. A merge concerns the ops that followed at
/// that time, which are the first so many: a number stands for a mark on each of them.
struct OP::Group {
    std::vector<OP*> followers;
    std::size_t merged = 0;                                         ///< so many missed a merge
    std::array<std::size_t, std::size(kContentClasses)> granted{};  ///< ... that switched this on
};

/// The ops of one node that later events can still change: those neither cancelled nor renames.
///
/// Ops of one kind on one node share their fate for good: what comes in treats them alike, and what
/// moves one moves all. So they form a group, of which only the leader is kept exact, and a node
/// has one leader a kind at most, however many ops pile up on it. Leaders are linked in the order
/// of the last op of each group. Followers are stale until SettleGroups.
///
/// A view of the node; the ops are owned by the tree's list.
class LiveOps {
  public:
    explicit LiveOps(OPNode& node) : node_(node) {}

    /// Takes in a live op that stands behind all others of the node.
    void Add(OP& op);

    /// Applies the rule of each existing op. Returns whether one of them drops the incoming op.
    bool Coalesce(const OP& incoming_op, Incoming incoming);

    /// Cancels the ops of these kinds. Returns the kind of the last one, OP_NONE when there is
    /// none.
    FileIndexOP Cancel(std::initializer_list<FileIndexOP> kinds);
    void CancelAll();

    /// Hands the ops over to another node, behind that node's; deletes only when asked to. It may
    /// be the same node: what stays is in front then.
    void MoveTo(OPNode& to, bool with_deletes);

    /// Calls `fn` with each leader.
    template <typename Function>
    void ForEach(const Function& fn) const {
        for (OP* op = node_.live_; op != nullptr; op = op->link_) {
            fn(*op);
        }
    }

    bool HasFollowers() const;
    void SettleGroups();

    /// Forgets the ops, so that those that are live can be added again. All are exact.
    void Reset();

    /// The kind of any op, also of a stale one.
    static FileIndexOP KindOf(const OP& op) { return op.follows_ ? op.link_->op : op.op; }

  private:
    template <typename Change>
    void Update(const Change& change);
    static void CancelGroup(OP& leader);
    static void ApplyToGroup(Action action, OP& leader, const OP& incoming_op);
    static OP& Unite(OP& first, OP& second);
    static void SettleGroup(OP& leader);

    OPNode& node_;
};

}  // namespace quivra::fileindex
