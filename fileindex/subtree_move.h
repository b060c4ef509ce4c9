#pragma once

#include <cstddef>
#include <utility>
#include <vector>

#include "fileindex/op.h"

namespace quivra::fileindex {

inline bool IsAtOrBelow(const OPNode& node, const OPNode& top) {
    const OPNode* above = &node;
    while (above != nullptr && above != &top) {
        above = above->parent.get();
    }
    return above != nullptr;
}

/// Whether one of two nodes lies at or below the other.
inline bool IsRelated(const OPNode& left, const OPNode& right) {
    return IsAtOrBelow(left, right) || IsAtOrBelow(right, left);
}

/// A subtree, parents before children, and where its nodes' ops go.
class SubtreeMove {
  public:
    SubtreeMove(OPNode& from, OPNode& to) : places_{{&from, 0, &to}} {}

    void Add(OPNode& node, std::size_t parent) { places_.push_back({&node, parent, nullptr}); }
    std::size_t Size() const { return places_.size(); }
    OPNode& From(std::size_t i) const { return *places_[i].from; }

    /// Creates the node, and those above it, only when it is asked for: a copy of every node would
    /// let a few hostile renames of a directory into itself double the tree again and again.
    OPNode& To(std::size_t i) {
        std::vector<std::size_t> missing;  // no recursion: a path may be deep
        for (; places_[i].to == nullptr; i = places_[i].parent) {
            missing.push_back(i);
        }
        OPNode* to = places_[i].to;
        for (; !missing.empty(); missing.pop_back()) {
            to = to->GetChild(places_[missing.back()].from->name).get();
            places_[missing.back()].to = to;
        }
        return *to;
    }

  private:
    struct Place {
        OPNode* from;
        std::size_t parent;
        OPNode* to;
    };
    std::vector<Place> places_;
};

/// Adds what `children` returns for each node, at any depth.
template <typename Children>
void AddDescendants(SubtreeMove& move, const Children& children) {
    std::vector<std::pair<OPNode*, std::size_t>> pending;  // with the parent's place
    for (std::size_t parent = 0;; parent = move.Size() - 1) {
        const auto& nodes = children(move.From(parent));
        for (auto node = nodes.rbegin(); node != nodes.rend(); ++node) {
            pending.push_back({&**node, parent});
        }
        if (pending.empty()) {
            return;
        }
        move.Add(*pending.back().first, pending.back().second);
        pending.pop_back();
    }
}

}  // namespace quivra::fileindex
