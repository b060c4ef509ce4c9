#pragma once

#include <string>
#include <vector>

namespace quivra::ctl {

/// The names of all shares that the platform knows, sorted. Throws Error 502 when it cannot list
/// them.
std::vector<std::string> AllShares();

/// The shares that a search covers: those of the indexed folders, sorted; where no folder was ever
/// chosen, all shares that have an index.
std::vector<std::string> SearchableShares();

}  // namespace quivra::ctl
