#include "fileindex/optree.h"

#include <algorithm>
#include <iterator>
#include <string_view>
#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/coalescing.h"
#include "fileindex/node_extra.h"
#include "fileindex/queue_line.h"
#include "fileindex/queue_reader.h"

namespace quivra::fileindex {
namespace {

/// How many directories a tree remembers, so that their paths take no noteworthy memory.
constexpr std::size_t kMaxRemembered = 4096;

/// How many lines are parsed before the first of them is inserted: enough to hide how slow the
/// memory is, few enough to stay in the cache.
constexpr std::size_t kLinesAhead = 32;

using NodePtr = std::shared_ptr<OPNode>;
using OPPtr = std::shared_ptr<OP>;

bool IsCanonical(std::string_view path) {
    return path.size() > 1 && path.front() == '/' && path.back() != '/' &&
           path.find("//") == std::string_view::npos;
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
    if (limbo_ != nullptr) {
        pending.push_back(std::move(limbo_));
    }
    while (!pending.empty()) {
        const NodePtr node = std::move(pending.back());
        pending.pop_back();
        std::move(node->children.begin(), node->children.end(), std::back_inserter(pending));
        node->children.clear();
        node->ops.clear();
        node->extra_.reset();  // it may hold ops, when reading failed
    }
}

void OPTree::BuildTree() {
    QueueReader reader(queue_path);
    reader.RequireOpen({"optree", 190});
    building_ = true;
    try {
        std::vector<QueueLine> lines;
        while (ReadAhead(reader, lines)) {
            LookAhead(lines);
            for (QueueLine& line : lines) {
                Insert(line);
            }
        }
    } catch (const Error&) {
        FinishBuilding();
        throw;
    }
    FinishBuilding();
}

void OPTree::FinishBuilding() {
    SettleLoads();
    loads_.clear();
    building_ = false;
    Settle();
}

bool OPTree::ReadAhead(QueueReader& reader, std::vector<QueueLine>& lines) {
    lines.resize(kLinesAhead);
    std::size_t count = 0;
    while (count < kLinesAhead && reader.ReadLine(lines[count].text)) {
        lines[count].is_plain = ParsePlainLine(lines[count].event, lines[count].text);
        ++count;
    }
    lines.resize(count);
    return count > 0;
}

void OPTree::Insert(QueueLine& line) {
    if (log_level == kLogLevelDebug) {
        LogTrace({"optree", 194}, "Got event: %s", ShownLine(line.text).c_str());
    }
    try {
        if (!line.is_plain) {
            ParseLine(line.event, line.text);
        }
        Insert(line.event);
    } catch (const Error& error) {
        // A marker whose line is bad tells of lost events as well as any other.
        crashed = crashed || (line.event.event & EVENT_QUEUE_CRASH) != 0;
        LogError({"optree", 198}, "InsertEvent failed, event_raw=%s, code=%d, reason=%s",
                 ShownLine(line.text).c_str(), error.code, error.reason.c_str());
    }
}

// A queue in random order finds every node out of the cache. To ask for those of several lines at
// once takes half of the time that asking for one after the other does.
void OPTree::LookAhead(const std::vector<QueueLine>& lines) {
    const OPNode* nodes[kLinesAhead] = {};
    for (std::size_t i = 0; i < lines.size(); ++i) {
        const std::string_view path = lines[i].event.path;
        const std::size_t slash = path.rfind('/');
        if (!lines[i].is_plain || slash == std::string_view::npos) {
            continue;
        }
        if (const NodePtr* directory = FindDirectory(path.substr(0, slash))) {
            nodes[i] = (*directory)->GuessChild(path.substr(slash + 1));
            if (nodes[i] != nullptr) {
                __builtin_prefetch(nodes[i]);
                __builtin_prefetch(reinterpret_cast<const char*>(nodes[i]) + 64);
            }
        }
    }
    for (const OPNode* node : nodes) {
        if (node != nullptr) {
            __builtin_prefetch(node->name.data());
            __builtin_prefetch(node->live_);
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
    crashed = crashed || (event.event & EVENT_QUEUE_CRASH) != 0;
    const NodePtr node = GetNodeByPath(event.path);
    const OPPtr op = NewOP(node);
    try {
        Dispatch(event, node, op);
    } catch (const Error&) {
        Finish(node, op);  // what an earlier bit of the line has done stays
        throw;
    }
    Finish(node, op);
}

void OPTree::Dispatch(const Event& event, const NodePtr& node, const OPPtr& op) {
    const auto has = [&](std::uint32_t bit) { return (event.event & bit) != 0; };
    if (has(EVENT_CREATE)) {
        event.is_dir ? Reindex(node, op) : Fold(node, op, OP_UPSERT, Incoming::kCreate);
    }
    if (has(EVENT_ATTR)) {
        Fold(node, op, OP_ATTR, Incoming::kAttr);
    }
    if (has(EVENT_MODIFY)) {
        Fold(node, op, OP_UPSERT, Incoming::kModify);
    }
    if (has(EVENT_DELETE)) {
        // What became of everything below a directory is settled by looking at the disk.
        event.is_dir ? Reindex(node, op) : Fold(node, op, OP_DELETE, Incoming::kDelete);
    }
    if (has(EVENT_RENAME)) {
        const NodePtr old_node = GetNodeByPath(event.path_old);
        op->path = event.path_old;
        Rename(node, op, old_node);
    }
    if (has(EVENT_REINDEX)) {
        Reindex(node, op);
    }
    if (has(EVENT_UPDATE_CFG)) {
        op->data = event.data;
        Fold(node, op, OP_UPDATE_CFG, Incoming::kUpdateCfg);
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
    std::vector<NodePtr> nodes;
    std::vector<NodePtr> pending{node};
    while (!pending.empty()) {
        nodes.push_back(std::move(pending.back()));
        pending.pop_back();
        const auto& children = nodes.back()->children;
        pending.insert(pending.end(), children.rbegin(), children.rend());
    }
    for (std::size_t i = skip_self ? 1 : 0; i < nodes.size(); ++i) {
        fn(nodes[i]);
    }
}

}  // namespace quivra::fileindex
