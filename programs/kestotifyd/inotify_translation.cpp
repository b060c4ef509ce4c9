#include "programs/kestotifyd/inotify_translation.h"

#include <sys/inotify.h>

#include <algorithm>
#include <optional>
#include <utility>

namespace kestotifyd {
namespace {

using Kind = Change::Kind;

class Translation {
  public:
    Translation(WatchTree& tree, InotifyOutcome& outcome) : tree_(tree), outcome_(outcome) {}

    void Handle(const MovePairing::Paired& paired) {
        const InotifyEvent& event = paired.event;
        if ((event.mask & IN_Q_OVERFLOW) != 0) {
            outcome_.is_overflow = true;
        } else if (paired.moved_to) {
            HandleMove(event, *paired.moved_to);
        } else if (event.name.empty()) {
            HandleSelf(event);
        } else {
            for (WatchNode* const node : tree_.Find(event.wd)) {
                // What was done for one node may have dropped another one.
                if (tree_.IsAlive({node, event.wd})) {
                    HandleEntry(*node, event);
                }
            }
        }
    }

  private:
    void HandleEntry(WatchNode& node, const InotifyEvent& event) {
        const bool is_dir = (event.mask & IN_ISDIR) != 0;
        if ((event.mask & (IN_CREATE | IN_MOVED_TO)) != 0) {
            Create(node, event.name, is_dir);
        } else if ((event.mask & (IN_DELETE | IN_MOVED_FROM)) != 0) {
            Delete(node, event.name, is_dir);
        } else if ((event.mask & IN_ATTRIB) != 0) {
            Report(Kind::kAttributes, is_dir, node.PathOf(event.name));
        } else if (!is_dir && (event.mask & IN_CLOSE_WRITE) != 0) {
            Report(Kind::kClosed, false, node.PathOf(event.name));
        } else if (!is_dir && (event.mask & IN_MODIFY) != 0) {
            Report(Kind::kWritten, false, node.PathOf(event.name));
        }
    }

    void Create(WatchNode& node, const std::string& name, bool is_dir) {
        if (is_dir && node.Child(name) == nullptr) {
            outcome_.appeared.push_back({{&node, node.wd}, name});
        } else {
            // A directory that the scan of its parent has already found is watched.
            Report(Kind::kCreated, is_dir, node.PathOf(name));
        }
    }

    void Delete(WatchNode& node, const std::string& name, bool is_dir) {
        Report(Kind::kDeleted, is_dir, node.PathOf(name));
        WatchNode* const child = is_dir ? node.Child(name) : nullptr;
        if (child != nullptr) {
            Release(tree_.Remove(*child));
        }
    }

    /// A directory that is seen under several paths gives one event for all of them. The halves
    /// that lie below the same root belong together; what is left over came or went. Each step may
    /// drop nodes that a later one was meant for.
    void HandleMove(const InotifyEvent& from, const InotifyEvent& to) {
        std::vector<WatchNode*> sources = tree_.Find(from.wd);
        std::vector<WatchNode*> targets = tree_.Find(to.wd);
        const bool is_dir = (from.mask & IN_ISDIR) != 0;
        const auto drop_dead = [&] {
            std::erase_if(sources, [&](auto* node) { return !tree_.IsAlive({node, from.wd}); });
            std::erase_if(targets, [&](auto* node) { return !tree_.IsAlive({node, to.wd}); });
        };
        for (bool is_same_root : {true, false}) {
            for (auto pair = FindPair(sources, targets, is_same_root); pair;
                 pair = FindPair(sources, targets, is_same_root)) {
                const auto [source, target] = *pair;
                std::erase(sources, source);
                std::erase(targets, target);
                Rename(*source, from.name, *target, to.name, is_dir);
                drop_dead();
            }
        }
        for (WatchNode* const target : targets) {
            Create(*target, to.name, is_dir);
        }
        while (!sources.empty()) {
            WatchNode* const source = sources.back();
            sources.pop_back();
            Delete(*source, from.name, is_dir);
            drop_dead();
        }
    }

    using Pair = std::pair<WatchNode*, WatchNode*>;
    static std::optional<Pair> FindPair(const std::vector<WatchNode*>& sources,
                                        const std::vector<WatchNode*>& targets, bool is_same_root) {
        for (WatchNode* const target : targets) {
            for (WatchNode* const source : sources) {
                if (!is_same_root || &source->Root() == &target->Root()) {
                    return Pair(source, target);
                }
            }
        }
        return std::nullopt;
    }

    /// Both places are looked at again: a directory at the old one was exchanged with this one, and
    /// moving the tree's node to and fro, as the two events of an exchange say, would leave one of
    /// the two without a watch.
    void Rename(WatchNode& from, const std::string& from_name, WatchNode& to,
                const std::string& to_name, bool is_dir) {
        outcome_.changes.push_back(
            {Kind::kRenamed, is_dir, to.PathOf(to_name), from.PathOf(from_name)});
        if (!is_dir) {
            return;
        }
        outcome_.appeared.push_back({{&to, to.wd}, to_name});
        outcome_.appeared.push_back({{&from, from.wd}, from_name});
        if (WatchNode* const child = from.Child(from_name)) {
            Release(tree_.Move(*child, to, to_name));
        }
    }

    /// The watched directory itself.
    void HandleSelf(const InotifyEvent& event) {
        if ((event.mask & (IN_UNMOUNT | IN_IGNORED | IN_DELETE_SELF)) != 0) {
            // One at a time: a removed node takes those below it along.
            for (auto nodes = tree_.Find(event.wd); !nodes.empty(); nodes = tree_.Find(event.wd)) {
                Forget(*nodes.front());
            }
            return;
        }
        for (WatchNode* const node : tree_.Find(event.wd)) {
            if (node->parent != nullptr) {
                continue;  // reported by its parent's watch, with a name
            }
            if ((event.mask & IN_MOVE_SELF) != 0) {
                outcome_.lost_roots.push_back(node->name);
            } else if ((event.mask & IN_ATTRIB) != 0) {
                Report(Kind::kAttributes, true, node->name);
            }
        }
    }

    void Forget(WatchNode& node) {
        if (node.parent == nullptr) {
            outcome_.lost_roots.push_back(node.name);
        }
        Release(tree_.Remove(node));
    }

    void Report(Kind kind, bool is_dir, std::string path) {
        outcome_.changes.push_back({kind, is_dir, std::move(path)});
    }

    void Release(const std::vector<int>& watches) {
        outcome_.unused_watches.insert(outcome_.unused_watches.end(), watches.begin(),
                                       watches.end());
    }

    WatchTree& tree_;
    InotifyOutcome& outcome_;
};

}  // namespace

InotifyOutcome TranslateInotify(const MovePairing::Paired& paired, WatchTree& tree) {
    InotifyOutcome outcome;
    Translation(tree, outcome).Handle(paired);
    return outcome;
}

}  // namespace kestotifyd
