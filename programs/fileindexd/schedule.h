#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <unordered_map>

namespace fileindexd {

using Clock = std::chrono::steady_clock;

/// When the next pass over a share's queue is due: at once for the first change of a calm share,
/// after the burst for what follows it. Keeps no clock of its own.
class Schedule {
  public:
    /// A burst is over after this time without a change, or this long after it began.
    static constexpr std::chrono::milliseconds kQuiet{200};
    static constexpr std::chrono::milliseconds kLongestBurst{2000};
    /// A pass that failed is repeated after kFirstRetry, then twice as long each time.
    static constexpr std::chrono::seconds kFirstRetry{1};
    static constexpr std::chrono::seconds kLastRetry{300};

    /// Something was queued.
    void QueueChanged(Clock::time_point now);
    /// Something was queued that can wait until `when`.
    void QueueChangedLater(Clock::time_point when);

    /// What was queued until now is about to be processed.
    void PassBegins();
    void PassSucceeded(Clock::time_point now);
    /// What was being processed still has to be.
    void PassFailed(Clock::time_point now);

    /// How long to wait after that many failures in a row, and one more.
    static std::chrono::seconds RetryAfter(int failures);

    /// None while there is nothing to do.
    std::optional<Clock::time_point> Due() const;
    bool HasFailed() const { return failures_ > 0; }

  private:
    struct Burst {
        Clock::time_point first;
        Clock::time_point last;
        bool is_first;  ///< of a calm share
    };

    std::optional<Burst> burst_;
    std::optional<Clock::time_point> later_;
    int failures_ = 0;
    Clock::time_point retry_{};
    std::optional<Clock::time_point> last_pass_;
};

/// Remembers which files change again and again, a log or a download for instance: each indexing
/// of such a file makes the next one wait longer, so that it is not extracted every second.
class ChangeRates {
  public:
    static constexpr std::chrono::seconds kShortestWait{2};
    static constexpr std::chrono::seconds kLongestWait{30};
    static constexpr std::size_t kMaxFiles = 4096;

    /// The file was indexed because it had changed.
    void Indexed(const std::string& path, Clock::time_point now);

    /// From when on a change of the file is to be indexed. Not later than `now` for a file that
    /// has been calm.
    Clock::time_point NotBefore(const std::string& path, Clock::time_point now) const;

  private:
    struct Rate {
        Clock::time_point indexed;
        std::chrono::seconds wait{0};  ///< 0: indexed once
    };
    static bool IsCalm(const Rate& rate, Clock::time_point now);
    void Forget(Clock::time_point now);

    std::unordered_map<std::string, Rate> rates_;
};

}  // namespace fileindexd
