#include "fileindex/op.h"

#include <algorithm>
#include <functional>
#include <utility>

#include "common/json.h"
#include "fileindex/coalescing.h"
#include "fileindex/live_ops.h"
#include "fileindex/node_extra.h"

namespace quivra::fileindex {
namespace {

/// Up to here a scan of the children beats the upkeep of an index.
constexpr std::size_t kMaxUnindexedChildren = 8;

}  // namespace

OP::OP(std::shared_ptr<OPNode> op_node, FileIndexOP kind, std::string old_path, Json::Value op_data)
    : node(std::move(op_node)), op(kind), path(std::move(old_path)), data(std::move(op_data)) {}

OP::~OP() = default;

void OP::MergeData(const Json::Value& newer) {
    if (!data.isObject()) {
        data = Json::Value(Json::objectValue);
    }
    for (const char* key : kContentClasses) {
        data[key] = IsSwitchedOn(newer, key) || IsSwitchedOn(data, key);
    }
}

OPNode::OPNode(std::shared_ptr<OPNode> node_parent, std::string_view node_name)
    : name(node_name), parent(std::move(node_parent)) {}

OPNode::~OPNode() {
    // Ancestors that only this node kept are released one by one: a path may have a million
    // components, and recursion through as many destructors would overflow the stack.
    std::shared_ptr<OPNode> ancestor = std::move(parent);
    while (ancestor != nullptr && ancestor.use_count() == 1) {
        ancestor = std::move(ancestor->parent);
    }
}

std::shared_ptr<OPNode> OPNode::GetChild(std::string_view child_name) {
    if (children.size() > kMaxUnindexedChildren) {
        if (std::shared_ptr<OPNode> child = NeedExtra().index.Find(children, child_name)) {
            return child;
        }
    } else {
        for (const std::shared_ptr<OPNode>& child : children) {
            if (child->name == child_name) {
                return child;
            }
        }
    }
    children.push_back(std::make_shared<OPNode>(shared_from_this(), child_name));
    children.back()->position_ = static_cast<std::uint32_t>(children.size() - 1);
    return children.back();
}

const OPNode* OPNode::GuessChild(std::string_view child_name) const {
    return extra_ == nullptr ? nullptr
                             : extra_->index.Guess(children, ChildIndex::Hash(child_name));
}

OPNode::Extra& OPNode::NeedExtra() {
    if (extra_ == nullptr) {
        extra_ = std::make_unique<Extra>();
    }
    return *extra_;
}

std::string OPNode::GetPath() const {
    std::size_t length = name.size();
    for (const OPNode* node = parent.get(); node != nullptr; node = node->parent.get()) {
        length += node->name.size() + 1;
    }
    std::string path(length, '/');
    for (const OPNode* node = this; node != nullptr; node = node->parent.get()) {
        length -= node->name.size();
        path.replace(length, node->name.size(), node->name);
        length -= length > 0 ? 1 : 0;
    }
    return path;
}

void OPNode::TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn) const {
    const std::vector<std::shared_ptr<OP>> snapshot = ops;
    for (const std::shared_ptr<OP>& op : snapshot) {
        fn(op);
    }
}

std::ostream& operator<<(std::ostream& out, const std::shared_ptr<OPNode>& node) {
    out << "Node[" << node->name << "]: " << std::endl;
    for (const std::shared_ptr<OP>& op : node->ops) {
        out << "  " << op << std::endl;
    }
    return out;
}

std::ostream& operator<<(std::ostream& out, const std::shared_ptr<OP>& op) {
    const int kind = op->op;
    out << '[' << static_cast<char>('0' + kind / 10) << static_cast<char>('0' + kind % 10) << "] ";
    if (op->op == OP_RENAME) {
        out << op->path << " -> ";
    }
    out << op->node->GetPath();
    if (op->op == OP_UPDATE_CFG) {
        out << ", data=" << toString(op->data);
    }
    return out;
}

}  // namespace quivra::fileindex
