#pragma once

#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace kestotifyd {

/// A watched directory. Nodes know their parent and their own name only, so that a moved directory
/// is one relinked node, and every later event below it comes out with the new path.
struct WatchNode {
    WatchNode* parent = nullptr;  ///< null for a root
    std::string name;             ///< a root's is its full path
    int wd = -1;                  ///< the kernel's watch descriptor
    std::map<std::string_view, std::unique_ptr<WatchNode>> children;  ///< keys view the names

    const WatchNode& Root() const;
    std::string Path() const;
    std::string PathOf(const std::string& entry) const;  ///< of an entry of this directory
    WatchNode* Child(const std::string& entry) const;
};

/// A node that may be gone by the time it is looked at: keep this instead of a pointer over
/// whatever removes or moves nodes, which may be any event and any scan.
struct NodeRef {
    WatchNode* node;
    int wd;
};

/// The watched directories of one inotify instance, by place and by watch descriptor. One watch can
/// stand for several nodes, because the kernel has one watch per directory however many ways (bind
/// mounts, overlapping roots) lead to it. Pure bookkeeping: no system calls.
class WatchTree {
  public:
    WatchNode* AddRoot(const std::string& path, int wd);
    /// The entry must not be a child yet.
    WatchNode* AddChild(WatchNode& parent, const std::string& entry, int wd);

    /// Drops the node with everything below it. Returns the watches that no node needs any more.
    std::vector<int> Remove(WatchNode& node);

    /// Relinks a node that is no root, and drops what was at the new place, as Remove does.
    std::vector<int> Move(WatchNode& node, WatchNode& new_parent, const std::string& new_entry);

    WatchNode* FindRoot(const std::string& path) const;
    std::vector<std::string> RootPaths() const;
    std::vector<WatchNode*> Find(int wd) const;
    bool IsAlive(const NodeRef& ref) const;
    std::size_t WatchCount() const { return watch_count_; }

    /// How many directories are watched at and below the node.
    static std::size_t Count(const WatchNode& node);

  private:
    void Register(WatchNode& node, int wd);
    void Unregister(WatchNode& subtree, std::vector<int>& unused);

    std::map<std::string, std::unique_ptr<WatchNode>> roots_;
    std::unordered_multimap<int, WatchNode*> by_wd_;
    std::size_t watch_count_ = 0;
};

}  // namespace kestotifyd
