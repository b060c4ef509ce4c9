#include "programs/kestotifyd/watch_tree.h"

#include <algorithm>
#include <utility>

#include "base/path.h"

namespace kestotifyd {

const WatchNode& WatchNode::Root() const {
    const WatchNode* node = this;
    while (node->parent != nullptr) {
        node = node->parent;
    }
    return *node;
}

std::string WatchNode::Path() const {
    // Made anew for each event: a path kept in each node would have to be renewed in every node
    // below when a directory is renamed.
    std::vector<const WatchNode*> chain;
    for (const WatchNode* node = this; node != nullptr; node = node->parent) {
        chain.push_back(node);
    }
    std::string path = chain.back()->name;
    for (auto it = chain.rbegin() + 1; it != chain.rend(); ++it) {
        if (path.back() != '/') {
            path += '/';
        }
        path += (*it)->name;
    }
    return path;
}

std::string WatchNode::PathOf(const std::string& entry) const {
    return quivra::base::Join(Path(), entry);
}

WatchNode* WatchNode::Child(const std::string& entry) const {
    const auto it = children.find(entry);
    return it == children.end() ? nullptr : it->second.get();
}

WatchNode* WatchTree::AddRoot(const std::string& path, int wd) {
    auto node = std::make_unique<WatchNode>();
    node->name = path;
    WatchNode* const added = node.get();
    roots_[path] = std::move(node);
    Register(*added, wd);
    return added;
}

/// The map's keys view the names that the nodes own, so a name never changes while it is a key.
WatchNode* WatchTree::AddChild(WatchNode& parent, const std::string& entry, int wd) {
    auto node = std::make_unique<WatchNode>();
    node->parent = &parent;
    node->name = entry;
    WatchNode* const added = node.get();
    parent.children.emplace(added->name, std::move(node));
    Register(*added, wd);
    return added;
}

void WatchTree::Register(WatchNode& node, int wd) {
    node.wd = wd;
    watch_count_ += by_wd_.contains(wd) ? 0 : 1;
    by_wd_.emplace(wd, &node);
}

/// A watch goes only with its last node: the kernel has one for all ways to a directory.
void WatchTree::Unregister(WatchNode& subtree, std::vector<int>& unused) {
    std::vector<WatchNode*> pending{&subtree};
    while (!pending.empty()) {
        WatchNode* const node = pending.back();
        pending.pop_back();
        for (const auto& [name, child] : node->children) {
            pending.push_back(child.get());
        }
        const auto [begin, end] = by_wd_.equal_range(node->wd);
        by_wd_.erase(
            std::find_if(begin, end, [&](const auto& entry) { return entry.second == node; }));
        if (!by_wd_.contains(node->wd)) {
            unused.push_back(node->wd);
            --watch_count_;
        }
    }
}

std::vector<int> WatchTree::Remove(WatchNode& node) {
    std::vector<int> unused;
    Unregister(node, unused);
    if (node.parent != nullptr) {
        node.parent->children.erase(node.name);
    } else {
        roots_.erase(std::string(node.name));
    }
    return unused;
}

/// Not all that this frees lies below the new place's old node when the tree is behind the disk: it
/// may be where the moved node came from. So the node is taken out first.
std::vector<int> WatchTree::Move(WatchNode& node, WatchNode& new_parent,
                                 const std::string& new_entry) {
    std::vector<int> unused;
    WatchNode* const replaced = new_parent.Child(new_entry);
    if (replaced == &node) {
        return unused;
    }
    for (const WatchNode* above = &new_parent; above != nullptr; above = above->parent) {
        if (above == &node) {
            return unused;  // below itself: no file system does that, a stale tree may ask for it
        }
    }
    auto moved = node.parent->children.extract(node.name);
    if (replaced != nullptr) {
        unused = Remove(*replaced);
    }
    node.name = new_entry;
    node.parent = &new_parent;
    new_parent.children.emplace(node.name, std::move(moved.mapped()));
    return unused;
}

WatchNode* WatchTree::FindRoot(const std::string& path) const {
    const auto it = roots_.find(path);
    return it == roots_.end() ? nullptr : it->second.get();
}

std::vector<std::string> WatchTree::RootPaths() const {
    std::vector<std::string> paths;
    for (const auto& [path, root] : roots_) {
        paths.push_back(path);
    }
    return paths;
}

std::vector<WatchNode*> WatchTree::Find(int wd) const {
    std::vector<WatchNode*> nodes;
    const auto [begin, end] = by_wd_.equal_range(wd);
    std::for_each(begin, end, [&](const auto& entry) { nodes.push_back(entry.second); });
    return nodes;
}

bool WatchTree::IsAlive(const NodeRef& ref) const {
    const auto [begin, end] = by_wd_.equal_range(ref.wd);
    return std::any_of(begin, end, [&](const auto& entry) { return entry.second == ref.node; });
}

std::size_t WatchTree::Count(const WatchNode& node) {
    std::size_t count = 0;
    std::vector<const WatchNode*> pending{&node};
    while (!pending.empty()) {  // no recursion: trees are as deep as a path is long
        const WatchNode* const next = pending.back();
        pending.pop_back();
        ++count;
        for (const auto& [name, child] : next->children) {
            pending.push_back(child.get());
        }
    }
    return count;
}

}  // namespace kestotifyd
