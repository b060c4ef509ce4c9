#pragma once

#include <string>

namespace sqlite {

/// The name of a file in the open directory as SQLite is to be given it, together with
/// PrivateVfs(). Stays good while the descriptor is open, also after the directory was renamed.
std::string NameInDirectory(int directory, const std::string& name);

/// SQLite's own Unix file system, but for one thing: names stay as they are given. SQLite's own
/// resolves all links, and "/proc/self/fd/N" is one: every file that comes later (the log, its
/// index) would be opened by the directory's path again, which others may have swapped meanwhile.
/// Registered when first asked for. Any thread may call.
const char* PrivateVfs();

}  // namespace sqlite
