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

#include "common/log.h"
#include "programs/daemon/program.h"
#include "programs/fileindexd/queue_watch.h"
#include "programs/fileindexd/repair.h"
#include "programs/fileindexd/share_worker.h"
#include "sdk/share.h"

namespace fileindexd {

using quivra::Error;

namespace {

constexpr const char* kUnit = "worker";

// From <linux/ioprio.h>, which some kernel versions ship in a form that is no C++.
constexpr int kIoPriorityWhoProcess = 1;
constexpr int kIoPriorityIdle = 3 << 13;

volatile std::sig_atomic_t stop_requested = 0;
int stop_event = -1;

extern "C" void RequestStop(int) {
    const int error = errno;
    stop_requested = 1;
    quivra::daemon::EndAtLatest(quivra::daemon::kStopGrace);
    const std::uint64_t one = 1;
    if (write(stop_event, &one, sizeof(one)) < 0) {
        // It is readable already.
    }
    errno = error;
}

/// SIGTERM and SIGINT are noticed between two operations and end a wait. Where neither comes soon,
/// in a read from a disk that does not answer or in the search client's sleep of a quarter of an
/// hour, the process ends in the middle: a pass may be carried out twice.
void CatchStopSignals() {
    stop_event = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    struct sigaction action {};
    action.sa_handler = RequestStop;
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT}) {
        sigaddset(&signals, signal);
        sigaction(signal, &action, nullptr);
    }
    sigprocmask(SIG_UNBLOCK, &signals, nullptr);
    // The daemon reads the settings again, and tells whom they concern.
    std::signal(SIGHUP, SIG_IGN);
}

/// Indexing takes what others leave.
void LowerPriority() {
    setpriority(PRIO_PROCESS, 0, 15);
    syscall(SYS_ioprio_set, kIoPriorityWhoProcess, 0, kIoPriorityIdle);
}

class Worker {
  public:
    explicit Worker(const std::string& share)
        : share_(share), watch_(quivra::sdk::SDKShare(share).GetQueuePath()), work_(share) {}

    int Run() {
        Repair();
        schedule_.QueueChanged(Clock::now());  // what was queued, or left, before
        while (stop_requested == 0) {
            ShowState();
            Wait();
            const QueueWatch::News news = watch_.Read();
            if (news.gone) {
                quivra::LogError({kUnit, __LINE__}, "The queue's directory of share %s has gone",
                                 share_.c_str());
                return 1;
            }
            if (news.status) {
                Repair();
            }
            if (news.queue) {
                watch_.ReadNewLines(schedule_, rates_, Clock::now());
            }
            const auto due = schedule_.Due();
            if (due && *due <= Clock::now() && stop_requested == 0) {
                RunPass();
            }
        }
        return 0;
    }

  private:
    void ShowState() {
        if (!schedule_.HasFailed()) {
            work_.State().Set(schedule_.Due() ? StateFile::State::kSettling
                                              : StateFile::State::kIdle);
        }
    }

    /// While something is pending, news are not waited for but looked at a few times a second, so
    /// that a storm of changes does not wake the worker for each.
    void Wait() const {
        pollfd descriptors[] = {{stop_event, POLLIN, 0}, {watch_.Fd(), POLLIN, 0}};
        const auto due = schedule_.Due();
        if (!due) {
            poll(descriptors, 2, -1);
            return;
        }
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(*due - Clock::now());
        const auto longest = schedule_.HasFailed() ? std::chrono::milliseconds(Schedule::kLastRetry)
                                                   : Schedule::kQuiet;
        const auto timeout = std::clamp(left, std::chrono::milliseconds(0), longest);
        poll(descriptors, 1, static_cast<int>(timeout.count()));
    }

    void RunPass() {
        schedule_.PassBegins();
        watch_.Forget();
        try {
            const PassResult result = work_.RunPass([] {
                if (stop_requested != 0) {
                    throw Stopped();
                }
            });
            schedule_.PassSucceeded();
            for (const std::string& path : result.changed) {
                rates_.Indexed(path, Clock::now());
            }
            Repair();
        } catch (const Stopped&) {
            return;  // the working copy is carried on by the next worker
        } catch (const std::exception& error) {
            schedule_.PassFailed(Clock::now());
            quivra::LogError({kUnit, __LINE__}, "The pass over share %s failed: %s", share_.c_str(),
                             error.what());
        }
        // What came during the pass, or stood behind the copy of an interrupted one.
        watch_.ReadNewLines(schedule_, rates_, Clock::now());
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
    QueueWatch watch_;
    ShareWorker work_;
    Schedule schedule_;
    ChangeRates rates_;
};

}  // namespace

int RunWorker(const std::string& share) {
    CatchStopSignals();
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
