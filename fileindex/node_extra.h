#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "fileindex/op.h"

namespace quivra::fileindex {

/// A hash table of positions in `children`, which stays the authority: the table takes in what was
/// appended to the vector since the last look-up. Open addressing, without deletion.
/// (std::unordered_map took 2.5 times as long.)
class ChildIndex {
  public:
    using Children = std::vector<std::shared_ptr<OPNode>>;

    std::shared_ptr<OPNode> Find(const Children& nodes, std::string_view wanted) {
        TakeIn(nodes);
        const std::uint32_t hash = Hash(wanted);
        for (std::size_t i = hash & mask_; slots_[i].count != 0; i = (i + 1) & mask_) {
            const std::shared_ptr<OPNode>& child = nodes[slots_[i].count - 1];
            if (slots_[i].hash == hash && child->name == wanted) {
                return child;
            }
        }
        return nullptr;
    }

    /// The child that Find will most likely look at, without a look at any child: for a look ahead.
    const OPNode* Guess(const Children& nodes, std::uint32_t hash) const {
        if (slots_.empty()) {
            return nullptr;
        }
        for (std::size_t i = hash & mask_; slots_[i].count != 0; i = (i + 1) & mask_) {
            if (slots_[i].hash == hash && slots_[i].count <= nodes.size()) {
                return nodes[slots_[i].count - 1].get();
            }
        }
        return nullptr;
    }

    static std::uint32_t Hash(std::string_view text) {
        return static_cast<std::uint32_t>(std::hash<std::string_view>()(text));
    }

  private:
    struct Slot {
        std::uint32_t hash = 0;
        std::uint32_t count = 0;  ///< the position plus one; 0 marks a free slot
    };

    void TakeIn(const Children& nodes) {
        if (nodes.size() < indexed_) {  // somebody removed children: start again
            *this = ChildIndex();
        }
        Reserve(nodes.size());
        for (; indexed_ < nodes.size(); ++indexed_) {
            Put({Hash(nodes[indexed_]->name), static_cast<std::uint32_t>(indexed_ + 1)});
        }
    }

    /// Keeps at least a quarter of the slots free, so that probing stays short and ends.
    void Reserve(std::size_t size) {
        if (size * 4 < slots_.size() * 3) {
            return;
        }
        std::size_t capacity = std::max<std::size_t>(slots_.size(), kMinCapacity);
        while (size * 4 >= capacity * 3) {
            capacity *= 2;
        }
        const std::vector<Slot> old_slots = std::exchange(slots_, std::vector<Slot>(capacity));
        mask_ = capacity - 1;
        for (const Slot& slot : old_slots) {
            if (slot.count != 0) {
                Put(slot);
            }
        }
    }

    void Put(Slot slot) {
        std::size_t i = slot.hash & mask_;
        while (slots_[i].count != 0) {
            i = (i + 1) & mask_;
        }
        slots_[i] = slot;
    }

    static constexpr std::size_t kMinCapacity = 16;

    std::vector<Slot> slots_;
    std::size_t mask_ = 0;
    std::size_t indexed_ = 0;
};

/// What a directory's node has beside its public fields. Files, which are most of the nodes, do
/// without: a million of them are to stay small.
struct OPNode::Extra {
    ChildIndex index;
    std::vector<OPNode*> pending[3];  ///< children, by behaviour: see PendingBelow
    /// Ops that come before `ops`, the last one first: see OPTree::TakeOverOps.
    std::vector<std::shared_ptr<OP>> earlier;
};

}  // namespace quivra::fileindex
