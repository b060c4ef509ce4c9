#pragma once

#include <string>
#include <vector>

/// Whole directories by descriptor. All throw Error 1412 (the disk is full) or 1415 that names the
/// file.
namespace elasticd {

[[noreturn]] void FailFile(const std::string& what);

/// The names in the open directory, without "." and "..".
std::vector<std::string> NamesIn(int directory);

/// Removes the file or directory of that name with everything in it; follows no link. Succeeds when
/// there is none.
void RemoveTree(int parent, const std::string& name);

/// Copies the regular files of one directory into another, durably, `first` before all others.
void CopyFiles(int from, int to, const std::string& first);

void SyncDirectory(int directory);

}  // namespace elasticd
