#pragma once

#include <cstdint>

#include "fileindex/op.h"

namespace quivra::fileindex {

/// Which event an incoming op comes from: the column of the coalescing table.
enum class Incoming { kCreate, kModify, kDelete, kAttr, kUpdateCfg, kReindex };

/// What an incoming op does with an existing one on the same node. Everything but kKeep drops the
/// incoming op.
enum class Action : std::uint8_t {
    kKeep,         ///< nothing: both stay
    kDrop,         ///< the existing op covers the incoming one
    kToDelete,     ///< the existing op becomes OP_DELETE
    kToUpsert,     ///< the existing op becomes OP_UPSERT
    kToReindex,    ///< the existing op becomes OP_REINDEX
    kToUpdateCfg,  ///< the existing op becomes OP_UPDATE_CFG with the incoming data
    kMerge,        ///< the existing op merges the incoming data
};

/// The rule for an op that comes in while an op of the kind `existing` is pending.
Action CoalescingRule(FileIndexOP existing, Incoming incoming);

/// Carries out the rule on the existing op; `incoming_op` itself is not changed.
void Apply(Action action, OP& existing, const OP& incoming_op);

/// Makes the op one of that kind: what belongs to another kind (old path, data) is dropped.
void SetKind(OP& op, FileIndexOP kind);

/// The classes of content that settings switch on and off.
inline constexpr const char* kContentClasses[] = {"document", "audio", "video", "photo"};

/// Whether settings have the key with the boolean value true.
bool IsSwitchedOn(const Json::Value& settings, const char* key);

}  // namespace quivra::fileindex
