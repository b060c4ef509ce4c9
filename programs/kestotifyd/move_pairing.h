#pragma once

#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <unordered_map>

#include "programs/kestotifyd/change.h"

namespace kestotifyd {

/// An event as inotify delivers it.
struct InotifyEvent {
    int wd = -1;
    std::uint32_t mask = 0;
    std::uint32_t cookie = 0;
    std::string name{};
};

/// Puts the two halves of a move together. The kernel queues them one after the other, but what
/// other processors do may come between, and there is no second half when the object leaves the
/// watched directories. So everything behind a first half waits a moment for the second one, and
/// the move takes the place of the first half: whatever was queued later happened later. Pure.
class MovePairing {
  public:
    /// A second half that has not come by then is not coming.
    static constexpr std::chrono::milliseconds kWait{20};
    /// Above it a first half no longer waits.
    static constexpr std::size_t kMaxWaiting = 65536;

    struct Paired {
        InotifyEvent event;
        std::optional<InotifyEvent> moved_to{};  ///< set when event is a first half that was paired
    };

    void Push(InotifyEvent event, Time now);

    /// The next event in order; none when all are handed out or the first one still waits.
    std::optional<Paired> Pop(Time now);

    /// Whether so much waits that no more should be read.
    bool IsFull() const { return waiting_.size() > kMaxWaiting; }

    /// When the waiting first half gives up; none when nothing waits.
    std::optional<Time> NextDue() const;

  private:
    struct Waiting {
        InotifyEvent event;
        Time arrival;
        bool is_taken = false;  ///< handed out with its first half
    };

    std::deque<Waiting> waiting_;
    std::uint64_t first_index_ = 0;  ///< running number of waiting_.front()
    std::unordered_map<std::uint32_t, std::uint64_t> second_halves_;  ///< running number by cookie
};

}  // namespace kestotifyd
