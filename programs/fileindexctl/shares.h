#pragma once

#include <string>
#include <vector>

namespace quivra::ctl {

/// The names of all shares of this machine, sorted: those of /etc/kesto/shares.conf that the
/// platform accepts.
std::vector<std::string> AllShares();

/// The shares that a search covers: those of the indexed folders, sorted; where no folder was ever
/// chosen, all shares that have an index.
std::vector<std::string> SearchableShares();

}  // namespace quivra::ctl
