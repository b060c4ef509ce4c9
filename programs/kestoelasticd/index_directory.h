#pragma once

#include <string>

/// The directory of an index on disk: the search engine's database in "glass" and a marker file
/// that says whose it is. Nothing without the right marker is ever removed.
namespace elasticd {

std::string DatabasePath(const std::string& directory);

/// Throws Error 1414 unless an index may be put there: an absolute path without "." and "..", whose
/// parent is a directory that only root, or this user, can have put there. Symbolic links of other
/// users on the way are refused.
void CheckIndexPath(const std::string& directory);

/// Makes the directory (its parent exists) with the marker. What an earlier index left there is
/// removed first. Throws Error 1414 when something else is there, 1412 or 1415 when it fails.
void MakeIndexDirectory(const std::string& directory, const std::string& uuid);

/// Whether the index `uuid` lies there. With an empty uuid: any index.
bool IsIndexDirectory(const std::string& directory, const std::string& uuid);

/// Removes the index `uuid` with all its files, if it lies there; whether nothing of it is left.
bool RemoveIndexDirectory(const std::string& directory, const std::string& uuid);

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
