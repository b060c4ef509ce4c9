#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "common/export.h"
#include "fileindex/event.h"
#include "fileindex/op.h"

namespace quivra::fileindex {

enum class Incoming;
class SubtreeMove;
class QueueReader;
struct QueueLine;

/// Folds the events of one queue file into the shortest list of operations that brings the index
/// up to date: a file that was created and modified twice is indexed once, a directory that is
/// indexed again makes what is pending below it pointless, pending work follows a rename.
///
/// A tree lives for one pass: it is built, processed once and dropped. Dropping it frees all its
/// nodes and ops, except ops that somebody kept (and their nodes up to the root, so that the path
/// is still known). It takes no lock, reads the file only while it is built, and is not safe for
/// concurrent use.
class QUIVRA_EXPORT OPTree {
  public:
    /// Reads the queue file as BuildTree does.
    explicit OPTree(const std::string& queue_path);
    ~OPTree();
    OPTree(const OPTree&) = delete;  // nodes and ops are known by their identity
    OPTree& operator=(const OPTree&) = delete;

    /// Inserts every line of the queue file. A bad line is logged and skipped. Throws Error 502
    /// when the file cannot be opened or read.
    void BuildTree();

    /// Inserts one event, which is not kept. Throws Error 9999 when its path, or the old path of a
    /// rename, is not a canonical absolute path; a crash marker counts all the same.
    void InsertEvent(const std::shared_ptr<Event>& event);

    /// The node of a full path, created with its ancestors. Throws Error 9999 unless the path has
    /// one leading "/", no doubled and no trailing one.
    std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

