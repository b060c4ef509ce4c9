#pragma once

#include <string>

#include "base/private_directory.h"

/// The directory of an index on disk: the engine's files and a marker that says whose they are.
/// Nothing without a marker is ever removed. Everything goes by descriptors: the directory lies
/// where users may rename what is above it.
namespace elasticd {

/// What lies at the path of an index.
enum class Found {
    kIndex,      ///< the index, in the format that we write
    kOldFormat,  ///< the index as an earlier release wrote it
    kNothing,    ///< no directory, or an empty one, below a root that is there
    kRemains,    ///< parts of an index, or another one
    kForeign,    ///< something else, which is not ours to touch
    kNoRoot,     ///< the place that should hold it is missing, as a disk may be
    kRefused,    ///< `problem` says what somebody has to remove
};

struct Look {
    Found found = Found::kNoRoot;
    quivra::base::PrivateDirectory directory;  ///< valid where there is one
    std::string problem;                       ///< in one sentence, for all that is not an index
};

/// Looks for the index `uuid`; with an empty one, for any.
Look LookAt(const std::string& path, const std::string& uuid);

/// Makes the directory (its parent exists) with the marker. What an earlier index left there is
/// removed first. Throws Error 1414 when something else is there, 1412 or 1415 when it fails.
quivra::base::PrivateDirectory MakeIndexDirectory(const std::string& path, const std::string& uuid);

/// Renames what is left of an index to a name that says when, and returns that; what was set aside
/// before goes. An empty text when there is nothing to set aside.
std::string SetAside(const std::string& path);

/// Whether the index `uuid` lies there, in whichever format.
bool IsIndexDirectory(const std::string& path, const std::string& uuid);

/// Removes the index `uuid` with all its files, if it lies there; whether nothing of it is left.
bool RemoveIndexDirectory(const std::string& path, const std::string& uuid);

enum class Moved {
    kWhole,   ///< the files are at the new path only
    kCopied,  ///< the files are complete at the new path; the old ones are to be removed
};

/// Moves a closed index, durably. An index that is at the new path already, and no longer at the
/// old one, has been moved by others and is taken as it is. However it fails or is interrupted, the
/// index is whole at one of the paths. Throws Error 1413 (it is at neither), 1414, 1412 or 1415.
Moved MoveIndexDirectory(const std::string& from, const std::string& to, const std::string& uuid);

/// Removes what an interrupted or failed move has put to the new path, while the index is still at
/// the old one; does nothing when it is not.
void UndoMove(const std::string& from, const std::string& to, const std::string& uuid);

}  // namespace elasticd
