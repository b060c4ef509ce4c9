#include <gtest/gtest.h>

#include <algorithm>
#include <iostream>
#include <map>
#include <random>
#include <set>

#include "common/util.h"
#include "fileindex/optree.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

/// What is at each path: 0 for a directory, else the version of a file's content. A disk as well as
/// an index.
using Tree = std::map<std::string, int>;

bool HasBelow(const Tree& tree, const std::string& path) {
    const auto next = tree.upper_bound(path + "/");
    return next != tree.end() && IsPathWithin(next->first, path);
}

void Drop(Tree& tree, const std::string& path) {
    std::erase_if(tree, [&](const auto& entry) { return IsPathWithin(entry.first, path); });
}

void Move(Tree& tree, const std::string& from, const std::string& to) {
    Tree moved;
    for (const auto& [path, version] : tree) {
        if (IsPathWithin(path, from)) {
            moved[to + path.substr(from.size())] = version;
        }
    }
    Drop(tree, from);
    Drop(tree, to);
    tree.merge(moved);
}

/// A disk on which random things happen, each reported as a monitor reports it.
class Disk {
  public:
    explicit Disk(unsigned int seed) : random_(seed) {}

    void Change(std::vector<std::string>& lines) {
        const std::string path = RandomPath();
        const bool exists = entries.contains(path);
        const bool is_dir = exists && entries[path] == 0;
        if (!IsDirectory(Dirname(path))) {
            return;
        }
        switch (random_() % 6) {
            case 0:
            case 1:
                if (!is_dir) {
                    entries[path] = ++version_;
                    lines.push_back(Line(exists ? EVENT_MODIFY : EVENT_CREATE, path));
                    return;
                }
                return;
            case 2:
                if (!exists) {
                    entries[path] = 0;
                    lines.push_back(Line(EVENT_CREATE, path, "", true));
                }
                return;
            case 3:
                return Remove(path, lines);
            case 4:
                if (exists) {
                    lines.push_back(Line(EVENT_ATTR, path, "", is_dir));
                }
                return;
            default:
                return Rename(path, RandomPath(), lines);
        }
    }

    Tree entries;

  private:
    std::string RandomPath() {
        std::string path;
        for (std::size_t depth = 1 + random_() % 3; depth > 0; --depth) {
            path += std::string("/") + static_cast<char>('a' + random_() % 3);
        }
        return path;
    }

    bool IsDirectory(const std::string& path) const {
        const auto found = entries.find(path);
        return path.empty() || (found != entries.end() && found->second == 0);
    }

    void Remove(const std::string& path, std::vector<std::string>& lines) {
        while (entries.contains(path)) {
            auto last = entries.find(path);
            for (auto it = entries.begin(); it != entries.end(); ++it) {
                last = IsPathWithin(it->first, last->first) ? it : last;
            }
            lines.push_back(Line(EVENT_DELETE, last->first, "", last->second == 0));
            entries.erase(last);
        }
    }

    /// As rename(2) allows it: a file over a file, a directory over nothing or an empty one.
    void Rename(const std::string& to, const std::string& from, std::vector<std::string>& lines) {
        if (!entries.contains(from) || !IsDirectory(Dirname(to)) || IsPathWithin(to, from) ||
            HasBelow(entries, to)) {
            return;
        }
        const bool is_dir = entries[from] == 0;
        if (entries.contains(to) && (entries[to] == 0) != is_dir) {
            return;
        }
        Move(entries, from, to);
        lines.push_back(Line(EVENT_RENAME, to, from, is_dir));
    }

    std::mt19937 random_;
    int version_ = 0;
};

/// A consumer of ops, which brings an index up to date with the disk as it is now. Deletes and
/// renames are carried out first: the other ops stand at the paths that are valid after them.
class Consumer {
  public:
    Consumer(Tree& index, const Tree& disk) : index_(index), disk_(disk) {}

    void Run(OPTree& tree) {
        tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
            if (op->op == OP_REINDEX) {
                covered_.insert(op->node->GetPath());
            }
        });
        tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
            if (op->op == OP_RENAME) {
                Rename(op->path, op->node->GetPath());
            } else if (op->op == OP_DELETE) {
                Drop(index_, op->node->GetPath());
                // A directory may have taken the place of a file, and been renamed since.
                doubtful_.insert(op->node->GetPath());
            }
        });
        tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
            const std::string path = op->node->GetPath();
            if (op->op != OP_RENAME && !(op->op == OP_ATTR && index_.contains(path))) {
                Settle(path);
            }
        });
        for (const std::string& path : doubtful_) {
            Settle(path);
        }
    }

  private:
    void Settle(const std::string& top) {
        Drop(index_, top);
        for (const auto& [path, version] : disk_) {
            if (IsPathWithin(path, top)) {
                index_[path] = version;
            }
        }
    }

    static bool Overlap(const std::string& a, const std::string& b) {
        return IsPathWithin(a, b) || IsPathWithin(b, a);
    }

    void Rename(const std::string& from, const std::string& to) {
        const auto covers = [&](const std::string& path) { return IsPathWithin(from, path); };
        // A reindex of the old place has taken deletes along that came before the rename.
        bool doubtful =
            !index_.contains(from) || std::any_of(covered_.begin(), covered_.end(), covers);
        for (const auto& [earlier_from, earlier_to] : renames_) {
            if (Overlap(earlier_from, from) || Overlap(earlier_from, to) ||
                Overlap(earlier_to, from) || Overlap(earlier_to, to)) {
                doubtful_.insert({earlier_from, earlier_to});
                doubtful = true;
            }
        }
        if (doubtful) {
            doubtful_.insert({from, to});
        }
        for (const std::string& path : std::set<std::string>(doubtful_)) {
            if (IsPathWithin(path, from)) {
                doubtful_.insert(to + path.substr(from.size()));
            }
        }
        if (index_.contains(from)) {
            Move(index_, from, to);
        }
        renames_.emplace_back(from, to);
    }

    Tree& index_;
    const Tree& disk_;
    std::set<std::string> covered_;
    std::vector<std::pair<std::string, std::string>> renames_;
    std::set<std::string> doubtful_;
};

TEST(OPTreeSemanticsTest, FoldedOpsBringTheIndexToTheDisk) {
    const unsigned int seed = Seed();
    for (unsigned int run = 0; run < kRandomRuns; ++run) {
        Disk disk(seed + run);
        std::vector<std::string> lines;
        for (int i = 0; i < 40; ++i) {
            disk.Change(lines);
        }
        const Tree before = disk.entries;
        Tree index = before;
        lines.clear();
        for (unsigned int i = 0; i < 2 + run % 24; ++i) {
            disk.Change(lines);
        }
        const auto tree = TreeOf(lines);
        Consumer(index, disk.entries).Run(*tree);
        if (index != disk.entries) {
            for (const auto& [path, version] : before) {
                std::cout << "before: " << path << " " << version << "\n";
            }
            for (const std::string& line : lines) {
                std::cout << line << "\n";
            }
            FAIL() << "index " << testing::PrintToString(index) << "\ndisk "
                   << testing::PrintToString(disk.entries)
                   << "\nops: " << testing::PrintToString(Surviving(*tree));
        }
    }
}

}  // namespace
}  // namespace quivra::fileindex
