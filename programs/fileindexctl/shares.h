#pragma once

#include <string>
#include <vector>

namespace quivra::ctl {

/// The names of all shares that the platform knows, sorted. Throws Error 502 when it cannot list
/// them.
std::vector<std::string> AllShares();

/// What is wrong in the configuration of the shares: a sentence each, with file and line.
std::vector<std::string> ProblemsOfShares();

/// The full path of the share's root; empty when the platform does not know the share.
std::string RootOf(const std::string& share);

/// What somebody has put where the share's queue and index belong, and what to do, as one sentence
/// without its full stop. Empty when the place is right, or free, or cannot be looked at.
std::string ProblemOfPlace(const std::string& share);

/// Throws that sentence, as the cause of whatever is being done.
void RequirePlaceOfIndex(const std::string& share);

/// The shares that a search covers: those of the indexed folders, sorted; where no folder was ever
/// chosen, all shares that have an index.
std::vector<std::string> SearchableShares();

}  // namespace quivra::ctl
