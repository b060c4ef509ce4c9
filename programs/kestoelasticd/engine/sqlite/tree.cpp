#include "programs/kestoelasticd/engine/sqlite/tree.h"

#include "programs/kestoelasticd/engine/engine.h"

namespace elasticd::engine::sqlite {
namespace {

using ::sqlite::Database;
using ::sqlite::ResetAtEnd;
using ::sqlite::Statement;

/// Bits of `flags`; on disk.
constexpr std::int64_t kHasDocument = 1;
constexpr std::int64_t kHasChildren = 2;

constexpr std::size_t kMaxRemembered = 2048;
/// A damaged tree may hold a circle; no path has more components than this.
constexpr int kMaxDepth = 1 << 20;

/// (everything before the last "/", what follows it); no first part where there is no "/".
std::pair<std::optional<std::string_view>, std::string_view> SplitLast(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string_view::npos) {
        return {std::nullopt, path};
    }
    return {path.substr(0, slash), path.substr(slash + 1)};
}

}  // namespace

Tree::Tree(Database& database)
    : database_(database),
      find_(database, "SELECT id, flags FROM nodes WHERE parent=? AND name=?"),
      by_id_(database, "SELECT parent, name FROM nodes WHERE id=?"),
      children_(database, kChildren),
      insert_(database, "INSERT INTO nodes VALUES(?, ?, ?, ?)"),
      mark_parent_(database, "UPDATE nodes SET flags=flags|2 WHERE id=? AND flags&2=0") {}

Node Tree::MakeNode(std::int64_t id, std::int64_t flags) {
    if (id <= 0) {
        throw Damaged("a node of the index has the number " + std::to_string(id));
    }
    return {id, (flags & kHasDocument) != 0, (flags & kHasChildren) != 0};
}

std::optional<Node> Tree::FindChild(std::int64_t parent, std::string_view name) {
    ResetAtEnd reset(find_);
    if (!find_.Bind(1, parent).BindBlob(2, name).Step()) {
        return std::nullopt;
    }
    return MakeNode(find_.Int(0), find_.Int(1));
}

/// The node of a directory; -1 where it is missing and not to be made.
std::int64_t Tree::DirectoryOf(std::string_view path, bool make) {
    const auto remembered = ids_.find(std::string(path));
    if (remembered != ids_.end()) {
        return remembered->second;
    }
    std::int64_t id = kRoot;
    for (std::size_t begin = 0; begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string_view name = path.substr(begin, end - begin);
        if (const std::optional<Node> node = FindChild(id, name)) {
            id = node->id;
        } else if (make) {
            id = MakeChild(id, name, 0);
        } else {
            return -1;
        }
        begin = end + 1;
    }
    if (make) {  // one that was only looked for may be a file's, which goes without being forgotten
        if (ids_.size() >= kMaxRemembered) {
            ids_.clear();
        }
        ids_.emplace(path, id);
    }
    return id;
}

std::optional<Node> Tree::Find(std::string_view path) {
    const auto [directory, name] = SplitLast(path);
    const std::int64_t parent = directory ? DirectoryOf(*directory, false) : kRoot;
    return parent < 0 ? std::nullopt : FindChild(parent, name);
}

Node Tree::PlaceDocument(std::string_view path) {
    const auto [directory, name] = SplitLast(path);
    const std::int64_t parent = directory ? DirectoryOf(*directory, true) : kRoot;
    const std::optional<Node> node = FindChild(parent, name);
    if (!node) {
        return {MakeChild(parent, name, kHasDocument), false, false};
    }
    if (!node->has_document) {
        SetHasDocument(node->id, true);
    }
    return *node;
}

std::int64_t Tree::MakeChild(std::int64_t parent, std::string_view name, std::int64_t flags) {
    if (next_id_ == 0) {
        Statement last(database_, "SELECT max(id) FROM nodes");
        last.Step();
        next_id_ = last.Int(0) + 1;
    }
    const std::int64_t id = next_id_++;
    insert_.Bind(1, parent).BindBlob(2, name).Bind(3, id).Bind(4, flags).Run();
    MarkParent(parent);
    return id;
}