    /// Coalesce one incoming op with the ops that are pending on the node and, unless it was
    /// dropped on the way, attach it. The op's kind is set by the handler. Several handlers may
    /// take the same op in turn: it never coalesces with itself and is attached once.
    void HandleCreate(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    void HandleModify(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    void HandleDelete(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    void HandleAttr(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    void HandleUpdateCfg(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    /// Also cancels everything but renames below the node.
    void HandleReindex(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);
    /// Moves what is pending at and below the op's old path to the node's. Throws Error 9999, and
    /// changes nothing, when the old path is not a canonical absolute path.
    void HandleRename(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op);

    /// Hands every surviving op to `fn`, in the order in which they were first queued.
    ///
    /// What the folding leaves to the consumer, so that the index ends like the disk:
    /// - Ops other than deletes and renames stand at the path that is valid after all renames, also
    ///   where they come before one. Carry out deletes and renames first, in order, then the rest.
    /// - A delete looks at the disk again: a directory of the same name may have been made since,
    ///   and been renamed, so that it is to be found at the place where those renames took it.
    /// - The new place of a rename is compared with the disk when the old place is not in the
    ///   index, when another rename of the pass overlaps with it (a to b, b to c reads as a to c, b
    ///   to c), or when a reindex covers the old place (it has taken earlier deletes along).
    /// After a queue crash `fn` gets one OP_REINDEX_ALL on the root instead. Returns how many ops
    /// the queue gave, those dropped on the way included (1 after a crash). What `fn` throws passes
    /// through.
    int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn);

    /// Calls `fn` for every node of the subtree as it is at the start of the call, parents before
    /// children, children in the order of their creation; `fn` may change the tree.
    void TraverseNodeDescendant(const std::shared_ptr<OPNode>& node,
                                const std::function<void(std::shared_ptr<OPNode>)>& fn,
                                bool skip_self);

    bool crashed = false;                  ///< the queue lost events
    std::string queue_path;                ///< the file that the tree was built from
    std::shared_ptr<OPNode> root;          ///< has the empty name and no parent
    std::vector<std::shared_ptr<OP>> ops;  ///< every op ever attached, in that order

  private:
    using NodePtr = std::shared_ptr<OPNode>;
    using OPPtr = std::shared_ptr<OP>;
    struct Empty {};
    struct PathHash : std::hash<std::string_view> {
        using is_transparent = void;
    };
    OPTree(Empty, const std::string& queue_path);

    /// Reads some lines ahead of their insertion. False at the end of the queue.
    bool ReadAhead(QueueReader& reader, std::vector<QueueLine>& lines);
    void FinishBuilding();
    void Insert(QueueLine& line);
    void Insert(const Event& event);
    void Dispatch(const Event& event, const NodePtr& node, const OPPtr& op);
    /// The node of a directory that was looked up lately, else null.
    const NodePtr* FindDirectory(std::string_view path);
    void RememberDirectory(std::string_view path, NodePtr node);
    void LookAhead(const std::vector<QueueLine>& lines);
    /// The op of the last event once more, when no list took it: most events of a busy file add
    /// none.
    OPPtr NewOP(const NodePtr& node);

    /// Makes the op one of that kind, or OP_NONE when a pending op covers it, and attaches it.
    void Fold(const NodePtr& node, const OPPtr& op, FileIndexOP kind, Incoming incoming);
    void Reindex(const NodePtr& node, const OPPtr& op);
    void Rename(const NodePtr& node, const OPPtr& op, const NodePtr& old_node);
    void Attach(const NodePtr& node, const OPPtr& op);
    /// The event's op can coalesce from now on.
    void Finish(const NodePtr& node, const OPPtr& op);
    static void MarkPending(OPNode& node);
    void MoveAllOPs(OPNode& from, const NodePtr& to);
    void MoveOPsBelow(const NodePtr& old_top, const NodePtr& new_top, const OP& rename);
    /// Whether there was something to move.
    bool MoveOPs(SubtreeMove& move, const OP* rename);
    static std::vector<OPPtr> DetachMoving(OPNode& node, const OP* rename);
    void AttachMoved(std::vector<OPPtr>& moved, OPNode& from, OPNode& to);
    static void Consolidate(OPNode& node);

    /// What the last renames have moved below a directory, and nothing has come near since. When
    /// it is renamed again to where all these nodes exist, only `place` changes: a directory that
    /// goes to and fro over a million pending files must not move a million ops each time.
    struct Load {
        OPNode* stored;              ///< the ops are below here,
        OPNode* place;               ///< but belong below here;
        std::vector<OPNode*> homes;  ///< and they have been below these
    };
    bool MoveLoad(const OPNode& from, OPNode& to);
    /// Whether the rename of a directory can have anything to move below it.
    bool HasMovingBelow(const OPNode& top) const;
    std::vector<OPNode*> HomesOfLoad(const OPNode& place) const;
    void AddLoad(OPNode& place, std::vector<OPNode*> homes);
    /// Forget the loads in which the node lies; the loads that it is part of, or that lie in it.
    void ForgetLoadsAbove(const OPNode& node);
    void ForgetLoadsNear(const OPNode& node);
    template <typename Touched>
    void ForgetLoads(const Touched& touched);
    void SettleLoads();

    /// Brings the public fields up to date that a cheap step has left behind.
    void Settle();
    void SetStale(OPNode& node);
    /// Learns anew what is pending, from the public fields: they may have been changed.
    static void TakeStock(OPNode& node, const OP& incoming_op);
    void TakeStockBelow(const NodePtr& top, const OP& incoming_op);

    std::size_t consumed_ = 0;
    OPPtr unused_op_;
    bool building_ = false;       ///< nobody can look at the fields before the last line is in
    std::vector<Load> loads_;     ///< few, the oldest first; none when somebody can look
    NodePtr limbo_;               ///< below it loads wait while they change places
    std::vector<OPNode*> stale_;  ///< what Settle has to do
    /// Directories that were looked up lately: queues name many files of few of them.
    std::unordered_map<std::string, NodePtr, PathHash, std::equal_to<>> directories_;
    const std::pair<const std::string, NodePtr>* last_directory_ = nullptr;
};

}  // namespace quivra::fileindex
