#include "programs/fileindexd/worker.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <functional>
#include <memory>

#include "common/log.h"
#include "programs/daemon/program.h"
#include "programs/fileindexd/queue_watch.h"
#include "programs/fileindexd/repair.h"
#include "programs/fileindexd/share_worker.h"

namespace fileindexd {

using quivra::Error;

namespace {

constexpr const char* kUnit = "worker";

// From <linux/ioprio.h>, which some kernel versions ship in a form that is no C++.
constexpr int kIoPriorityWhoProcess = 1;
constexpr int kIoPriorityIdle = 3 << 13;

/// How often a worker without anything to do looks whether its place is still right, and the index
/// still the one it knows. The search daemon is asked less often.
constexpr std::chrono::seconds kPlaceCheck{5};
constexpr std::chrono::seconds kIndexCheck{15};
/// How often one whose place is not right looks again.
constexpr std::chrono::seconds kPlaceRetry{2};

volatile std::sig_atomic_t stop_requested = 0;
volatile std::sig_atomic_t retry_requested = 0;
int wake_event = -1;

void Wake() {
    const int error = errno;
    const std::uint64_t one = 1;
    if (write(wake_event, &one, sizeof(one)) < 0) {
        // It is readable already.
    }
    errno = error;
}

extern "C" void RequestStop(int) {
    stop_requested = 1;
    quivra::daemon::EndAtLatest(quivra::daemon::kStopGrace);
    Wake();
}

extern "C" void RequestRetry(int) {
    retry_requested = 1;
    Wake();
}

/// SIGTERM and SIGINT are noticed between two operations and end a wait. Where neither comes soon,
/// in a read from a disk that does not answer or in the search client's sleep of a quarter of an
/// hour, the process ends in the middle: a pass may be carried out twice.
void CatchSignals() {
    wake_event = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    struct sigaction action {};
    action.sa_handler = RequestStop;
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT}) {
        sigaddset(&signals, signal);
        sigaction(signal, &action, nullptr);
    }
    action.sa_handler = RequestRetry;
    sigaddset(&signals, kRetrySignal);
    sigaction(kRetrySignal, &action, nullptr);
    sigprocmask(SIG_UNBLOCK, &signals, nullptr);
    // The daemon reads the settings again, and tells whom they concern.
    std::signal(SIGHUP, SIG_IGN);
}

/// Indexing takes what others leave.
void LowerPriority() {
    setpriority(PRIO_PROCESS, 0, 15);
    syscall(SYS_ioprio_set, kIoPriorityWhoProcess, 0, kIoPriorityIdle);
}

/// For poll(2).
int Milliseconds(Clock::duration left) {
    const auto wait = std::chrono::ceil<std::chrono::milliseconds>(left).count();
    return static_cast<int>(std::clamp<std::int64_t>(wait, 0, 3'600'000));
}

class Worker {
  public:
    explicit Worker(const std::string& share) : share_(share), work_(share) {}

    int Run() {
        while (stop_requested == 0) {
            if (!EnsurePlace()) {
                WaitFor(kPlaceRetry, false);
                continue;
            }
            ShowState();
            Wait();
            ReadNews();
            if (watch_ && stop_requested == 0) {
                DoSomething();
            }
        }
        return 0;
    }

  private:
    /// Opens the share's place, and whatever depends on it.
    bool EnsurePlace() {
        if (watch_) {
            return true;
        }
        try {
            work_.Open();
            watch_ = std::make_unique<QueueWatch>(work_.Directory(), work_.QueueName());
            Repair();
            schedule_.QueueChanged(Clock::now());  // what was queued, or left, before
            was_told_.clear();
            return true;
        } catch (const PlaceProblem& problem) {
            work_.State().SetProblem(problem.what());
            Tell(problem.what());
        } catch (const std::exception& error) {
            work_.State().SetLastError(error.what());
            work_.State().Set(StateFile::State::kWaiting);
            Tell(error.what());
        }
        return false;
    }

    /// Once, not every two seconds.
    void Tell(const std::string& sentence) {
        if (was_told_ != sentence) {
            was_told_ = sentence;
            quivra::LogError({kUnit, __LINE__}, "Share %s waits: %s", share_.c_str(),
                             sentence.c_str());
        }
    }

    void LeavePlace() {
        watch_.reset();
        work_.Close();
    }

    void ShowState() {
        if (!schedule_.HasFailed()) {
            work_.State().Set(schedule_.Due() ? StateFile::State::kSettling
                                              : StateFile::State::kIdle);
        }
    }

    /// While something is pending, news are not waited for but looked at a few times a second, so
    /// that a storm of changes does not wake the worker for each.
    void Wait() {
        if (const auto due = schedule_.Due()) {
            const auto longest = schedule_.HasFailed() ? Clock::duration(Schedule::kLastRetry)
                                                       : Clock::duration(Schedule::kQuiet);
            // What is settling leaves time for a slice of older work.
            const bool has_slice = !schedule_.HasFailed() && IsSliceDue();
            WaitFor(has_slice ? Clock::duration(0) : std::min(*due - Clock::now(), longest), false);
        } else if (const auto slice = work_.NextSlice()) {
            WaitFor(
                std::min<Clock::duration>(
                    std::max<Clock::duration>(*slice, slices_again_ - Clock::now()), kPlaceCheck),
                true);
        } else {
            WaitFor(kPlaceCheck, true);
        }
    }

