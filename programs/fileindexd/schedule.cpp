#include "programs/fileindexd/schedule.h"

#include <algorithm>

namespace fileindexd {

void Schedule::QueueChanged(Clock::time_point now) {
    if (!burst_) {
        const bool is_calm = !last_pass_ || now - *last_pass_ >= kQuiet;
        burst_ = Burst{now, now, is_calm};
    }
    burst_->last = now;
}

void Schedule::QueueChangedLater(Clock::time_point when) {
    later_ = std::min(later_.value_or(when), when);
}

void Schedule::PassBegins() {
    burst_.reset();
    later_.reset();
}

void Schedule::PassSucceeded(Clock::time_point now) {
    failures_ = 0;
    last_pass_ = now;
}

void Schedule::PassFailed(Clock::time_point now) {
    retry_ = now + RetryAfter(failures_);
    ++failures_;
}

std::chrono::seconds Schedule::RetryAfter(int failures) {
    // 2^9 seconds are more than kLastRetry.
    return std::min(kFirstRetry * (1 << std::min(failures, 9)), kLastRetry);
}

std::optional<Clock::time_point> Schedule::Due() const {
    if (failures_ > 0) {
        return retry_;
    }
    if (burst_) {
        const Clock::time_point due =
            burst_->is_first ? burst_->first
                             : std::min(burst_->last + kQuiet, burst_->first + kLongestBurst);
        return std::min(due, later_.value_or(due));
    }
    return later_;
}

bool ChangeRates::IsCalm(const Rate& rate, Clock::time_point now) {
    return now - rate.indexed > 2 * std::max(rate.wait, kShortestWait);
}

void ChangeRates::Indexed(const std::string& path, Clock::time_point now) {
    const auto found = rates_.find(path);
    if (found != rates_.end() && !IsCalm(found->second, now)) {
        const std::chrono::seconds longer = std::max(2 * found->second.wait, kShortestWait);
        found->second = {now, std::min(longer, kLongestWait)};
        return;
    }
    if (rates_.size() >= kMaxFiles) {
        Forget(now);
    }
    rates_[path] = {now, std::chrono::seconds{0}};
}

void ChangeRates::Forget(Clock::time_point now) {
    std::erase_if(rates_, [&](const auto& entry) { return IsCalm(entry.second, now); });
    if (rates_.size() >= kMaxFiles) {
        rates_.clear();  // with so many files at work, none of them is the one that is too busy
    }
}

Clock::time_point ChangeRates::NotBefore(const std::string& path, Clock::time_point now) const {
    const auto found = rates_.find(path);
    return found == rates_.end() || IsCalm(found->second, now)
               ? now
               : found->second.indexed + found->second.wait;
}

}  // namespace fileindexd
