#include <sys/epoll.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

#include "base/path.h"
#include "common/log.h"
#include "programs/kestotifyd/fanotify_backend.h"
#include "programs/kestotifyd/inotify_backend.h"
#include "programs/kestotifyd/monitor.h"

namespace kestotifyd {
namespace {

/// Nothing else turns the loop of an idle monitor: a disappearance that no event tells of, as when
/// a directory above is renamed while inotify watches, is noticed this late.
constexpr std::chrono::minutes kIdleCheckInterval{1};

/// A directory that cannot be read counts as empty: to take an absent volume for one that is there
/// would drop its documents.
bool IsEmptyDirectory(const std::string& path) {
    std::error_code error;
    const bool is_empty = std::filesystem::is_empty(path, error);
    return is_empty || error;
}

}  // namespace

/// A mount hides what its directory holds: for as long as it lasts, the index shows what can be
/// found at the path, and afterwards what was hidden, each by a reindex. The directory around it is
/// scanned again in both cases, for watches that are hidden and for directories without one.
void Monitor::HandleMountChange() {
    are_mounts_due_ = !mounts_.Reload();
    UpdateRoots();
    CheckRoots();
    const MountTable::Changes changes = mounts_.TakeChanges();
    std::set<std::string> around;
    for (const std::set<std::string>* const some : {&changes.added, &changes.removed}) {
        for (const std::string& point : *some) {
            const auto root = InnermostRoot(std::string(quivra::base::Directory(point)));
            if (root == roots_.end()) {
                continue;
            }
            around.insert(root->first);
            if (some == &changes.removed) {
                root->second.uncovered.insert(point);
            }
        }
    }
    for (const std::string& path : around) {
        roots_.at(path).backend->Rescan(path);
    }
}

/// The watched root that the path lies in; end() when there is none.
Monitor::Roots::iterator Monitor::InnermostRoot(const std::string& path) {
    auto innermost = roots_.end();
    for (auto it = roots_.begin(); it != roots_.end(); ++it) {
        // Sorted by path: of two that the path lies in, the later one is the longer one.
        if (it->second.backend != nullptr && quivra::base::IsAtOrBelow(path, it->first)) {
            innermost = it;
        }
    }
    return innermost;
}

/// The registered folders, and what is mounted below them. A mount is a root of its own, because
/// neither back end sees across its border.
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
    bool is_complete = !are_registrations_due_ && !are_mounts_due_;
    for (auto& [path, root] : roots_) {
        if (root.backend == nullptr && wanted_roots_.contains(path)) {
            StartRoot(path, root);
            is_complete &= root.backend != nullptr;
        }
    }
    next_check_ = Clock::now() + (is_complete ? kIdleCheckInterval : kCheckInterval);
    DropObsoleteRoots();
}

/// An empty folder whose file system was mounted elsewhere when it was last watched is the place
/// where a volume is missing: taking it for the folder would drop everything from the index.
/// Empty when the folder is there.
std::string Monitor::WhyAbsent(const std::string& path) const {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        return path + " cannot be watched: " + quivra::SystemErrorText(errno);
    }
    if (!S_ISDIR(status.st_mode)) {
        return path + " cannot be watched: it is not a directory";
    }
    const std::string expected = watched_.MountPoint(path);
    if (expected.empty() || mounts_.Covering(path) == expected || !IsEmptyDirectory(path)) {
        return std::string();
    }
    return path + " is empty, and nothing is mounted at " + expected +
           ", where its file system was";
}

void Monitor::StartRoot(const std::string& path, Root& root) {
    const std::string absence = WhyAbsent(path);
    if (!absence.empty()) {
        root.problem = absence;
        return;
    }
    struct stat status {};
    Backend* const backend = stat(path.c_str(), &status) == 0 ? AddToBackend(path) : nullptr;
    if (backend == nullptr) {
        const std::string problem =
            path + " cannot be watched: " + quivra::SystemErrorText(errno) +
            (errno == ENOSPC ? ". Raise the limit: sysctl fs.inotify.max_user_watches" : "");
        if (root.problem != problem) {
            root.problem = problem;
            errno = 0;
            quivra::LogError({"monitor", __LINE__}, "%s", problem.c_str());
        }
        return;
    }
    root = {backend, false, status.st_dev, status.st_ino, mounts_.Covering(path)};
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
        // Descriptors come free again; the other back end would be kept for good.
        if (options_.backend == BackendChoice::kFanotify || (fanotify_ && IsShortage(errno))) {
            return nullptr;
        }
    }
    if (!inotify_) {
        inotify_ = InotifyBackend::Create(sink, options_.max_watches);
        if (!inotify_) {
            return nullptr;
        }
        WatchDescriptor(inotify_->Fd(), EPOLLIN);
    }
    return inotify_->AddRoot(path) ? inotify_.get() : nullptr;
}

/// Whether a root is at or below the path.
bool Monitor::HoldsRoot(const std::string& path) const {
    if (path.empty()) {
        return false;
    }
    const auto below = quivra::base::Subtree(roots_, path);
    return roots_.contains(path) || below.first != below.second;
}

void Monitor::OnRootComplete(const std::string& path) {
    Root& root = roots_.at(path);
    root.is_complete = true;
    are_roots_stale_ = true;  // one that it replaces may go now
    watched_.SetMountPoint(path, root.mount_point);
    watched_.Save();
    queues_.OnRootComplete(path, Clock::now());
    for (const std::string& uncovered : std::exchange(root.uncovered, {})) {
        OnChange({Change::Kind::kReindex, true, uncovered});
    }
}

/// Deleted or moved away on its file system, a folder is gone; with its file system, it is only
/// absent. The table is read again in between, since its event may not have come yet.
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