    void WaitFor(Clock::duration longest, bool for_news) const {
        pollfd descriptors[] = {{wake_event, POLLIN, 0}, {watch_ ? watch_->Fd() : -1, POLLIN, 0}};
        poll(descriptors, for_news ? 2 : 1, Milliseconds(longest));
        std::uint64_t count = 0;
        if (read(wake_event, &count, sizeof(count)) < 0) {
            errno = 0;  // nobody has woken us
        }
    }

    void ReadNews() {
        const QueueWatch::News news = watch_->Read();
        if (news.gone) {
            LeavePlace();
            return;
        }
        if (news.status) {
            Repair();
        }
        if (news.queue) {
            watch_->ReadNewLines(schedule_, rates_, Clock::now());
        }
        if (retry_requested != 0) {
            retry_requested = 0;
            Try([this] { work_.RetryFailures(); });
        }
    }

    bool IsSliceDue() {
        const auto slice = work_.NextSlice();
        return slice && slice->count() == 0 && Clock::now() >= slices_again_;
    }

    /// One that failed waits as a pass does; fresh changes need not wait for it.
    void RunSlice() {
        bool has_worked = false;
        if (Try([&] { has_worked = work_.RunSlice(StopWhenAsked).has_worked; })) {
            slice_failures_ = 0;
            if (!has_worked) {
                // Another process has left a working copy, which comes first.
                slices_again_ = Clock::now() + Schedule::kFirstRetry;
                schedule_.QueueChangedLater(slices_again_);
            }
        } else {
            slices_again_ = Clock::now() + Schedule::RetryAfter(slice_failures_++);
        }
    }

    /// One thing, by its rank: a pass that is due, a slice of the backlog, a look around.
    void DoSomething() {
        const auto due = schedule_.Due();
        if (due && *due <= Clock::now()) {
            RunPass();
        } else if (!schedule_.HasFailed() && IsSliceDue()) {
            RunSlice();
        } else if (!due) {
            LookAround();
        }
    }

    /// Whether everything is still where it was.
    void LookAround() {
        const auto now = Clock::now();
        if (now < next_place_check_) {
            return;
        }
        next_place_check_ = now + kPlaceCheck;
        Try([this] { work_.Open(); });
        if (watch_ && now >= next_index_check_) {
            next_index_check_ = now + kIndexCheck;
            Try([this] { work_.CheckIndex(); });
        }
    }

    static void StopWhenAsked() {
        if (stop_requested != 0) {
            throw Stopped();
        }
    }

    void RunPass() {
        schedule_.PassBegins();
        watch_->Forget();
        const bool has_succeeded = Try([this] {
            const PassResult result = work_.RunPass(StopWhenAsked);
            schedule_.PassSucceeded(Clock::now());
            for (const std::string& path : result.changed) {
                rates_.Indexed(path, Clock::now());
            }
            Repair();
        });
        if (!has_succeeded) {
            schedule_.PassFailed(Clock::now());
        }
        // What came during the pass, or stood behind the copy of an interrupted one: the events
        // about it may have been read before the pass began.
        if (watch_) {
            watch_->ReadNewLines(schedule_, rates_, Clock::now());
        }
    }

    /// Whether it could be done.
    bool Try(const std::function<void()>& work) {
        try {
            work();
            was_told_.clear();
            return true;
        } catch (const Stopped&) {
            return true;  // the next worker carries on
        } catch (const std::exception& error) {
            Tell(error.what());
        }
        if (watch_ && !work_.IsOpen()) {
            LeavePlace();
        }
        return false;
    }

    void Repair() {
        try {
            RepairIfNeeded(share_);
        } catch (const std::exception& error) {
            quivra::LogError({kUnit, __LINE__}, "Share %s cannot be repaired: %s", share_.c_str(),
                             error.what());
        }
    }

    const std::string share_;
    ShareWorker work_;
    std::unique_ptr<QueueWatch> watch_;  ///< set while the place is open
    Schedule schedule_;
    ChangeRates rates_;
    std::string was_told_;
    int slice_failures_ = 0;
    Clock::time_point slices_again_{};
    Clock::time_point next_place_check_{};
    Clock::time_point next_index_check_{};
};

}  // namespace

int RunWorker(const std::string& share) {
    CatchSignals();
    LowerPriority();
    try {
        return Worker(share).Run();
    } catch (const std::exception& error) {
        quivra::LogError({kUnit, __LINE__}, "The worker of share %s failed: %s", share.c_str(),
                         error.what());
        return 1;
    }
}

}  // namespace fileindexd
