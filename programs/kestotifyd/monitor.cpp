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
#include <utility>
#include <vector>

#include "base/path.h"
#include "common/error.h"
#include "common/log.h"

#include "programs/daemon/instance_lock.h"
#include "programs/daemon/program.h"
#include "programs/kestotifyd/fanotify_backend.h"
#include "programs/kestotifyd/inotify_backend.h"
#include "programs/kestotifyd/registration.h"

#include <kesto/filesystem.h>

namespace kestotifyd {
namespace {

/// A folder's disappearance or return that no event tells of is noticed this late at most.
constexpr std::chrono::seconds kCheckInterval{3};
constexpr std::chrono::milliseconds kStopTime = quivra::daemon::kStopGrace;

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

bool IsEmptyDirectory(const std::string& path) {
    std::error_code error;
    return std::filesystem::is_empty(path, error) && !error;
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
        bool has_registrations = false;
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
            if (fd == mounts_.Fd()) {
                HandleMountChange();
            }
            has_registrations |= fd == registration_events_.Get();
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

void Monitor::Stop() {
    service_manager_.Stopping();
    WorkBackends(true);
    queues_.FlushAll(Clock::now() + kStopTime);
}

void Monitor::WorkBackends(bool is_last) {
    for (Backend* const backend : {inotify_.get(), fanotify_.get()}) {
        if (backend != nullptr) {
            backend->Work(is_last);
        }
    }
}

void Monitor::LoadRegistrations(bool is_start) {
    std::vector<Registration> registrations;
    for (auto& [file, registration] : ReadRegistrations(options_.registrations)) {
        registrations.push_back(std::move(registration));
    }
    queues_.Update(registrations, is_start, Clock::now());
    UpdateRoots();
    CheckRoots();
    for (const auto& [path, root] : roots_) {
        if (root.is_complete) {
            queues_.PayFolders(path, Clock::now());
        }
    }
}

void Monitor::HandleMountChange() {
    mounts_.Reload();
    UpdateRoots();
    CheckRoots();
    // What a mount had covered lies open again, and has not been looked into.
    for (const std::string& removed : mounts_.TakeRemoved()) {
        for (const auto& [path, root] : roots_) {
            if (root.backend != nullptr && path != removed &&
                quivra::base::IsAtOrBelow(removed, path)) {
                root.backend->Rescan(path);
            }
        }
    }
}

/// The registered folders, and what is mounted below them.
void Monitor::UpdateRoots() {
    wanted_roots_ = queues_.OutermostFolders();
    for (const std::string& folder : std::set<std::string>(wanted_roots_)) {
        for (const std::string& mounted : mounts_.Below(folder)) {
            if (queues_.Covers(mounted)) {
                wanted_roots_.insert(mounted);
            }
        }
    }
    for (const std::string& path : wanted_roots_) {
        roots_.try_emplace(path);
    }
}

/// A root that another one is to replace goes only when that one is complete, so that no moment
/// passes unwatched.
void Monitor::DropObsoleteRoots() {
    if (std::any_of(roots_.begin(), roots_.end(), [](const auto& entry) {
            return entry.second.backend != nullptr && !entry.second.is_complete;
        })) {
        return;
    }
    std::erase_if(roots_, [&](const auto& entry) {
        const auto& [path, root] = entry;
        if (wanted_roots_.contains(path)) {
            return false;
        }
        if (root.backend != nullptr) {
            root.backend->RemoveRoot(path);
        }
        return true;
    });
}

void Monitor::CheckRoots() {
    are_roots_stale_ = false;
    next_check_ = Clock::now() + kCheckInterval;
    std::vector<std::string> lost;
    for (auto& [path, root] : roots_) {
        struct stat status {};
        const bool exists = stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
        if (root.backend != nullptr &&
            (!exists || status.st_dev != root.device || status.st_ino != root.inode)) {
            lost.push_back(path);
        }
    }
    for (const std::string& path : lost) {
        roots_.at(path).backend->RemoveRoot(path);
        OnRootLost(path);
    }
    for (auto& [path, root] : roots_) {
        if (root.backend == nullptr && wanted_roots_.contains(path) && IsPresent(path)) {
            StartRoot(path, root);
        }
    }
    DropObsoleteRoots();
}

/// An empty folder whose file system was mounted elsewhere when it was last watched is the place
/// where a volume is missing: taking it for the folder would drop everything from the index.
bool Monitor::IsPresent(const std::string& path) const {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) {
        return false;
    }
    const std::string expected = watched_.MountPoint(path);
    return expected.empty() || mounts_.Covering(path) == expected || !IsEmptyDirectory(path);
}

void Monitor::StartRoot(const std::string& path, Root& root) {
    struct stat status {};
    Backend* const backend = stat(path.c_str(), &status) == 0 ? AddToBackend(path) : nullptr;
    if (backend == nullptr) {
        if (!std::exchange(root.is_failure_logged, true)) {
            quivra::LogError({"monitor", __LINE__}, "The folder %s cannot be watched",
                             path.c_str());
        }
        return;
    }
    root = {backend, false, status.st_dev, status.st_ino, mounts_.Covering(path), false};
    if (options_.common.is_verbose) {
        quivra::LogTrace({"monitor", __LINE__}, "Watching %s with %s", path.c_str(),
                         backend == fanotify_.get() ? "fanotify" : "inotify");
    }
}

/// The back end that took the folder; null when none could.
Backend* Monitor::AddToBackend(const std::string& path) {
    BackendSink& sink = *this;
    if (options_.backend != BackendChoice::kInotify) {
        if (!fanotify_ && (fanotify_ = FanotifyBackend::Create(sink))) {
            WatchDescriptor(fanotify_->Fd(), EPOLLIN);
        }
        if (fanotify_ && fanotify_->AddRoot(path)) {
            return fanotify_.get();
        }
        if (options_.backend == BackendChoice::kFanotify) {
            return nullptr;
        }
    }
    if (!inotify_) {
        inotify_ = std::make_unique<InotifyBackend>(sink, options_.max_watches);
        WatchDescriptor(inotify_->Fd(), EPOLLIN);
    }
    return inotify_->AddRoot(path) ? inotify_.get() : nullptr;
}

void Monitor::OnChange(const Change& change) {
    queues_.Apply(change, Clock::now());
}

void Monitor::OnRootComplete(const std::string& path) {
    Root& root = roots_.at(path);
    root.is_complete = true;
    are_roots_stale_ = true;  // one that it replaces may go now
    watched_.SetMountPoint(path, root.mount_point);
    watched_.Save();
    queues_.OnRootComplete(path, Clock::now());
}

void Monitor::OnGaps(const std::string& root) {
    queues_.OweCrashMarker(root);
}

void Monitor::OnOverflow(const std::string& root) {
    queues_.OweCrashMarker(root);
}

void Monitor::OnRootLost(const std::string& path) {
    Root& root = roots_.at(path);
    const bool was_mounted_here = mounts_.Covering(path) == root.mount_point;
    struct stat status {};
    const bool is_gone = stat(path.c_str(), &status) != 0 || status.st_dev == root.device;
    mounts_.Reload();
    const bool is_deleted =
        is_gone && was_mounted_here && mounts_.Covering(path) == root.mount_point;
    root = Root{};
    queues_.OnRootLost(path, is_deleted, Clock::now());
    are_roots_stale_ = true;
}

bool Monitor::ShouldWatch(const std::string& directory) const {
    return !mounts_.IsMountPoint(directory) && queues_.Covers(directory);
}

}  // namespace kestotifyd
