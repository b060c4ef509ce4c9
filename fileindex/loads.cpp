// Loads: how a tree renames the same directories again and again without moving what is below them.

#include <algorithm>
#include <cstddef>
#include <string>
#include <utility>

#include "fileindex/optree.h"
#include "fileindex/pending_below.h"
#include "fileindex/subtree_move.h"

namespace quivra::fileindex {
namespace {

/// More directories than that are not swapped in a circle by anybody.
constexpr std::size_t kMaxLoads = 8;

bool IsBelow(const OPNode& node, const OPNode& top) {
    return &node != &top && IsAtOrBelow(node, top);
}

}  // namespace

bool OPTree::MoveLoad(const OPNode& from, OPNode& to) {
    Load* moving = nullptr;
    bool is_free = &from == &to || !IsRelated(from, to);
    bool is_stored = false;
    for (Load& load : loads_) {
        // At both places, other ops may lie that have another place by now. Nothing else may.
        const auto is_clear = [&](const OPNode& top) {
            return !IsRelated(*load.place, top) &&
                   (load.stored == &top || !IsRelated(*load.stored, top));
        };
        is_stored = is_stored || load.stored == &to;
        if (load.place == &from) {
            moving = &load;
        } else {
            is_free = is_free && is_clear(from) && is_clear(to);
        }
    }
    if (moving == nullptr || !is_free || (!is_stored && PendingBelow::HasMoving(to)) ||
        std::find(moving->homes.begin(), moving->homes.end(), &to) == moving->homes.end()) {
        return false;
    }
    moving->place = &to;
    return true;
}

bool OPTree::HasMovingBelow(const OPNode& top) const {
    bool is_stored = false;
    for (const Load& load : loads_) {
        if (IsAtOrBelow(*load.place, top)) {
            return true;
        }
        is_stored = is_stored || load.stored == &top;
    }
    // What is stored at the top is all that is pending below it, and belongs elsewhere.
    return !is_stored && PendingBelow::HasMoving(top);
}

std::vector<OPNode*> OPTree::HomesOfLoad(const OPNode& place) const {
    const auto load = std::find_if(loads_.begin(), loads_.end(),
                                   [&](const Load& each) { return each.place == &place; });
    return load == loads_.end() ? std::vector<OPNode*>() : load->homes;
}

void OPTree::AddLoad(OPNode& place, std::vector<OPNode*> homes) {
    if (loads_.size() == kMaxLoads) {
        SettleLoads();
        loads_.erase(loads_.begin());
    }
    if (homes.size() > 2 * kMaxLoads) {
        homes.erase(homes.begin(), homes.end() - 2);
    }
    loads_.push_back({&place, &place, std::move(homes)});
}

void OPTree::ForgetLoadsAbove(const OPNode& node) {
    ForgetLoads([&](const Load& load) {
        return IsBelow(node, *load.stored) || IsBelow(node, *load.place);
    });
}

void OPTree::ForgetLoadsNear(const OPNode& node) {
    ForgetLoads([&](const Load& load) {
        return IsRelated(node, *load.stored) || IsRelated(node, *load.place);
    });
}

template <typename Touched>
void OPTree::ForgetLoads(const Touched& touched) {
    if (std::any_of(loads_.begin(), loads_.end(), touched)) {
        SettleLoads();
        std::erase_if(loads_, touched);
    }
}

// All leave before the first one arrives: one load may be stored where another one belongs.
void OPTree::SettleLoads() {
    const auto store = [&](OPNode& from, OPNode& to) {
        SubtreeMove move(from, to);
        AddDescendants(move, PendingBelow::TakeMoving);
        MoveOPs(move, nullptr);
    };
    std::vector<std::pair<NodePtr, OPNode*>> waiting;
    for (Load& load : loads_) {
        if (load.stored != load.place) {
            if (limbo_ == nullptr) {
                limbo_ = std::make_shared<OPNode>(nullptr, "");
            }
            waiting.emplace_back(limbo_->GetChild(std::to_string(waiting.size())), load.place);
            store(*load.stored, *waiting.back().first);
            load.stored = load.place;
        }
    }
    for (const auto& [from, to] : waiting) {
        store(*from, *to);
    }
}

}  // namespace quivra::fileindex
