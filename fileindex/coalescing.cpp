#include "fileindex/coalescing.h"

#include <iterator>

namespace quivra::fileindex {
namespace {

/// What an incoming op does with an existing one on the same node. Everything but kKeep drops the
/// incoming op.
enum Action {
    kKeep,         ///< nothing: both stay
    kDrop,         ///< the existing op covers the incoming one
    kToDelete,     ///< the existing op becomes OP_DELETE
    kToUpsert,     ///< the existing op becomes OP_UPSERT
    kToReindex,    ///< the existing op becomes OP_REINDEX
    kToUpdateCfg,  ///< the existing op becomes OP_UPDATE_CFG with the incoming data
    kMerge,        ///< the existing op merges the incoming data
};

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

void Apply(Action action, OP& existing, const OP& incoming) {
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
            existing.data = incoming.data;
            break;
        case kMerge:
            existing.MergeData(incoming.data);
            break;
    }
}

}  // namespace

void SetKind(OP& op, FileIndexOP kind) {
    op.op = kind;
    if (kind != OP_RENAME) {
        op.path.clear();
    }
    if (kind != OP_UPDATE_CFG && !op.data.isNull()) {
        op.data = Json::Value();
    }
}

bool CoalesceInto(OP& existing, const OP& incoming, Incoming handler) {
    if (static_cast<std::size_t>(existing.op) >= std::size(kCoalescing)) {
        return false;
    }
    const Action action = kCoalescing[existing.op][static_cast<std::size_t>(handler)];
    Apply(action, existing, incoming);
    return action != kKeep;
}

}  // namespace quivra::fileindex
