#pragma once

#include <string>

#include "base/unique_fd.h"

namespace quivra::base {

/// A directory of ours inside a place where users may write, held by descriptor.
///
/// A share's "@eaDir" lies in a directory that users may write to, so they may rename it and put
/// their own in its place at any time. What was opened here is worked with through the descriptor
/// only: opened, created, locked, renamed and unlinked relative to it, never by its path again.
///
/// Binding "@eaDir" onto itself, so that its renaming fails with EBUSY, was tried as a seat belt
/// and left out: the bind of a daemon that systemd gave a namespace of its own holds nobody else, a
/// process in an older namespace renames it all the same, and the volume cannot be unmounted, nor
/// the share removed, while it stands.
class PrivateDirectory {
  public:
    enum class Make {
        kNo,
        kMissing,  ///< make the missing steps of ours, below a root that exists
    };

    PrivateDirectory() = default;

    /// Opens the directory at the canonical path. No component may be a link. The components from
    /// "@eaDir" on, or the last one where there is none of that name, are ours: each must be a
    /// directory that root or the effective user owns and that nobody else may write to. A step
    /// that is made gets mode 0700 ("@eaDir" itself 0755), whatever umask and default ACLs say.
    ///
    /// Where that fails the result is not valid. Problem() says in one sentence what was found
    /// where, and what to do, when something stands in the way that somebody has to remove;
    /// otherwise it is empty and errno tells why (ENOENT, EMFILE, ...).
    static PrivateDirectory Open(const std::string& path, Make make = Make::kNo);

    bool IsValid() const { return fd_.IsValid(); }
    int Fd() const { return fd_.Get(); }
    const std::string& Path() const { return path_; }
    const std::string& Problem() const { return problem_; }

    /// Whether the path still leads to this directory, which need not be so: that is reason to stop
    /// work until it does again. False with errno set, or with a problem as of Open.
    bool IsStillThere();

  private:
    bool Step(UniqueFd& at, const std::string& name, const std::string& path, Make make);
    bool CheckOurs(int fd, const std::string& path);

    std::string path_;
    std::string problem_;
    UniqueFd fd_;
};

}  // namespace quivra::base
