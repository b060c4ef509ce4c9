#pragma once

#include <json/json.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"

namespace quivra::fileindex {

/// What is to be done with a path. The values are shown to users and compared by consumers.
enum FileIndexOP : int {
    OP_NONE = 0,         ///< cancelled; never handed to a consumer
    OP_DELETE = 1,       ///< remove the object's documents
    OP_UPSERT = 2,       ///< index the file (again)
    OP_ATTR = 3,         ///< refresh attributes and permissions only
    OP_UPDATE_CFG = 4,   ///< the settings of the path changed: `data` holds them
    OP_RENAME = 5,       ///< move the documents from `path` to the node's path
    OP_REINDEX = 6,      ///< index the node's path and everything below it again
    OP_REINDEX_ALL = 7,  ///< the queue lost events: index the whole share again (root node)
};

struct OPNode;
class OPTree;

/// One pending operation. Its target is the path of its node.
struct QUIVRA_EXPORT OP {
    OP(std::shared_ptr<OPNode> node, FileIndexOP op, std::string path, Json::Value data);
    OP(const OP&) = delete;  // an op is known by its identity: it sits in two lists
    OP& operator=(const OP&) = delete;
    ~OP();

    /// Merges newer settings into this op's: each of "document", "audio", "video" and "photo"
    /// becomes true if it is true on either side, else false. Once switched on within one batch, a
    /// class of content stays on. Other members stay; data that is no object becomes one.
    void MergeData(const Json::Value& data);

    std::shared_ptr<OPNode> node;
    FileIndexOP op;
    std::string path;  ///< of OP_RENAME, the old full path; else empty
    Json::Value data;  ///< of OP_UPDATE_CFG, the settings; else null

  private:
    friend class OPTree;
    friend class LiveOps;
    struct Group;
    std::unique_ptr<Group> group_;  ///< of a leader (see LiveOps), its followers
    OP* link_ = nullptr;            ///< of a leader, the node's next one; of a follower, its leader
    bool follows_ = false;
    bool attached_ = false;  ///< it is on the lists of a tree and of a node
    bool counted_ = false;   ///< it is part of the tree's count of consumed ops
};

/// One component of a path, with the ops pending on that path. Made by std::make_shared only.
///
/// Parents own their children and children their parent, so that a kept op answers for its path
/// however long it is kept. The tree breaks these cycles when it is dropped; nodes that were made
/// without a tree are freed once their maker clears `children` and `ops`.
///
/// Not safe for concurrent use.
struct QUIVRA_EXPORT OPNode : std::enable_shared_from_this<OPNode> {
    OPNode(std::shared_ptr<OPNode> parent, std::string_view name);
    ~OPNode();
    OPNode(const OPNode&) = delete;
    OPNode& operator=(const OPNode&) = delete;

    /// The child of that name (compared byte by byte), created when there is none. Takes constant
    /// time in a directory of any size.
    std::shared_ptr<OPNode> GetChild(std::string_view name);

    /// The full path: the names from the root down, joined by "/". Empty for a tree's root.
    std::string GetPath() const;

    /// Calls `fn` once for each op that is on the node at the start of the call; `fn` may change
    /// the node's list.
    void TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn) const;

    std::string name;                               ///< empty for the root
    std::shared_ptr<OPNode> parent;                 ///< null for the root
    std::vector<std::shared_ptr<OPNode>> children;  ///< in the order of their creation
    std::vector<std::shared_ptr<OP>> ops;           ///< in the order in which they were attached

  private:
    friend class OPTree;
    friend class LiveOps;
    friend class PendingBelow;
    struct Extra;
    Extra& NeedExtra();
    /// Most likely the child of that name, or null; touches no child.
    const OPNode* GuessChild(std::string_view name) const;
    std::unique_ptr<Extra> extra_;  ///< what most nodes, the files, do without
    OP* live_ = nullptr;            ///< the ops that can still change: see LiveOps
    std::uint32_t position_ = 0;    ///< among the parent's children
    std::uint32_t dead_ = 0;        ///< so many leading `ops` are cancelled for good
    std::uint8_t listed_ = 0;       ///< on which lists of its parent it is: see PendingBelow
    bool stale_ = false;            ///< its public fields wait for OPTree::Settle
};

/// "Node[NAME]: " and a line end; then each of its ops on a line of its own, indented by two.
QUIVRA_EXPORT std::ostream& operator<<(std::ostream& out, const std::shared_ptr<OPNode>& node);

/// "[05] /old -> /new", "[04] /path, data={...}", or "[02] /path" for the other kinds.
QUIVRA_EXPORT std::ostream& operator<<(std::ostream& out, const std::shared_ptr<OP>& op);

}  // namespace quivra::fileindex
