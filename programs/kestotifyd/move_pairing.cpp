#include "programs/kestotifyd/move_pairing.h"

#include <sys/inotify.h>

#include <utility>

namespace kestotifyd {

void MovePairing::Push(InotifyEvent event, Time now) {
    // Noted by running number, because positions change with each event that is handed out.
    if ((event.mask & IN_MOVED_TO) != 0) {
        second_halves_[event.cookie] = first_index_ + waiting_.size();
    }
    waiting_.push_back({std::move(event), now});
}

std::optional<MovePairing::Paired> MovePairing::Pop(Time now) {
    while (!waiting_.empty()) {
        Waiting& front = waiting_.front();
        Paired result;
        if ((front.event.mask & IN_MOVED_FROM) != 0) {
            const auto second = second_halves_.find(front.event.cookie);
            if (second != second_halves_.end()) {
                Waiting& other = waiting_[second->second - first_index_];
                result.moved_to = std::move(other.event);
                other.is_taken = true;
                second_halves_.erase(second);
            } else if (now < front.arrival + kWait && waiting_.size() <= kMaxWaiting) {
                return std::nullopt;
            }
        } else if ((front.event.mask & IN_MOVED_TO) != 0 && !front.is_taken) {
            // Moved in from elsewhere, or its first half has given up. Cookies come again after a
            // while, so none may stay behind.
            second_halves_.erase(front.event.cookie);
        }
        const bool is_taken = front.is_taken;
        result.event = std::move(front.event);
        waiting_.pop_front();
        ++first_index_;
        if (!is_taken) {
            return result;
        }
    }
    return std::nullopt;
}

std::optional<Time> MovePairing::NextDue() const {
    // Whatever waits, waits behind the first half at the front.
    return waiting_.empty() ? std::nullopt : std::optional(waiting_.front().arrival + kWait);
}

}  // namespace kestotifyd
