#include "programs/kestotifyd/handle_paths.h"

#include <utility>
#include <vector>

#include "programs/kestotifyd/queue_translator.h"

namespace kestotifyd {
namespace {

using Entries = std::vector<std::pair<std::string, std::string>>;

/// The (path, handle) pairs at and below the path.
Entries Below(const std::map<std::string, std::string>& by_path, const std::string& path) {
    Entries found;
    // Names that merely begin alike ("/a/b.txt") sort between "/a/b" and "/a/b/c".
    for (auto it = by_path.lower_bound(path);
         it != by_path.end() && it->first.compare(0, path.size(), path) == 0; ++it) {
        if (IsAtOrBelow(it->first, path)) {
            found.push_back(*it);
        }
    }
    return found;
}

}  // namespace

std::string HandlePaths::Find(const std::string& handle) const {
    const auto it = by_handle_.find(handle);
    return it == by_handle_.end() ? std::string() : it->second;
}

void HandlePaths::Set(const std::string& handle, const std::string& path) {
    const auto there = by_path_.find(path);
    if (there != by_path_.end()) {
        if (there->second == handle) {
            return;
        }
        by_handle_.erase(there->second);
        by_path_.erase(there);
    }
    Erase(handle);
    by_handle_[handle] = path;
    by_path_[path] = handle;
}

void HandlePaths::Erase(const std::string& handle) {
    const auto it = by_handle_.find(handle);
    if (it != by_handle_.end()) {
        by_path_.erase(it->second);
        by_handle_.erase(it);
    }
}

void HandlePaths::EraseBelow(const std::string& path) {
    for (const auto& [below, handle] : Below(by_path_, path)) {
        by_path_.erase(below);
        by_handle_.erase(handle);
    }
}

bool HandlePaths::Rename(const std::string& handle, const std::string& from,
                         const std::string& to) {
    const std::string known = Find(handle);
    const auto occupant = by_path_.find(from);
    const bool is_ahead = (!known.empty() && known != from) ||
                          (occupant != by_path_.end() && occupant->second != handle) ||
                          !Below(by_path_, to).empty();
    const Entries moved = Below(by_path_, from);
    EraseBelow(from);
    for (const auto& [path, moved_handle] : moved) {
        if (path != from) {
            Set(moved_handle, to + path.substr(from.size()));
        }
    }
    Set(handle, to);
    return is_ahead;
}

void HandlePaths::Clear() {
    by_handle_.clear();
    by_path_.clear();
}

}  // namespace kestotifyd
