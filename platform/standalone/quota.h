#pragma once

#include <sys/quota.h>

namespace kesto {

/// Whether a quota leaves that many bytes: up to its hard limit or, where it has none, its soft
/// one. Without either there is no end.
bool LeavesRoom(const dqblk& quota, unsigned long long bytes);

}  // namespace kesto
