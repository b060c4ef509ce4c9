#pragma once

#include <cerrno>
#include <cstddef>
#include <optional>
#include <string>

#include "programs/kestotifyd/change.h"

namespace kestotifyd {

/// What a back end tells the monitor. Roots are named by their path.
class BackendSink {
  public:
    virtual ~BackendSink() = default;

    virtual void OnChange(const Change& change) = 0;

    /// Every directory below the root is watched from here on, but for those that OnGaps told of.
    virtual void OnRootComplete(const std::string& root) = 0;

    /// Some directories below the root could not be watched: what happens there is lost.
    virtual void OnGaps(const std::string& root) = 0;

    /// The root is not at its path any more, and the back end has dropped it.
    virtual void OnRootLost(const std::string& root) = 0;

    /// Events below the root were lost. A back end that must look for unwatched directories calls
    /// OnRootComplete once more when it has.
    virtual void OnOverflow(const std::string& root) = 0;

    /// Whether the directory's contents are of interest to any queue. No for a mount point: what
    /// is mounted there is a root of its own.
    virtual bool ShouldWatch(const std::string& directory) const = 0;
};

/// A way to learn what happens below directories. All calls come from one thread; none blocks.
class Backend {
  public:
    virtual ~Backend() = default;

    /// To wait for until it is readable.
    virtual int Fd() const = 0;

    /// Starts to watch a directory tree. False, with errno set and nothing watched, when that
    /// cannot be. The sink's OnRootComplete follows, from Work.
    virtual bool AddRoot(const std::string& path) = 0;
    virtual void RemoveRoot(const std::string& path) = 0;

    /// Looks for directories below the root that are not watched and should be. OnRootComplete
    /// follows again.
    virtual void Rescan(const std::string& path) = 0;

    /// Takes the events that are there and goes on with a piece of pending work, telling the sink.
    /// With `is_last` nothing waits for more to come.
    virtual void Work(bool is_last) = 0;

    /// How much of a root is watched.
    struct Coverage {
        std::size_t watched = 0;    ///< directories; with one mark for a file system: 1
        std::size_t unwatched = 0;  ///< directories that were refused; what is below them is not
                                    ///< counted
        std::string problem{};      ///< why, and what to do, in one sentence
    };
    virtual Coverage CoverageOf(const std::string& root) const = 0;

    /// How often the kernel's queue has run over.
    std::size_t Overflows() const { return overflows_; }

    /// When Work wants to be called although nothing is readable; none when it does not.
    virtual std::optional<Time> NextDue() const = 0;

  protected:
    std::size_t overflows_ = 0;
};

/// Whether a system call failed for want of something that may be free again later, and not
/// because of the object.
inline bool IsShortage(int error_number) {
    return error_number == EMFILE || error_number == ENFILE || error_number == ENOMEM ||
           error_number == ENOSPC;
}

}  // namespace kestotifyd
