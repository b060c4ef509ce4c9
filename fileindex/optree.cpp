#include "fileindex/optree.h"

#include <algorithm>
#include <iterator>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/coalescing.h"
#include "fileindex/queue_reader.h"

namespace quivra::fileindex {
namespace {

/// How many directories a tree remembers, so that their paths take no noteworthy memory.
constexpr std::size_t kMaxRemembered = 4096;

using NodePtr = std::shared_ptr<OPNode>;
using OPPtr = std::shared_ptr<OP>;

/// The nodes of a subtree, parents before children, children in the order of their creation.
std::vector<NodePtr> Subtree(const NodePtr& top) {
    std::vector<NodePtr> nodes;
    std::vector<NodePtr> pending{top};
    while (!pending.empty()) {
        nodes.push_back(std::move(pending.back()));
        pending.pop_back();
        const auto& children = nodes.back()->children;
        pending.insert(pending.end(), children.rbegin(), children.rend());
    }
    return nodes;
}

bool IsCanonical(std::string_view path) {
    return path.size() > 1 && path.front() == '/' && path.back() != '/' &&
           path.find("//") == std::string_view::npos;
}

/// The work that a rename takes over from the object's old place, if any: the last one queued. It
/// is cancelled there.
FileIndexOP TakeOverWork(const OPNode& old_node) {
    FileIndexOP work = OP_NONE;
    for (const OPPtr& op : old_node.ops) {
        if (op->op == OP_UPSERT || op->op == OP_ATTR || op->op == OP_REINDEX) {
            work = std::exchange(op->op, OP_NONE);
        }
    }
    return work;
}

}  // namespace

OPTree::OPTree(Empty, const std::string& path)
    : queue_path(path), root(std::make_shared<OPNode>(nullptr, "")) {}

// The delegation makes the destructor run, and break the cycles, when building throws.
OPTree::OPTree(const std::string& path) : OPTree(Empty(), path) {
    BuildTree();
}

OPTree::~OPTree() {
    ops.clear();
    std::vector<NodePtr> pending{std::move(root)};
    while (!pending.empty()) {
        const NodePtr node = std::move(pending.back());
        pending.pop_back();
        std::move(node->children.begin(), node->children.end(), std::back_inserter(pending));
        node->children.clear();
        node->ops.clear();
    }
}

void OPTree::BuildTree() {
    QueueReader reader(queue_path);
    reader.RequireOpen({"optree", 190});
    std::string line;
    while (reader.ReadLine(line)) {
        if (log_level == kLogLevelDebug) {
            LogTrace({"optree", 194}, "Got event: %s", line.c_str());
        }
        try {
            Insert(Event(line));
        } catch (const Error& error) {
            LogError({"optree", 198}, "InsertEvent failed, event_raw=%s, code=%d, reason=%s",
                     line.c_str(), error.code, error.reason.c_str());
        }
    }
}

NodePtr OPTree::GetNodeByPath(const std::string& path) {
    const std::string_view whole = path;
    const std::size_t slash = whole.rfind('/');
    if (slash != std::string_view::npos && slash + 1 < whole.size()) {
        if (const NodePtr* directory = FindDirectory(whole.substr(0, slash))) {
            return (*directory)->GetChild(whole.substr(slash + 1));
        }
    }
    NodePtr directory;
    NodePtr node = root;
    for (std::size_t begin = 0; begin < whole.size();) {
        const std::size_t end = std::min(whole.find('/', begin), whole.size());
        if (end > begin) {
            directory = std::exchange(node, node->GetChild(whole.substr(begin, end - begin)));
        }
        begin = end + 1;
    }
    if (!IsCanonical(path)) {
        throw Error(Error::kPathLookupFailed, "GetNodeByPath failed, path=" + path);
    }
    RememberDirectory(whole.substr(0, slash), std::move(directory));
    return node;
}

const NodePtr* OPTree::FindDirectory(std::string_view path) {
    if (last_directory_ == nullptr || last_directory_->first != path) {
        const auto found = directories_.find(path);
        if (found == directories_.end()) {
            return nullptr;
        }
        last_directory_ = &*found;
    }
    return &last_directory_->second;
}

void OPTree::RememberDirectory(std::string_view path, NodePtr node) {
    if (directories_.size() == kMaxRemembered) {
        directories_.clear();
    }
    last_directory_ = &*directories_.emplace(path, std::move(node)).first;
}

void OPTree::InsertEvent(const std::shared_ptr<Event>& event) {
    Insert(*event);
}

void OPTree::Insert(const Event& event) {
    const NodePtr node = GetNodeByPath(event.path);
    const OPPtr op = NewOP(node);
    const auto has = [&](std::uint32_t bit) { return (event.event & bit) != 0; };
    if (has(EVENT_CREATE)) {
        event.is_dir ? HandleReindex(node, op) : HandleCreate(node, op);
    }
    if (has(EVENT_ATTR)) {
        HandleAttr(node, op);
    }
    if (has(EVENT_MODIFY)) {
        HandleModify(node, op);
    }
    if (has(EVENT_DELETE)) {
        // What became of everything below a directory is settled by looking at the disk.
        event.is_dir ? HandleReindex(node, op) : HandleDelete(node, op);
    }
    if (has(EVENT_RENAME)) {
        op->path = event.path_old;
        HandleRename(node, op);
    }
    if (has(EVENT_REINDEX)) {
        HandleReindex(node, op);
    }
    if (has(EVENT_UPDATE_CFG)) {
        op->data = event.data;
        HandleUpdateCfg(node, op);
    }
    if (has(EVENT_QUEUE_CRASH)) {
        crashed = true;
    }
}

OPPtr OPTree::NewOP(const NodePtr& node) {
    if (unused_op_ != nullptr && unused_op_.use_count() == 1) {
        SetKind(*unused_op_, OP_NONE);
        unused_op_->node = node;
        unused_op_->counted_ = false;
    } else {
        unused_op_ = std::make_shared<OP>(node, OP_NONE, std::string(), Json::Value());
    }
    return unused_op_;
}

void OPTree::HandleCreate(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_UPSERT, Incoming::kCreate);
    Attach(node, op);
}

