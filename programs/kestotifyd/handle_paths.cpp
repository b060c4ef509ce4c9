#include "programs/kestotifyd/handle_paths.h"

#include <utility>
#include <vector>

#include "base/path.h"

namespace kestotifyd {
namespace {

using Entries = std::vector<std::pair<std::string, std::string>>;

/// The (path, handle) pairs at and below the path.
Entries Below(const std::map<std::string, std::string>& by_path, const std::string& path) {
    Entries found;
    const auto own = by_path.equal_range(path);
    found.assign(own.first, own.second);
    const auto below = quivra::base::Subtree(by_path, path);
    found.insert(found.end(), below.first, below.second);
    return found;
}

/// Both strings are kept twice.
std::size_t Cost(const std::string& handle, const std::string& path) {
    return 2 * (handle.size() + path.size() + 64);
}

}  // namespace

void HandlePaths::Insert(const std::string& handle, const std::string& path) {
    by_handle_[handle] = path;
    by_path_[path] = handle;
    size_ += Cost(handle, path);
}

std::string HandlePaths::Find(const std::string& handle) const {
    const auto it = by_handle_.find(handle);
    return it == by_handle_.end() ? std::string() : it->second;
}

void HandlePaths::Set(const std::string& handle, const std::string& path) {
    if (is_ahead_) {
        return;  // a place found on the disk now belongs to a later point of the stream
    }
    const auto there = by_path_.find(path);
    const auto known = by_handle_.find(handle);
    if (there == by_path_.end() && known == by_handle_.end()) {
        Insert(handle, path);
    } else if (there == by_path_.end() || there->second != handle) {
        BecomeAhead();
    }
}

void HandlePaths::Erase(const std::string& handle) {
    const auto it = by_handle_.find(handle);
    if (it != by_handle_.end()) {
        size_ -= Cost(handle, it->second);
        by_path_.erase(it->second);
        by_handle_.erase(it);
    }
}

void HandlePaths::EraseBelow(const std::string& path) {
    for (const auto& [below, handle] : Below(by_path_, path)) {
        Erase(handle);
    }
}

void HandlePaths::Rename(const std::string& handle, const std::string& from,
                         const std::string& to) {
    // The map stands at the event only when the object is where the event takes it from, nobody
    // else is there, and nothing is at or below the new place.
    const std::string known = Find(handle);
    const auto occupant = by_path_.find(from);
    if ((!known.empty() && known != from) ||
        (occupant != by_path_.end() && occupant->second != handle) ||
        !Below(by_path_, to).empty()) {
        BecomeAhead();
        return;
    }
    // Copied: the new places may lie between the old ones in the map's order.
    const Entries moved = Below(by_path_, from);
    EraseBelow(from);
    for (const auto& [path, moved_handle] : moved) {
        Set(moved_handle, to + path.substr(from.size()));
    }
    Set(handle, to);
}

/// Which of the known places are wrong cannot be told, so all are forgotten.
void HandlePaths::BecomeAhead() {
    Clear();
    is_ahead_ = true;
}

void HandlePaths::Settle() {
    is_ahead_ = false;
}

void HandlePaths::Clear() {
    by_handle_.clear();
    by_path_.clear();
    size_ = 0;
}

}  // namespace kestotifyd
