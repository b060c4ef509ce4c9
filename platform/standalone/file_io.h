#pragma once

#include <cstddef>
#include <string>

namespace kesto {

/// Appends what the descriptor still holds to `out`, at most `limit` bytes. False with errno set
/// when a read fails; `out` then holds what came before.
bool ReadUpTo(int fd, std::size_t limit, std::string& out);

/// Replaces the file by one of that content and mode, so that readers see the old or the new one
/// whole, also after a power failure. False with errno set on failure; the old file stands then.
bool ReplaceFile(const std::string& path, const std::string& content, unsigned int mode);

}  // namespace kesto
