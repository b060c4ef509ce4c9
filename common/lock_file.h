#pragma once

#include <string>

#include "common/export.h"

namespace quivra {

/// An advisory inter-process lock (flock) on a file, held from construction to destruction. Two
/// objects on one path conflict even within one process, unless both are shared. The file is
/// created with mode 0644 when it is missing, and never deleted.
class QUIVRA_EXPORT LockFile {
  public:
    /// Takes the lock, trying 64 times with a random sleep of 0 to 0.9 s in between (so it blocks
    /// for about a minute at most). Throws Error 506 when the file cannot be opened or locked, or
    /// is still locked by others in the end. The file that was locked is the one at the path: when
    /// it was replaced meanwhile, the new one is tried.
    LockFile(const std::string& path, bool exclusive);
    ~LockFile();
    LockFile(const LockFile&) = delete;
    LockFile& operator=(const LockFile&) = delete;

  private:
    bool TryLock(bool exclusive);
    void Open();
    void Close();
    bool IsStillAtPath() const;

    int fd_ = -1;
    std::string path_;
};

}  // namespace quivra
