#pragma once

#include <string>

#include "programs/fileindexd/batch.h"
#include "programs/fileindexd/scope.h"

namespace fileindexd {

/// Whether the document is still the object's: the same object, with the same times.
bool IsCurrent(const Attributes& indexed, const Attributes& there);

/// Makes the index equal to the disk for what a look decides: a path where nothing stands any more,
/// or a file. What lies below a directory is the backlog's matter. It works on committed documents,
/// so commit first what should be taken into account.
class Settler {
  public:
    Settler(Batch& batch, Index& index, const Scope& scope)
        : batch_(batch), index_(index), scope_(scope) {}

    enum class Found {
        kNothing,    ///< its documents were dropped, with all below it
        kFile,       ///< it is settled
        kDirectory,  ///< nothing was done
        kUnknown,    ///< it could not be looked at, which is noted as a failure
    };

    /// Files of the given classes are indexed again in any case, because their settings changed.
    Found Settle(const std::string& path, const ContentClasses& again = {});

    /// The same for a path whose documents were just moved there: a file of the same content only
    /// gets its new attributes.
    Found SettleMoved(const std::string& path);

  private:
    Found Look(const std::string& path, Attributes& there);

    Batch& batch_;
    Index& index_;
    const Scope& scope_;
};

}  // namespace fileindexd
