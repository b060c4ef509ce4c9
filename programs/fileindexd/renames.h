#pragma once

#include <functional>
#include <string>
#include <vector>

#include "programs/fileindexd/batch.h"

namespace fileindexd {

/// One rename of a pass. `to` is where the object is at the end of the queue.
struct Rename {
    enum class Plan {
        kMove,     ///< move the documents: they spare an extraction
        kReplace,  ///< drop them at both ends: they may belong to another object
        kNone,     ///< there is nothing to move
    };

    std::string from;
    std::string to;
    Plan plan = Plan::kMove;
};

/// Plans the renames of one pass, given in queue order. Each moves an object from where it was to
/// where it ends, so a chain or an exchange of names is no longer a sequence that can be played
/// again: where two renames have an end in common, or one has an end inside the other's, the
/// documents of the one that is deeper are not trusted. `has_documents` tells whether the index
/// holds any at or below a path.
void PlanRenames(std::vector<Rename>& renames,
                 const std::function<bool(const std::string& path)>& has_documents);

/// Carries planned renames out and answers which of them moved a document. Interrupted anywhere,
/// it may be repeated as long as nothing but renames was done to the index.
std::vector<bool> CarryOutRenames(std::vector<Rename>& renames, Batch& batch, Index& index,
                                  const ShareTree& tree, const Scope& scope);

}  // namespace fileindexd
