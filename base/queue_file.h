#pragma once

#include <cstddef>
#include <string>
#include <string_view>

/// The file format of a share's queue: one JSON object a line, each ended by "\n". Writers hold an
/// exclusive flock on the file (TryLock of base/file.h) while they append; the reader holds it
/// while it renames the queue to its working copy. Queue and copy lie in a PrivateDirectory.
namespace quivra::base {

/// The mode of a queue file that is made.
inline constexpr unsigned int kQueueMode = 0600;

/// The path or name of the working copy of a queue.
std::string WorkingCopy(std::string_view queue);

/// Appends whole lines, each with its "\n", to the locked queue file open as `fd`. A last line
/// that somebody left without its end is ended first. When that fails (errno tells why), the file
/// is cut back to the whole lines that fitted. Returns how many bytes of `lines` are in the file:
/// all of them, or fewer after a failure.
std::size_t AppendLines(int fd, std::string_view lines);

}  // namespace quivra::base
