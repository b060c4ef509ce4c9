#pragma once

#include <sys/types.h>

#include <cerrno>
#include <cstddef>
#include <string>
#include <string_view>

#include "base/unique_fd.h"

/// Files by descriptor. Where a call takes a directory and a name, the name is looked up in that
/// directory alone (AT_FDCWD is one, too) and its last component is never followed when it is a
/// symbolic link. Failures leave their cause in errno; nothing is logged or thrown. All
/// descriptors are close-on-exec. Any thread may call.
namespace quivra::base {

/// Gives errno its old value back at the end of a scope: over calls that clean up behind the one
/// that failed, and over a try that did not matter, whose errno would turn up in the caller's next
/// log line.
class KeepErrno {
  public:
    KeepErrno() = default;
    ~KeepErrno() { errno = saved_; }
    KeepErrno(const KeepErrno&) = delete;
    KeepErrno& operator=(const KeepErrno&) = delete;

  private:
    const int saved_ = errno;
};

/// Writes all of it, however many calls that takes. False when one fails; a part may be written
/// then.
bool WriteAll(int fd, std::string_view data);

/// Appends what the descriptor still holds to `out`, at most `limit` bytes. False when a read
/// fails; `out` then holds what came before.
bool ReadUpTo(int fd, std::size_t limit, std::string& out);

/// Opens the directory without following a link in any component. A relative path starts at
/// `parent`, and cannot lead out of it.
UniqueFd OpenDirectory(int parent, const std::string& path);

/// Names the object at the path for good, following no link in any component. The descriptor
/// (O_PATH) stands for that object, whatever happens to its name meanwhile; a link as the last
/// component is found itself. Nothing is waited for, no device woken, no mount triggered. For
/// fstat, statx and OpenFound. A relative path starts at `parent`, and cannot lead out of it.
UniqueFd FindObject(int parent, const std::string& path);

/// Opens the regular file or directory that FindObject named, whatever has its name now: `flags`
/// as of open(2). Never waits: EWOULDBLOCK where somebody else holds a lease on the file, EINVAL
/// for what is neither file nor directory. Needs /proc.
UniqueFd OpenFound(int object, int flags);

/// Opens a regular file. `flags` as of open(2); what is not a regular file is refused at once,
/// without waiting for a FIFO's other end or waking a device: ELOOP for a link, EINVAL for the
/// rest.
UniqueFd OpenRegular(int directory, const std::string& name, int flags, mode_t mode = 0600);

/// Whether the open file is still the one of that name (not replaced, renamed or deleted).
bool IsStillAt(int fd, int directory, const std::string& name);

/// Makes changes of names in the directory that holds `path` durable.
bool SyncDirectory(int directory);

enum class Replaced {
    kNo,       ///< the old file stands; errno tells why
    kYes,      ///< durable
    kNotSure,  ///< the new file is there, but a power failure may bring the old one back (errno)
};

/// Replaces the file by one of that content and mode, so that readers see the old or the new one
/// whole. It is written aside under "NAME.new" first; concurrent replacements take turns, and what
/// a killed one left is used by the next. Only for directories that others cannot write to.
Replaced ReplaceFile(int directory, const std::string& name, std::string_view content, mode_t mode);

/// The same for a path; its directory may be reached through links.
Replaced ReplaceFile(const std::string& path, std::string_view content, mode_t mode);

enum class LockAttempt {
    kTaken,
    kBusy,        ///< somebody else holds it
    kReplaced,    ///< the file was exchanged between opening and locking: try again at once
    kOpenFailed,  ///< errno tells why
    kLockFailed,  ///< errno tells why
};

/// Tries once, without waiting, to open a lock file and to take its flock. A missing file is made
/// with `mode`; an existing one is never opened with O_CREAT, which kernels refuse to root for
/// other users' files in sticky directories (fs.protected_regular).
LockAttempt TryLock(int directory, const std::string& name, bool exclusive, mode_t mode,
                    UniqueFd& fd);

}  // namespace quivra::base
