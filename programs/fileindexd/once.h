#pragma once

#include <string>
#include <vector>

namespace fileindexd {

/// Processes what the queues of the shares hold, until they are empty, and prints a line for each
/// share. The exit status: 0, or 1 when something failed (told on standard error).
int RunOnce(const std::vector<std::string>& shares);

}  // namespace fileindexd
