#pragma once

#include <string>
#include <vector>

#include "programs/fileindexctl/paths.h"

namespace quivra::ctl {

/// The answer of one rule about a path.
struct Finding {
    std::string rule;    ///< what is asked: "file system"
    bool passed;         ///< it does not stand against indexing
    std::string detail;  ///< what was found: "type 1, local"
    std::string remedy;  ///< of a rule that failed: what to do; empty where nothing helps
};

/// Goes through the rules by which a path may be indexed, in their order, up to the first that
/// fails. Failures to find out are findings that failed.
std::vector<Finding> ExaminePath(const Place& place);

}  // namespace quivra::ctl
