#pragma once

#include <string>

#include "common/export.h"

namespace quivra {

/// An advisory inter-process lock (flock) on a file, held from construction to destruction. Two
/// objects on one path conflict even within one process, unless both are shared. The file is made
/// with mode 0644 when it is missing, and never deleted. A symbolic link in the place of the file
/// is not followed, and neither it nor a FIFO or device is locked: users may write to where lock
/// files lie.
class QUIVRA_EXPORT LockFile {
  public:
    /// Takes the lock, trying 64 times with a random sleep of 0 to 0.9 s in between (so it blocks
    /// for about a minute at most). Throws Error 506 when the file cannot be opened or locked, or
    /// is still locked by others in the end. The file that was locked is the one at the path: when
    /// it was replaced meanwhile, the new one is tried.
    LockFile(const std::string& path, bool exclusive);

    /// The same for a name in the directory that is open as `directory`, whatever its path leads to
    /// by now.
    LockFile(int directory, const std::string& name, bool exclusive, unsigned int mode);

    ~LockFile();
    LockFile(const LockFile&) = delete;
    LockFile& operator=(const LockFile&) = delete;

    /// The locked file, open for reading and writing. The object's own: do not close it.
    int Fd() const { return fd_; }

  private:
    int fd_ = -1;
};

}  // namespace quivra
