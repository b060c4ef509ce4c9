#pragma once

#include <chrono>
#include <string_view>

#include "base/unique_fd.h"

namespace quivra::daemon {

/// Tells systemd how the daemon is, by its notification protocol: a datagram of "NAME=VALUE" on the
/// socket that NOTIFY_SOCKET names. Where nobody asked for that, every call does nothing.
class ServiceManager {
  public:
    using Clock = std::chrono::steady_clock;

    /// Takes what concerns it out of the environment, so that no child process speaks in this one's
    /// name. To be made before any thread starts.
    ServiceManager();

    /// The daemon serves: what is ordered after it may start.
    void Ready() const { Send("READY=1"); }
    void Stopping() const { Send("STOPPING=1"); }

    /// To be called on every turn of the main loop, and by nobody else: it is how the service
    /// manager learns that the loop turns. Sends no more often than needed.
    void Turn(Clock::time_point now);

    /// When Turn must be called at the latest; time_point::max() where nobody watches.
    Clock::time_point NextTurn() const { return next_beat_; }

    /// The timeout for poll(2) until `due` (time_point::max(): none) or the next turn.
    int PollTimeout(Clock::time_point due, Clock::time_point now) const;

  private:
    void Send(std::string_view state) const;

    base::UniqueFd socket_;
    Clock::duration interval_{};  ///< between two beats; 0: nobody watches
    Clock::time_point next_beat_ = Clock::time_point::max();
};

}  // namespace quivra::daemon
