#include "fileindex/coalescing.h"

#include <iterator>

namespace quivra::fileindex {
namespace {

using enum Action;

/// Rows are the kinds of the existing op. The asymmetries are deliberate: a modify does not revive
/// what is to be deleted, a create does; a delete waits behind a reindex or changed settings; a
/// rename never merges.
// clang-format off
constexpr Action kCoalescing[][6] = {
    //                Create     Modify     Delete     Attr   UpdateCfg     Reindex
    /* NONE       */ {kKeep,     kKeep,     kKeep,     kKeep, kKeep,        kKeep},
    /* DELETE     */ {kToUpsert, kDrop,     kDrop,     kDrop, kDrop,        kDrop},
    /* UPSERT     */ {kDrop,     kDrop,     kToDelete, kDrop, kToUpdateCfg, kToReindex},
    /* ATTR       */ {kToUpsert, kToUpsert, kToDelete, kDrop, kToUpdateCfg, kToReindex},
    /* UPDATE_CFG */ {kDrop,     kDrop,     kKeep,     kDrop, kMerge,       kToReindex},
    /* RENAME     */ {kKeep,     kKeep,     kKeep,     kKeep, kKeep,        kKeep},
    /* REINDEX    */ {kDrop,     kDrop,     kKeep,     kDrop, kDrop,        kDrop},
};
// clang-format on

}  // namespace

Action CoalescingRule(FileIndexOP existing, Incoming incoming) {
    const auto row = static_cast<std::size_t>(existing);
    return row < std::size(kCoalescing) ? kCoalescing[row][static_cast<std::size_t>(incoming)]
                                        : kKeep;
}

void Apply(Action action, OP& existing, const OP& incoming_op) {
    switch (action) {
        case kKeep:
        case kDrop:
            break;
        case kToDelete:
            SetKind(existing, OP_DELETE);
            break;
        case kToUpsert:
            SetKind(existing, OP_UPSERT);
            break;
        case kToReindex:
            SetKind(existing, OP_REINDEX);
            break;
        case kToUpdateCfg:
            SetKind(existing, OP_UPDATE_CFG);
            existing.data = incoming_op.data;
            break;
        case kMerge:
            existing.MergeData(incoming_op.data);
            break;
    }
}

void SetKind(OP& op, FileIndexOP kind) {
    op.op = kind;
    if (kind != OP_RENAME) {
        op.path.clear();
    }
    if (kind != OP_UPDATE_CFG && !op.data.isNull()) {
        op.data = Json::Value();
    }
}

bool IsSwitchedOn(const Json::Value& settings, const char* key) {
    if (!settings.isObject()) {
        return false;
    }
    const Json::Value& member = settings[key];
    return member.isBool() && member.asBool();
}

}  // namespace quivra::fileindex
