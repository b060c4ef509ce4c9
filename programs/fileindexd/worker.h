#pragma once

#include <csignal>
#include <string>

namespace fileindexd {

/// Makes a worker try at once again what it could not read.
inline constexpr int kRetrySignal = SIGUSR1;

/// The worker process of one share: watches its queue and processes it and the backlog, at low
/// priority, until SIGTERM or SIGINT, which end it within a second. Where the share's place is
/// missing or not right, it waits until it is. Returns the exit status: 0, or 1 (logged).
int RunWorker(const std::string& share);

}  // namespace fileindexd
