#pragma once

#include <vector>

#include "fileindex/op.h"

namespace quivra::fileindex {

/// Which children of a node have something pending, at themselves or below: so no walk enters a
/// subtree in which there is nothing to do for it.
///
/// A child stays listed until a walk takes the list, whatever becomes of its ops meanwhile. So
/// listing costs little, and each step of a walk is paid for by the listing that led to it.
class PendingBelow {
  public:
    /// How an op behaves when an ancestor is indexed again or renamed. A node is listed once for
    /// each: a walk for one purpose must not meet a million ops that do not matter to it.
    enum Behaviour {
        kCancelled,  ///< a delete: cancelled by a reindex, left behind by a rename
        kBoth,       ///< cancelled by a reindex, moved by a rename
        kMoved,      ///< a rename: not touched by a reindex, moved by a rename
    };

    static Behaviour BehaviourOf(FileIndexOP kind);

    /// Lists the node at its parent, the parent at its own and so on, as far as they are not.
    static void Mark(OPNode& node, Behaviour behaviour);

    /// The children listed for what a reindex cancels, in the order of their creation; they are
    /// not listed any more.
    static std::vector<OPNode*> TakeCancelled(OPNode& node);
    /// The same for what a rename moves.
    static std::vector<OPNode*> TakeMoving(OPNode& node);
    static bool HasMoving(const OPNode& node);

  private:
    static std::vector<OPNode*> Take(OPNode& node, Behaviour first, Behaviour second);
};

}  // namespace quivra::fileindex
