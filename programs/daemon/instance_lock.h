#pragma once

#include <string>

#include "base/unique_fd.h"

namespace quivra::daemon {

/// Takes the lock that only one process may hold, without waiting: an exclusive flock on the file,
/// which is created when missing and never removed. It lasts until the descriptor is closed or the
/// process ends. Throws Error 506 when another process holds it or the file cannot be opened.
base::UniqueFd TakeInstanceLock(const std::string& path);

}  // namespace quivra::daemon
