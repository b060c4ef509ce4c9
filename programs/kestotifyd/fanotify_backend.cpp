#include "programs/kestotifyd/fanotify_backend.h"

#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <string_view>
#include <utility>

#include "base/path.h"
#include "common/log.h"
#include "programs/kestotifyd/file_handle.h"
#include "programs/kestotifyd/raw_events.h"

namespace kestotifyd {
namespace {

constexpr std::uint64_t kMarkMask =
    FAN_CREATE | FAN_DELETE | FAN_RENAME | FAN_MODIFY | FAN_CLOSE_WRITE | FAN_ATTRIB | FAN_ONDIR;

/// How long events are read in one go, and when the daemon stops.
constexpr std::chrono::milliseconds kSlice{50};
constexpr std::chrono::milliseconds kLastSlice{300};
constexpr std::chrono::seconds kSightRetry{1};
constexpr std::size_t kMaxKnownBytes = 32U << 20;  // per mount

quivra::base::UniqueFd OpenDirectory(const std::string& path) {
    return quivra::base::UniqueFd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

std::string FileSystemOf(int fd) {
    struct statfs status {};
    if (fstatfs(fd, &status) != 0) {
        return std::string();
    }
    return std::string(reinterpret_cast<const char*>(&status.f_fsid), sizeof(status.f_fsid));
}

/// Remembers the directories above an open one, so that a later rename of one of them shows that
/// the disk was ahead. Step by step from below: a look-up from the root for each of them took a
/// tenth of a second for one event, a thousand directories deep.
void RememberAbove(const quivra::base::UniqueFd& directory, int mount_id, std::string path,
                   HandlePaths& paths) {
    quivra::base::UniqueFd at;
    while (path.size() > 1 && !paths.IsAhead()) {
        const int below = at.IsValid() ? at.Get() : directory.Get();
        at = quivra::base::UniqueFd(openat(below, "..", O_PATH | O_DIRECTORY | O_CLOEXEC));
        path = quivra::base::Directory(path);
        const auto above = at.IsValid() ? HandleOf(at.Get()) : std::nullopt;
        if (!above || above->mount_id != mount_id || paths.Find(above->handle) == path) {
            return;
        }
        paths.Set(above->handle, path);
    }
}

}  // namespace

std::unique_ptr<FanotifyBackend> FanotifyBackend::Create(BackendSink& sink) {
    quivra::base::UniqueFd group(fanotify_init(
        FAN_CLASS_NOTIF | FAN_CLOEXEC | FAN_NONBLOCK | FAN_REPORT_DFID_NAME_TARGET, O_RDONLY));
    if (!group.IsValid()) {
        return nullptr;
    }
    return std::unique_ptr<FanotifyBackend>(new FanotifyBackend(sink, std::move(group)));
}

FanotifyBackend::FanotifyBackend(BackendSink& sink, quivra::base::UniqueFd group)
    : sink_(sink), group_(std::move(group)) {}

bool FanotifyBackend::AddRoot(const std::string& path) {
    const quivra::base::UniqueFd fd = OpenDirectory(path);
    const auto root = fd.IsValid() ? HandleOf(fd.Get()) : std::nullopt;
    if (!root) {
        return false;
    }
    // The way that every event's directory will go.
    const quivra::base::UniqueFd again = OpenHandle(fd.Get(), root->handle);
    if (!again.IsValid() || PathOfDescriptor(again.Get()) != path) {
        errno = again.IsValid() ? EXDEV : errno;
        return false;
    }
    if (fanotify_mark(group_.Get(), FAN_MARK_ADD | FAN_MARK_FILESYSTEM, kMarkMask, fd.Get(),
                      nullptr) != 0) {
        return false;
    }
    View& view = views_.try_emplace(root->mount_id, View{FileSystemOf(fd.Get())}).first->second;
    view.roots[path] = root->handle;
    view.paths.Set(root->handle, path);
    completed_.push_back(path);
    return true;
}

void FanotifyBackend::RemoveRoot(const std::string& path) {
    std::erase(completed_, path);
    for (auto it = views_.begin(); it != views_.end(); ++it) {
        if (it->second.roots.erase(path) == 0 || !it->second.roots.empty()) {
            continue;
        }
        const std::string file_system = it->second.file_system;
        views_.erase(it);
        for (const auto& [mount, view] : views_) {
            if (view.file_system == file_system) {
                return;
            }
        }
        // Fails when the file system is gone, and the mark with it.
        const quivra::base::UniqueFd fd = OpenDirectory(path);
        if (fd.IsValid() && FileSystemOf(fd.Get()) == file_system) {
            fanotify_mark(group_.Get(), FAN_MARK_REMOVE | FAN_MARK_FILESYSTEM, kMarkMask, fd.Get(),
                          nullptr);
        }
        return;
    }
}

void FanotifyBackend::Work(bool is_last) {
    const Time end = Clock::now() + (is_last ? kLastSlice : kSlice);
    bool is_empty = ReadEvents(end);
    while (is_last && !is_empty && Clock::now() < end) {
        is_empty = ReadEvents(end);
    }
    for (auto& [mount, view] : views_) {
        if (is_empty || view.renames.IsFull()) {
            FinishTurn(view, is_empty);
        }
    }
    if (is_empty) {
        RecoverSight();
        CompleteRoots();
    }
}

void FanotifyBackend::FinishTurn(View& view, bool is_empty) {
    view.renames.Run(sink_, view.paths.IsAhead());
    if (is_empty) {  // everything that the kernel had queued has been processed
        view.paths.Settle();
    }
    if (view.paths.Size() > kMaxKnownBytes) {
        is_empty ? view.paths.Clear() : view.paths.BecomeAhead();
    }
}

/// What happened below the roots of a blind view is lost. They are complete again, with the marker
/// that this brings, once a descriptor can be had.
void FanotifyBackend::RecoverSight() {
    const Time now = Clock::now();
    if (sight_due_ && now < *sight_due_) {
        return;
    }
    sight_due_.reset();
    for (auto& [mount, view] : views_) {
        if (!view.is_blind) {
            continue;
        }
        if (!OpenDirectory(view.roots.begin()->first).IsValid() && IsShortage(errno)) {
            sight_due_ = now + kSightRetry;
            continue;
        }
        view.is_blind = false;
        for (const auto& [root, handle] : view.roots) {
            sink_.OnGaps(root);
            completed_.push_back(root);
        }
    }
}

std::optional<Time> FanotifyBackend::NextDue() const {
    return completed_.empty() ? sight_due_ : std::optional(Time::min());
}

void FanotifyBackend::CompleteRoots() {
    for (const std::string& root : std::exchange(completed_, {})) {
        sink_.OnRootComplete(root);
    }
}

/// True when no event was left. Stops at `end`, so that a storm that goes on for longer keeps
/// nobody from the signals, the registrations and the queues.
bool FanotifyBackend::ReadEvents(Time end) {
    std::array<char, 65536> buffer;
    do {
        const ssize_t size = read(group_.Get(), buffer.data(), buffer.size());
        if (size <= 0) {
            return true;
        }
        std::string_view events(buffer.data(), static_cast<std::size_t>(size));
        while (const std::optional<FanotifyEvent> event = TakeFanotifyEvent(events)) {
            if ((event->mask & FAN_Q_OVERFLOW) != 0) {
                HandleOverflow();
            } else if (event->pid != getpid()) {
                Handle(*event);
                DropMovedRoots(*event);
            }
        }
    } while (Clock::now() < end);
    return false;
}

void FanotifyBackend::Handle(const FanotifyEvent& event) {
    for (auto& [mount, view] : views_) {
        if (view.file_system != event.file_system) {
            continue;
        }
        const auto lookup = [this, &view = view](const std::string& handle) {
            return Lookup(view, handle);
        };
        for (const Change& change : TranslateFanotify(event, view.paths, lookup)) {
            sink_.OnChange(change);
            if (change.kind == Change::Kind::kRenamed) {
                view.renames.Add(change);
            }
        }
        if (view.is_blind && !sight_due_) {
            sight_due_ = Clock::now() + kSightRetry;
        }
    }
}

/// The name of a removed directory is gone with the one above it, its handle is not.
void FanotifyBackend::DropMovedRoots(const FanotifyEvent& event) {
    if ((event.mask & (FAN_DELETE | FAN_RENAME)) == 0 || (event.mask & FAN_ONDIR) == 0) {
        return;
    }
    std::vector<std::string> lost;
    for (const auto& [mount, view] : views_) {
        for (const auto& [path, handle] : view.roots) {
            if (view.file_system == event.file_system && handle == event.target) {
                lost.push_back(path);
            }
        }
    }
    for (const std::string& path : lost) {
        RemoveRoot(path);
        sink_.OnRootLost(path);
    }
}

std::string FanotifyBackend::Lookup(View& view, const std::string& handle) const {
    const std::string known = view.paths.Find(handle);
    if (!known.empty()) {
        return known;
    }
    errno = 0;
    const std::string path = LookUpOnDisk(view, handle);
    if (path.empty() && IsShortage(errno) && !std::exchange(view.is_blind, true)) {
        quivra::LogError({"fanotify", __LINE__},
                         "Changes below %s are missed. Raise LimitNOFILE of the service, or give "
                         "the machine more memory",
                         view.roots.begin()->first.c_str());
    }
    return path;
}

std::string FanotifyBackend::LookUpOnDisk(View& view, const std::string& handle) const {
    // No descriptor is kept open, for that would forbid to unmount.
    const quivra::base::UniqueFd mount = OpenDirectory(view.roots.begin()->first);
    const quivra::base::UniqueFd fd =
        mount.IsValid() ? OpenHandle(mount.Get(), handle) : quivra::base::UniqueFd();
    const std::string path = fd.IsValid() ? PathOfDescriptor(fd.Get()) : std::string();
    if (path.empty() || view.paths.IsAhead()) {
        return path;  // nothing is remembered while the disk is ahead
    }
    const auto known_as = HandleOf(fd.Get());
    view.paths.Set(handle, path);
    if (known_as) {
        RememberAbove(fd, known_as->mount_id, path, view.paths);
    }
    // Renamed in between, the directories that were met above need not be those of the path.
    if (PathOfDescriptor(fd.Get()) != path) {
        view.paths.BecomeAhead();
    }
    return path;
}

Backend::Coverage FanotifyBackend::CoverageOf(const std::string& root) const {
    for (const auto& [mount, view] : views_) {
        if (view.roots.contains(root)) {
            return view.is_blind ? Coverage{0, 1,
                                            "No descriptor or no memory is free: changes are "
                                            "missed. Raise LimitNOFILE of the service"}
                                 : Coverage{1, 0, ""};
        }
    }
    return {};
}

void FanotifyBackend::HandleOverflow() {
    ++overflows_;
    errno = 0;
    quivra::LogError(
        {"fanotify", __LINE__},
        "The kernel's event queue overflowed: the watched shares will be indexed again "
        "as a whole. Raise the limit: sysctl fs.fanotify.max_queued_events=131072");
    completed_.clear();
    for (auto& [mount, view] : views_) {
        view.paths.Clear();
        for (const auto& [root, handle] : view.roots) {
            sink_.OnOverflow(root);
            completed_.push_back(root);
        }
    }
}

}  // namespace kestotifyd
