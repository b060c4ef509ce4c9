#pragma once

#include <string>

namespace fileindexd {

/// The worker process of one share: watches its queue and processes it, at low priority, until
/// SIGTERM or SIGINT, which end it between two operations. The exit status: 0, or 1 when the share
/// cannot be worked on (logged).
int RunWorker(const std::string& share);

}  // namespace fileindexd
