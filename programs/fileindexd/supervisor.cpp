#include "programs/fileindexd/supervisor.h"

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>

#include "common/log.h"

namespace fileindexd {

namespace {

constexpr const char* kUnit = "supervisor";

/// Starts the command. -1, with errno set, when there is no room for another process.
pid_t Spawn(const std::vector<std::string>& command) {
    std::vector<char*> arguments;
    for (const std::string& argument : command) {
        arguments.push_back(const_cast<char*>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    sigset_t none;
    sigemptyset(&none);
    const pid_t parent = getpid();
    const pid_t pid = fork();
    if (pid == 0) {
        // Only what is safe beside other threads, which hold locks that nobody will release here.
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        // The daemon may have died before that took effect.
        if (getppid() == parent) {
            sigprocmask(SIG_SETMASK, &none, nullptr);
            execv(arguments[0], arguments.data());
        }
        _exit(127);
    }
    return pid;
}

pid_t WaitFor(pid_t pid, int& status, int flags) {
    pid_t result;
    do {
        result = waitpid(pid, &status, flags);
    } while (result < 0 && errno == EINTR);
    return result;
}

}  // namespace

Supervisor::~Supervisor() {
    for (auto& [share, worker] : workers_) {
        if (worker.pid > 0) {
            int status = 0;
            kill(worker.pid, SIGKILL);
            WaitFor(worker.pid, status, 0);
        }
    }
}

void Supervisor::SetWanted(const std::set<std::string>& shares, Clock::time_point now) {
    for (const std::string& share : shares) {
        Worker& worker = workers_[share];
        if (!worker.wanted) {
            worker.wanted = true;
            worker.wait = kFirstRestart;
            worker.next_start = now;
        }
    }
    for (auto& [share, worker] : workers_) {
        if (worker.wanted && !shares.contains(share)) {
            worker.wanted = false;
            Stop(worker, now);
        }
    }
    Update(now);
}

void Supervisor::Stop(Worker& worker, Clock::time_point now) {
    if (worker.pid > 0 && !worker.kill_at) {
        kill(worker.pid, SIGTERM);
        worker.kill_at = now + kStopTimeout;
    }
}

void Supervisor::Update(Clock::time_point now) {
    for (auto& [share, worker] : workers_) {
        int status = 0;
        if (worker.pid > 0 && WaitFor(worker.pid, status, WNOHANG) == worker.pid) {
            NoteEnd(share, worker, status, now);
        }
        if (worker.pid > 0 && worker.kill_at && *worker.kill_at <= now) {
            quivra::LogError({kUnit, __LINE__}, "Killing the worker of share %s: it does not stop",
                             share.c_str());
            kill(worker.pid, SIGKILL);
            worker.kill_at = now + kStopTimeout;
        }
        if (worker.pid == 0 && worker.wanted && worker.next_start <= now) {
            Start(share, worker, now);
        }
    }
    std::erase_if(workers_,
                  [](const auto& entry) { return !entry.second.wanted && entry.second.pid == 0; });
}

void Supervisor::NoteEnd(const std::string& share, Worker& worker, int status,
                         Clock::time_point now) {
    const bool was_told = worker.kill_at.has_value();
    worker.pid = 0;
    worker.kill_at.reset();
    if (!worker.wanted && on_end_) {
        on_end_(share);
    }
    // Whoever was told to stop and is wanted again starts at once: it has not failed.
    if (was_told) {
        return;
    }
    if (now - worker.started >= kStable) {
        worker.wait = kFirstRestart;
    }
    worker.next_start = now + worker.wait;
    quivra::LogError({kUnit, __LINE__}, "The worker of share %s ended (%s %d); next start in %d s",
                     share.c_str(), WIFSIGNALED(status) ? "signal" : "status",
                     WIFSIGNALED(status) ? WTERMSIG(status) : WEXITSTATUS(status),
                     static_cast<int>(worker.wait.count()));
    worker.wait = std::min(2 * worker.wait, kLastRestart);
}

void Supervisor::Start(const std::string& share, Worker& worker, Clock::time_point now) {
    const pid_t pid = Spawn(command_of_(share));
    if (pid < 0) {
        quivra::LogError({kUnit, __LINE__}, "Cannot start the worker of share %s", share.c_str());
        worker.next_start = now + kFirstRestart;
        return;
    }
    worker.pid = pid;
    worker.started = now;
}

std::optional<Supervisor::Clock::time_point> Supervisor::NextUpdate() const {
    std::optional<Clock::time_point> next;
    const auto consider = [&](Clock::time_point when) {
        next = std::min(next.value_or(when), when);
    };
    for (const auto& [share, worker] : workers_) {
        if (worker.kill_at) {
            consider(*worker.kill_at);
        } else if (worker.pid == 0 && worker.wanted) {
            consider(worker.next_start);
        }
    }
    return next;
}

bool Supervisor::IsWanted(const std::string& share) const {
    const auto found = workers_.find(share);
    return found != workers_.end() && found->second.wanted;
}

bool Supervisor::IsRunning(const std::string& share) const {
    return PidOf(share) > 0;
}

bool Supervisor::IsAnyRunning() const {
    return std::any_of(workers_.begin(), workers_.end(),
                       [](const auto& entry) { return entry.second.pid > 0; });
}

pid_t Supervisor::PidOf(const std::string& share) const {
    const auto found = workers_.find(share);
    return found == workers_.end() ? 0 : found->second.pid;
}

}  // namespace fileindexd