void OPTree::HandleModify(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_UPSERT, Incoming::kModify);
    Attach(node, op);
}

void OPTree::HandleDelete(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_DELETE, Incoming::kDelete);
    Attach(node, op);
}

void OPTree::HandleAttr(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_ATTR, Incoming::kAttr);
    Attach(node, op);
}

void OPTree::HandleUpdateCfg(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_UPDATE_CFG, Incoming::kUpdateCfg);
    Attach(node, op);
}

void OPTree::HandleReindex(const NodePtr& node, const OPPtr& op) {
    Coalesce(*node, *op, OP_REINDEX, Incoming::kReindex);
    const auto cancel = [](const NodePtr& below) {
        for (const OPPtr& pending : below->ops) {
            if (pending->op != OP_RENAME) {
                pending->op = OP_NONE;
            }
        }
    };
    TraverseNodeDescendant(node, cancel, true);
    Attach(node, op);
}

void OPTree::HandleRename(const NodePtr& node, const OPPtr& op) {
    const NodePtr old_node = GetNodeByPath(op->path);
    SetKind(*op, OP_RENAME);
    // What was at the new place is replaced.
    for (std::size_t i = SkipSettled(*node, *op); i < node->ops.size(); ++i) {
        OP& replaced = *node->ops[i];
        if (replaced.op == OP_DELETE || replaced.op == OP_UPSERT || replaced.op == OP_ATTR) {
            replaced.op = OP_NONE;
        }
    }
    const FileIndexOP work = TakeOverWork(*old_node);
    MoveOPs(*old_node, node, [](const OP&) { return true; });
    MoveDescendants(old_node, op->path.size(), node->GetPath(), *op);
    Attach(node, op);
    if (work != OP_NONE) {
        Attach(node, std::make_shared<OP>(node, work, std::string(), Json::Value()));
    }
}

int OPTree::ProcessOP(const std::function<void(OPPtr)>& fn) {
    if (crashed) {
        LogTrace({"optree", 144}, "Queue crashed: %s", queue_path.c_str());
        fn(std::make_shared<OP>(root, OP_REINDEX_ALL, std::string(), Json::Value()));
        return 1;
    }
    for (std::size_t i = 0; i < ops.size(); ++i) {  // `fn` may insert further events
        if (ops[i]->op != OP_NONE) {
            fn(ops[i]);
        }
    }
    return static_cast<int>(consumed_);
}

void OPTree::TraverseNodeDescendant(const NodePtr& node, const std::function<void(NodePtr)>& fn,
                                    bool skip_self) {
    const std::vector<NodePtr> nodes = Subtree(node);
    for (std::size_t i = skip_self ? 1 : 0; i < nodes.size(); ++i) {
        fn(nodes[i]);
    }
}

void OPTree::Coalesce(OPNode& node, OP& op, FileIndexOP kind, Incoming incoming) {
    SetKind(op, kind);
    for (std::size_t i = SkipSettled(node, op); i < node.ops.size(); ++i) {
        OP& existing = *node.ops[i];
        // The remaining ops are treated all the same, also once the incoming op was dropped.
        if (&existing != &op && CoalesceInto(existing, op, incoming)) {
            op.op = OP_NONE;
        }
    }
}

std::size_t OPTree::SkipSettled(OPNode& node, const OP& incoming) {
    std::size_t& settled = node.settled_;
    settled = std::min(settled, node.ops.size());
    while (settled < node.ops.size()) {
        const OP& op = *node.ops[settled];
        if (&op == &incoming || (op.op != OP_NONE && op.op != OP_RENAME)) {
            break;
        }
        ++settled;
    }
    return settled;
}

void OPTree::Attach(const NodePtr& node, const OPPtr& op) {
    if (!op->counted_) {
        op->counted_ = true;
        ++consumed_;
    }
    if (op->op != OP_NONE && !op->attached_) {
        op->attached_ = true;
        ops.push_back(op);
        node->ops.push_back(op);
    }
}

template <typename Predicate>
void OPTree::MoveOPs(OPNode& from, const NodePtr& to, const Predicate& moves) {
    const auto stays = [&](const OPPtr& op) { return !moves(*op); };
    const auto first = std::stable_partition(from.ops.begin(), from.ops.end(), stays);
    from.settled_ = 0;
    if (&from == to.get()) {
        return;  // a rename onto itself: what moves is behind what stays now
    }
    for (auto op = first; op != from.ops.end(); ++op) {
        (*op)->node = to;
        to->ops.push_back(std::move(*op));
    }
    from.ops.erase(first, from.ops.end());
}

void OPTree::MoveDescendants(const NodePtr& old_top, std::size_t old_length,
                             const std::string& new_path, const OP& rename) {
    const auto moves = [&](const OP& op) { return op.op >= OP_UPSERT && &op != &rename; };
    const auto move = [&](const NodePtr& node) {
        // Only where there is work: a copy of every node would let a few hostile renames of a
        // directory into itself double the tree again and again.
        if (std::any_of(node->ops.begin(), node->ops.end(),
                        [&](const OPPtr& op) { return moves(*op); })) {
            MoveOPs(*node, GetNodeByPath(new_path + node->GetPath().substr(old_length)), moves);
        }
    };
    TraverseNodeDescendant(old_top, move, true);
}

}  // namespace quivra::fileindex
