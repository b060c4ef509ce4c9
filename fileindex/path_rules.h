#pragma once

#include <string>
#include <vector>

#include "common/export.h"

/// The rules by which a path may be indexed, each under a name that can be shown to a user. There
/// is one table of them: CanFullPathBeIndexed (fileindex/util.h) asks whether all of its rules
/// pass, ExaminePath tells what each of them found.
namespace quivra::fileindex {

/// What one rule says about a path.
struct PathFinding {
    std::string rule;     ///< what is asked: "file system"
    bool passed = false;  ///< it does not stand against indexing
    std::string detail;   ///< what was found: "local (type 1)"
    std::string remedy;   ///< of a rule that failed: what to do; empty where nothing helps
};

/// Goes through the rules in their order, up to the first that fails, so the last finding decides:
/// the path may be indexed when that one passed. Throws nothing of the library: what cannot be
/// found out is a finding that failed, and is logged.
///
/// Two rules stand around those of CanFullPathBeIndexed: the object must exist, and neither it nor
/// a directory between it and the share's root may have a name that the system keeps for itself.
QUIVRA_EXPORT std::vector<PathFinding> ExaminePath(const std::string& full_path);

}  // namespace quivra::fileindex
