#pragma once

#include <initializer_list>

#include "base/unique_fd.h"

namespace quivra::daemon {

/// The signals that a daemon's main loop obeys, as a descriptor to wait for: no handler runs in the
/// middle of anything.
class Signals {
  public:
    struct News {
        bool stop = false;    ///< SIGTERM, SIGINT
        bool reload = false;  ///< SIGHUP: read the configuration again, or ignore it
        bool other = false;   ///< one of `also`
    };

    /// Blocks the signals, and those of `also`, in this thread and those that it starts: make it
    /// before any thread. Throws Error 502 when there is no descriptor.
    explicit Signals(std::initializer_list<int> also = {});

    /// Readable when there is news.
    int Fd() const { return fd_.Get(); }
    /// What has come since the last call; never waits.
    News Read() const;

  private:
    base::UniqueFd fd_;
};

}  // namespace quivra::daemon
