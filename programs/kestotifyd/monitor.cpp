#include "programs/kestotifyd/monitor.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "common/error.h"
#include "common/log.h"
#include "programs/daemon/instance_lock.h"
#include "programs/daemon/program.h"
#include "programs/kestotifyd/registration.h"

#include <kesto/filesystem.h>

namespace kestotifyd {
namespace {

constexpr char kStateSocket[] = "/var/run/kestotifyd.sock";
constexpr std::chrono::milliseconds kLongestStop{950};

[[noreturn]] void FailSystemCall(int line, const char* call) {
    const std::string reason =
        std::string(call) + " failed, reason=" + quivra::SystemErrorText(errno);
    quivra::Fail({"monitor", line}, call, quivra::Error(quivra::Error::kSystemCallFailed, reason));
}

std::string MakeDirectory(const std::string& path) {
    std::error_code error;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), error);
    if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
        FailSystemCall(__LINE__, ("mkdir " + path).c_str());
    }
    errno = 0;
    return path;
}

void Drain(int fd) {
    alignas(inotify_event) std::array<char, 16384> buffer;
    while (read(fd, buffer.data(), buffer.size()) > 0) {
    }
    errno = 0;
}

}  // namespace

Monitor::Monitor(const Options& options)
    : options_(options),
      instance_lock_(quivra::daemon::TakeInstanceLock(
          MakeDirectory(options.common.state_directory) + "/lock")),
      epoll_(epoll_create1(EPOLL_CLOEXEC)),
      registration_events_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)),
      watched_(options.common.state_directory + "/watched.json"),
      queues_(watched_,
              [](const std::string& name) { return KESTOEAIsHiddenDir(name.c_str()) == 1; }) {
    MakeDirectory(options_.registrations);
    if (!epoll_.IsValid()) {
        FailSystemCall(__LINE__, "epoll_create1");
    }
    if (!registration_events_.IsValid() ||
        inotify_add_watch(registration_events_.Get(), options_.registrations.c_str(),
                          IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE) < 0) {
        FailSystemCall(__LINE__, "inotify_add_watch");
    }
    WatchDescriptor(signals_.Fd(), EPOLLIN);
    WatchDescriptor(registration_events_.Get(), EPOLLIN);
    if (mounts_.Fd() >= 0) {
        WatchDescriptor(mounts_.Fd(), EPOLLPRI);
    }
    try {
        state_server_ = std::make_unique<StateServer>(kStateSocket);
        WatchDescriptor(state_server_->Fd(), EPOLLIN);
    } catch (const quivra::Error&) {
        // Logged where it failed. Who asks sees no monitor then, but no change is missed.
    }
}

Monitor::~Monitor() = default;

void Monitor::WatchDescriptor(int fd, std::uint32_t events) {
    epoll_event event{};
    event.events = events;
    event.data.fd = fd;
    if (epoll_ctl(epoll_.Get(), EPOLL_CTL_ADD, fd, &event) != 0) {
        FailSystemCall(__LINE__, "epoll_ctl");
    }
}

void Monitor::Run() {
    LoadRegistrations(true);
    service_manager_.Ready();
    while (true) {
        service_manager_.Turn(Clock::now());
        std::array<epoll_event, 8> events;
        const int count =
            epoll_wait(epoll_.Get(), events.data(), events.size(), WaitMilliseconds(Clock::now()));
        const bool is_check_due = Clock::now() >= next_check_;
        bool has_registrations = is_check_due && are_registrations_due_;
        bool has_mounts = is_check_due && are_mounts_due_;
        bool is_asked = false;
        for (int i = 0; i < count; ++i) {
            const int fd = events.at(static_cast<std::size_t>(i)).data.fd;
            if (fd == signals_.Fd()) {
                const quivra::daemon::Signals::News news = signals_.Read();
                if (news.stop) {
                    Stop();
                    return;
                }
                has_registrations |= news.reload;
            }
            has_mounts |= fd == mounts_.Fd();
            has_registrations |= fd == registration_events_.Get();
            is_asked |= state_server_ && fd == state_server_->Fd();
        }
        if (has_mounts) {
            HandleMountChange();
        }
        // Changes come before the registrations that were made after them.
        WorkBackends(false);
        if (has_registrations) {
            Drain(registration_events_.Get());
            LoadRegistrations(false);
        }
        if (are_roots_stale_ || Clock::now() >= next_check_) {
            CheckRoots();
        }
        queues_.Flush(Clock::now());
        // Last, so that the reply tells what this turn has led to.
        if (is_asked) {
            state_server_->Reply(State());
        }
    }
}

int Monitor::WaitMilliseconds(Time now) const {
    Time due = next_check_;
    for (const std::optional<Time>& other :
         {queues_.NextDue(), inotify_ ? inotify_->NextDue() : std::nullopt,
          fanotify_ ? fanotify_->NextDue() : std::nullopt}) {
        due = std::min(due, other.value_or(due));
    }
    return service_manager_.PollTimeout(due, now);
}

/// What is not written by then is found by the reindex that every start brings.
void Monitor::Stop() {
    const Time deadline = Clock::now() + quivra::daemon::kStopGrace;
    quivra::daemon::EndAtLatest(kLongestStop);  // a file system may not answer
    service_manager_.Stopping();
    WorkBackends(true);
    queues_.FlushAll(deadline);
}

void Monitor::WorkBackends(bool is_last) {
    for (Backend* const backend : {inotify_.get(), fanotify_.get()}) {
        if (backend != nullptr) {
            backend->Work(is_last);
        }
    }
}

/// All files are read each time: they are few, and an event need not tell which of them it was.
void Monitor::LoadRegistrations(bool is_start) {
    const Registrations read = ReadRegistrations(options_.registrations);
    registration_problem_ = read.problem;
    are_registrations_due_ = !read.is_whole;
    if (are_registrations_due_ && !is_start) {
        next_check_ = Clock::now() + kCheckInterval;
        return;  // what is watched stays watched
    }
    queues_.Update(read.list, is_start, Clock::now());
    UpdateRoots();
    CheckRoots();
    for (const auto& [path, root] : roots_) {
        if (root.is_complete) {
            queues_.PayFolders(path, Clock::now());
        }
    }
}

void Monitor::OnChange(const Change& change) {
    const Time now = Clock::now();
    last_event_ = now;
    queues_.Apply(change, now);
    // A back end that watches a whole file system does not know whether that was a root, or above
    // one.
    const bool is_move =
        change.kind == Change::Kind::kDeleted || change.kind == Change::Kind::kRenamed;
    are_roots_stale_ |=
        is_move && change.is_dir && (HoldsRoot(change.path) || HoldsRoot(change.path_old));
}

void Monitor::OnGaps(const std::string& root) {
    queues_.OweCrashMarker(root);
}

void Monitor::OnOverflow(const std::string& root) {
    queues_.OweCrashMarker(root);
}

}  // namespace kestotifyd
