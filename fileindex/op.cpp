#include "fileindex/op.h"

#include <algorithm>
#include <functional>
#include <utility>

#include "common/json.h"

namespace quivra::fileindex {
namespace {

constexpr const char* kContentClasses[] = {"document", "audio", "video", "photo"};

/// Up to here a scan of the children beats the upkeep of an index.
constexpr std::size_t kMaxUnindexedChildren = 8;

bool IsTrue(const Json::Value& object, const char* key) {
    if (!object.isObject()) {
        return false;
    }
    const Json::Value& member = object[key];
    return member.isBool() && member.asBool();
}

}  // namespace

OP::OP(std::shared_ptr<OPNode> op_node, FileIndexOP kind, std::string old_path, Json::Value op_data)
    : node(std::move(op_node)), op(kind), path(std::move(old_path)), data(std::move(op_data)) {}

void OP::MergeData(const Json::Value& newer) {
    if (!data.isObject()) {
        data = Json::Value(Json::objectValue);
    }
    for (const char* key : kContentClasses) {
        data[key] = IsTrue(newer, key) || IsTrue(std::as_const(data), key);
    }
}

/// A hash table of positions in `children`, which stays the authority: the table takes in what was
/// appended to the vector since the last look-up. Open addressing, without deletion.
class OPNode::ChildIndex {
  public:
    using Children = std::vector<std::shared_ptr<OPNode>>;

    std::shared_ptr<OPNode> Find(const Children& nodes, std::string_view wanted) {
        TakeIn(nodes);
        const std::uint32_t hash = Hash(wanted);
        for (std::size_t i = hash & mask_; slots_[i].count != 0; i = (i + 1) & mask_) {
            const std::shared_ptr<OPNode>& child = nodes[slots_[i].count - 1];
            if (slots_[i].hash == hash && child->name == wanted) {
                return child;
            }
        }
        return nullptr;
    }

  private:
    struct Slot {
        std::uint32_t hash = 0;
        std::uint32_t count = 0;  ///< the position plus one; 0 marks a free slot
    };

    static std::uint32_t Hash(std::string_view text) {
        return static_cast<std::uint32_t>(std::hash<std::string_view>()(text));
    }

    void TakeIn(const Children& nodes) {
        if (nodes.size() < indexed_) {  // somebody removed children: start again
            *this = ChildIndex();
        }
        Reserve(nodes.size());
        for (; indexed_ < nodes.size(); ++indexed_) {
            Put({Hash(nodes[indexed_]->name), static_cast<std::uint32_t>(indexed_ + 1)});
        }
    }

    /// Keeps at least a quarter of the slots free, so that probing stays short and ends.
    void Reserve(std::size_t size) {
        if (size * 4 < slots_.size() * 3) {
            return;
        }
        std::size_t capacity = std::max<std::size_t>(slots_.size(), 2 * kMaxUnindexedChildren);
        while (size * 4 >= capacity * 3) {
            capacity *= 2;
        }
        const std::vector<Slot> old_slots = std::exchange(slots_, std::vector<Slot>(capacity));
        mask_ = capacity - 1;
        for (const Slot& slot : old_slots) {
            if (slot.count != 0) {
                Put(slot);
            }
        }
    }

    void Put(Slot slot) {
        std::size_t i = slot.hash & mask_;
        while (slots_[i].count != 0) {
            i = (i + 1) & mask_;
        }
        slots_[i] = slot;
    }

    std::vector<Slot> slots_;
    std::size_t mask_ = 0;
    std::size_t indexed_ = 0;
};

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
        if (index_ == nullptr) {
            index_ = std::make_unique<ChildIndex>();
        }
        if (std::shared_ptr<OPNode> child = index_->Find(children, child_name)) {
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
    return children.back();
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
