#pragma once

#include "fileindex/op.h"

namespace quivra::fileindex {

/// The handler of an incoming op.
enum class Incoming { kCreate, kModify, kDelete, kAttr, kUpdateCfg, kReindex };

/// Makes the op one of that kind: what belongs to another kind (old path, data) is dropped.
void SetKind(OP& op, FileIndexOP kind);

/// Applies the rule for an op that comes in while `existing` is pending on the same node. Returns
/// whether the incoming op is to be dropped; `incoming` itself is not changed.
bool CoalesceInto(OP& existing, const OP& incoming, Incoming handler);

}  // namespace quivra::fileindex
