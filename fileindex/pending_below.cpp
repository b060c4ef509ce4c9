#include "fileindex/pending_below.h"

#include <algorithm>

#include "fileindex/node_extra.h"

namespace quivra::fileindex {
namespace {

std::uint8_t BitOf(PendingBelow::Behaviour behaviour) {
    return static_cast<std::uint8_t>(1U << behaviour);
}

}  // namespace

PendingBelow::Behaviour PendingBelow::BehaviourOf(FileIndexOP kind) {
    return kind == OP_DELETE ? kCancelled : kind == OP_RENAME ? kMoved : kBoth;
}

void PendingBelow::Mark(OPNode& node, Behaviour behaviour) {
    const std::uint8_t bit = BitOf(behaviour);
    // A listed node has listed ancestors: a walk takes the lists from the top down.
    for (OPNode* child = &node; child->parent != nullptr && (child->listed_ & bit) == 0;
         child = child->parent.get()) {
        child->listed_ = static_cast<std::uint8_t>(child->listed_ | bit);
        child->parent->NeedExtra().pending[behaviour].push_back(child);
    }
}

std::vector<OPNode*> PendingBelow::TakeCancelled(OPNode& node) {
    return Take(node, kCancelled, kBoth);
}

std::vector<OPNode*> PendingBelow::TakeMoving(OPNode& node) {
    return Take(node, kBoth, kMoved);
}

bool PendingBelow::HasMoving(const OPNode& node) {
    return node.extra_ != nullptr &&
           !(node.extra_->pending[kBoth].empty() && node.extra_->pending[kMoved].empty());
}

std::vector<OPNode*> PendingBelow::Take(OPNode& node, Behaviour first, Behaviour second) {
    std::vector<OPNode*> taken;
    if (node.extra_ == nullptr) {
        return taken;
    }
    for (const Behaviour behaviour : {first, second}) {
        std::vector<OPNode*>& list = node.extra_->pending[behaviour];
        for (OPNode* child : list) {
            child->listed_ = static_cast<std::uint8_t>(child->listed_ & ~BitOf(behaviour));
        }
        taken.insert(taken.end(), list.begin(), list.end());
        list.clear();
    }
    std::sort(taken.begin(), taken.end(), [](const OPNode* left, const OPNode* right) {
        return left->position_ < right->position_;
    });
    taken.erase(std::unique(taken.begin(), taken.end()), taken.end());
    return taken;
}

}  // namespace quivra::fileindex
