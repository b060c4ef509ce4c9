#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "programs/sqlite/statement.h"

namespace elasticd::engine::sqlite {

struct Node {
    std::int64_t id = 0;
    bool has_document = false;
    bool has_children = false;  ///< or had some
};

/// Ids as paths in a tree of rows: "/v/s/a" is "a" in "s" in "v" in "" in the root. Every text is a
/// path, "//" and "no slash" too, and every path is one text. Used by one thread.
class Tree {
  public:
    static constexpr std::int64_t kRoot = 0;
    using Position = std::pair<std::int64_t, std::string>;  ///< (parent, name)

    explicit Tree(::sqlite::Database& database);

    std::optional<Node> Find(std::string_view path);
    std::optional<Node> FindChild(std::int64_t parent, std::string_view name);
    /// Where the node is. Throws Damaged when there is no such node.
    Position PositionOf(std::int64_t id);
    std::string PathOf(std::int64_t id);
    /// Whether the node lies below `top`.
    bool IsBelow(std::int64_t id, std::int64_t top);

    /// Calls `take` (bool(std::string_view name, const Node&)) for the children whose names are at
    /// or after `from`, in order of their bytes, until it returns false.
    template <typename Take>
    void ForEachChild(std::int64_t parent, std::string_view from, Take&& take) {
        ::sqlite::Statement children(database_, kChildren);
        children.Bind(1, parent).BindBlob(2, from);
        while (children.Step() &&
               take(children.Bytes(0), MakeNode(children.Int(1), children.Int(2)))) {
        }
    }
    /// Calls `take` (void(std::int64_t id)) for every document below the node.
    template <typename Take>
    void ForEachBelow(std::int64_t top, Take&& take) {
        std::vector<std::int64_t> open{top};
        while (!open.empty()) {
            const std::int64_t parent = open.back();
            open.pop_back();
            ::sqlite::ResetAtEnd reset(children_);
            children_.Bind(1, parent).BindBlob(2, {});
            while (children_.Step()) {
                const Node node = MakeNode(children_.Int(1), children_.Int(2));
                if (node.has_document) {
                    take(node.id);
                }
                if (node.has_children) {
                    open.push_back(node.id);
                }
            }
        }
    }

    // Changes.
    /// Makes sure that there is a node with a document. What it was before (its id, whether it had
    /// a document) is returned.
    Node PlaceDocument(std::string_view path);
    void SetHasDocument(std::int64_t id, bool has_document);
    /// Removes the node and then those above it, as long as they hold neither document nor
    /// children.
    void RemoveEmpty(std::int64_t id);
    /// Puts the node, with everything below it, to a place that is free; makes the directories
    /// above it.
    void Move(std::int64_t id, std::string_view new_path);
    /// The same within the tree: to a known parent.
    void MoveTo(std::int64_t id, std::int64_t parent, std::string_view name);
    /// Forgets what was remembered of the tree: after a change that is not its own.
    void Forget();

  private:
    static constexpr char kChildren[] =
        "SELECT name, id, flags FROM nodes WHERE parent=? AND name>=? ORDER BY name";
    static Node MakeNode(std::int64_t id, std::int64_t flags);
    std::int64_t DirectoryOf(std::string_view path, bool make);
    std::int64_t MakeChild(std::int64_t parent, std::string_view name, std::int64_t flags);
    void MarkParent(std::int64_t id);
    const std::string& DirectoryPath(std::int64_t id);

    ::sqlite::Database& database_;
    ::sqlite::Statement find_;
    ::sqlite::Statement by_id_;
    ::sqlite::Statement children_;
    ::sqlite::Statement insert_;
    ::sqlite::Statement mark_parent_;
    std::int64_t next_id_ = 0;     ///< 0: not known yet
    std::int64_t marked_ = kRoot;  ///< the last node that was marked as a parent
    /// Directories met lately, both ways. What does not fit is forgotten as a whole.
    std::unordered_map<std::string, std::int64_t> ids_;
    std::unordered_map<std::int64_t, std::string> paths_;
};

}  // namespace elasticd::engine::sqlite
