#include "fileindex/live_ops.h"

#include <algorithm>
#include <cstddef>
#include <memory>
#include <utility>
#include <vector>

namespace quivra::fileindex {

void LiveOps::Add(OP& op) {
    OP* added = &op;
    OP** place = &node_.live_;
    while (*place != nullptr) {
        OP& other = **place;
        if (other.op == added->op) {
            *place = std::exchange(other.link_, nullptr);
            added = &Unite(other, *added);
        } else {
            place = &other.link_;
        }
    }
    *place = added;
}

bool LiveOps::Coalesce(const OP& incoming_op, Incoming incoming) {
    bool dropped = false;
    // All ops are treated, also once the incoming one was dropped.
    Update([&](OP& existing) {
        const Action action = CoalescingRule(existing.op, incoming);
        ApplyToGroup(action, existing, incoming_op);
        dropped = dropped || action != Action::kKeep;
    });
    return dropped;
}

FileIndexOP LiveOps::Cancel(std::initializer_list<FileIndexOP> kinds) {
    FileIndexOP last = OP_NONE;
    Update([&](OP& existing) {
        if (std::find(kinds.begin(), kinds.end(), existing.op) != kinds.end()) {
            last = existing.op;
            CancelGroup(existing);
        }
    });
    return last;
}

void LiveOps::CancelAll() {
    Update([](OP& existing) { CancelGroup(existing); });
}

void LiveOps::MoveTo(OPNode& to, bool with_deletes) {
    OP* stays = nullptr;
    for (OP* op = std::exchange(node_.live_, nullptr); op != nullptr;) {
        OP* const next = std::exchange(op->link_, nullptr);
        if (op->op == OP_DELETE && !with_deletes) {
            stays = op;
        } else {
            LiveOps(to).Add(*op);
        }
        op = next;
    }
    if (stays != nullptr) {
        stays->link_ = std::exchange(node_.live_, stays);
    }
}

bool LiveOps::HasFollowers() const {
    bool has = false;
    ForEach([&](const OP& leader) { has = has || leader.group_ != nullptr; });
    return has;
}

void LiveOps::SettleGroups() {
    ForEach([](OP& leader) { SettleGroup(leader); });
}

void LiveOps::Reset() {
    node_.live_ = nullptr;
    for (const std::shared_ptr<OP>& op : node_.ops) {
        op->group_.reset();
        op->link_ = nullptr;
        op->follows_ = false;
    }
}

/// Lets `change` alter each leader, then puts the list in order again: kinds may have met.
template <typename Change>
void LiveOps::Update(const Change& change) {
    for (OP* op = std::exchange(node_.live_, nullptr); op != nullptr;) {
        OP* const next = std::exchange(op->link_, nullptr);
        change(*op);
        if (op->op != OP_NONE) {
            Add(*op);
        }
        op = next;
    }
}

// Each op is cancelled once and becomes changed settings once, so that going through the followers
// costs nothing in the long run. Only deletes and upserts turn into each other again and again, and
// only settings are merged again and again: the followers catch up on these.
void LiveOps::CancelGroup(OP& leader) {
    SettleGroup(leader);
    leader.op = OP_NONE;
    if (leader.group_ != nullptr) {
        for (OP* follower : leader.group_->followers) {
            follower->op = OP_NONE;
            follower->link_ = nullptr;
            follower->follows_ = false;
        }
        leader.group_.reset();
    }
}

void LiveOps::ApplyToGroup(Action action, OP& leader, const OP& incoming_op) {
    Apply(action, leader, incoming_op);
    if (leader.group_ == nullptr) {
        return;
    }
    OP::Group& group = *leader.group_;
    if (action == Action::kToUpdateCfg) {
        for (OP* follower : group.followers) {
            Apply(action, *follower, incoming_op);
        }
    } else if (action == Action::kMerge) {
        group.merged = group.followers.size();
        for (std::size_t i = 0; i < group.granted.size(); ++i) {
            if (IsSwitchedOn(incoming_op.data, kContentClasses[i])) {
                group.granted[i] = group.merged;
            }
        }
    }
}

/// Makes one group of two; returns its leader. The smaller one joins, so that an op changes its
/// leader a few times only.
OP& LiveOps::Unite(OP& first, OP& second) {
    const auto size = [](const OP& op) { return op.group_ ? op.group_->followers.size() : 0; };
    const bool second_leads = size(first) < size(second);
    OP& leader = second_leads ? second : first;
    OP& joining = second_leads ? first : second;
    SettleGroup(joining);
    if (leader.group_ == nullptr) {
        leader.group_ = std::make_unique<OP::Group>();
    }
    std::vector<OP*>& followers = leader.group_->followers;
    const std::size_t joined = followers.size();
    followers.push_back(&joining);
    if (joining.group_ != nullptr) {
        followers.insert(followers.end(), joining.group_->followers.begin(),
                         joining.group_->followers.end());
        joining.group_.reset();
    }
    for (std::size_t i = joined; i < followers.size(); ++i) {
        followers[i]->link_ = &leader;
        followers[i]->follows_ = true;
    }
    return leader;
}

void LiveOps::SettleGroup(OP& leader) {
    if (leader.group_ == nullptr) {
        return;
    }
    OP::Group& group = *leader.group_;
    for (std::size_t i = 0; i < group.followers.size(); ++i) {
        OP& follower = *group.followers[i];
        if (follower.op != leader.op) {
            SetKind(follower, leader.op);
        }
        if (leader.op == OP_UPDATE_CFG && i < group.merged) {
            Json::Value switched_on;
            for (std::size_t k = 0; k < group.granted.size(); ++k) {
                switched_on[kContentClasses[k]] = i < group.granted[k];
            }
            follower.MergeData(switched_on);
        }
    }
    group.merged = 0;
    group.granted = {};
}

}  // namespace quivra::fileindex