void Tree::MarkParent(std::int64_t id) {
    if (id != kRoot && id != marked_) {
        mark_parent_.Bind(1, id).Run();
        marked_ = id;
    }
}

void Tree::SetHasDocument(std::int64_t id, bool has_document) {
    Statement(database_, has_document ? "UPDATE nodes SET flags=flags|1 WHERE id=?"
                                      : "UPDATE nodes SET flags=flags&~1 WHERE id=?")
        .Bind(1, id)
        .Run();
}

Tree::Position Tree::PositionOf(std::int64_t id) {
    ResetAtEnd reset(by_id_);
    if (!by_id_.Bind(1, id).Step()) {
        throw Damaged("the index lacks the node " + std::to_string(id));
    }
    return {by_id_.Int(0), std::string(by_id_.Bytes(1))};
}

/// With the "/" at its end. Remembered, because the hits of a query share their directories.
const std::string& Tree::DirectoryPath(std::int64_t id) {
    static const std::string none;
    if (id == kRoot) {
        return none;
    }
    const auto found = paths_.find(id);
    if (found != paths_.end()) {
        return found->second;
    }
    std::string path;
    std::vector<std::string> names;
    std::int64_t at = id;
    for (int depth = 0; at != kRoot; ++depth) {
        if (depth > kMaxDepth) {
            throw Damaged("the index's tree has a circle");
        }
        Position position = PositionOf(at);
        names.push_back(std::move(position.second));
        at = position.first;
    }
    for (auto name = names.rbegin(); name != names.rend(); ++name) {
        path.append(*name).append("/");
    }
    if (paths_.size() >= kMaxRemembered) {
        paths_.clear();
    }
    return paths_.emplace(id, std::move(path)).first->second;
}

std::string Tree::PathOf(std::int64_t id) {
    const Position position = PositionOf(id);
    return DirectoryPath(position.first) + position.second;
}

bool Tree::IsBelow(std::int64_t id, std::int64_t top) {
    for (int depth = 0; id != kRoot && depth < kMaxDepth; ++depth) {
        id = PositionOf(id).first;
        if (id == top) {
            return true;
        }
    }
    return false;
}

void Tree::RemoveEmpty(std::int64_t id) {
    while (id > kRoot) {
        by_id_.Reset();
        if (!by_id_.Bind(1, id).Step()) {
            return;  // gone already
        }
        const std::int64_t parent = by_id_.Int(0);
        const std::string name(by_id_.Bytes(1));
        by_id_.Reset();
        const std::optional<Node> node = FindChild(parent, name);
        bool has_children = false;
        if (node && node->has_children) {
            ForEachChild(id, {}, [&](std::string_view, const Node&) {
                has_children = true;
                return false;
            });
        }
        if (!node || node->has_document || has_children) {
            return;
        }
        Statement(database_, "DELETE FROM nodes WHERE parent=? AND name=?")
            .Bind(1, parent)
            .BindBlob(2, name)
            .Run();
        if (node->has_children) {
            Forget();
        }
        id = parent;
    }
}

void Tree::Move(std::int64_t id, std::string_view new_path) {
    const std::int64_t old_parent = PositionOf(id).first;
    const auto [directory, name] = SplitLast(new_path);
    MoveTo(id, directory ? DirectoryOf(*directory, true) : kRoot, name);
    RemoveEmpty(old_parent);
}

void Tree::MoveTo(std::int64_t id, std::int64_t parent, std::string_view name) {
    Statement(database_, "UPDATE nodes SET parent=?, name=? WHERE id=?")
        .Bind(1, parent)
        .BindBlob(2, name)
        .Bind(3, id)
        .Run();
    MarkParent(parent);
    Forget();
}

void Tree::Forget() {
    ids_.clear();
    paths_.clear();
    next_id_ = 0;
    marked_ = kRoot;
}

}  // namespace elasticd::engine::sqlite
