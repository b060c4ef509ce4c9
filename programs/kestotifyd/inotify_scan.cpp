#include <dirent.h>
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <utility>

#include "programs/kestotifyd/inotify_backend.h"

namespace kestotifyd {
namespace {

constexpr std::uint32_t kWatchMask = IN_CREATE | IN_DELETE | IN_DELETE_SELF | IN_MOVED_FROM |
                                     IN_MOVED_TO | IN_MOVE_SELF | IN_MODIFY | IN_CLOSE_WRITE |
                                     IN_ATTRIB | IN_EXCL_UNLINK | IN_ONLYDIR;

/// How long directories are scanned in one go, so that one large tree cannot hold up everything
/// else.
constexpr std::chrono::milliseconds kScanSlice{10};

/// How soon, and how often, a directory is tried again that is not where the tree has it.
constexpr std::chrono::milliseconds kRetryDelay{10};
constexpr int kMaxRetries = 200;

struct DirectoryCloser {
    void operator()(DIR* directory) const { closedir(directory); }
};

/// The entries that are directories. False, with errno set, when they are not all known.
bool ListDirectories(quivra::base::UniqueFd fd, std::vector<std::string>& names) {
    const std::unique_ptr<DIR, DirectoryCloser> directory(fdopendir(fd.Get()));
    if (!directory) {
        return false;
    }
    fd.Release();  // closed with the stream
    errno = 0;
    while (const dirent* const entry = readdir(directory.get())) {
        const char* const name = entry->d_name;
        if (std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0) {
            continue;
        }
        bool is_dir = entry->d_type == DT_DIR;
        if (entry->d_type == DT_UNKNOWN) {
            struct stat status {};
            is_dir = fstatat(dirfd(directory.get()), name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
                     S_ISDIR(status.st_mode);
        }
        if (is_dir) {
            names.emplace_back(name);
        }
        errno = 0;
    }
    return errno == 0;
}

std::string Below(int directory, const std::string& name) {
    return "/proc/self/fd/" + std::to_string(directory) + "/" + name;
}

}  // namespace

void InotifyBackend::Rescan(const std::string& path) {
    WatchNode* const root = tree_.FindRoot(path);
    if (root != nullptr) {
        scans_.push_back({{root, root->wd}, true, {{root, root->wd}}});
    }
}

int InotifyBackend::Watch(const std::string& path, bool follow) {
    const int wd = inotify_add_watch(inotify_.Get(), path.c_str(),
                                     kWatchMask | (follow ? 0U : IN_DONT_FOLLOW));
    if (wd >= 0 && tree_.WatchCount() >= limit_ && tree_.Find(wd).empty()) {
        inotify_rm_watch(inotify_.Get(), wd);
        errno = ENOSPC;
        return -1;
    }
    return wd;
}

void InotifyBackend::Release(const std::vector<int>& watches) {
    for (const int wd : watches) {
        inotify_rm_watch(inotify_.Get(), wd);  // gone already when the directory was removed
    }
}

/// Opens the directory of a node, provided that the node's path still leads to it. Setting a watch
/// that is there already returns its descriptor: that is the proof.
quivra::base::UniqueFd InotifyBackend::OpenVerified(WatchNode& node) {
    const int link_flag = node.parent == nullptr ? 0 : O_NOFOLLOW;
    quivra::base::UniqueFd fd(
        open(node.Path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | link_flag));
    if (!fd.IsValid()) {
        return fd;
    }
    const int wd = inotify_add_watch(inotify_.Get(), Below(fd.Get(), ".").c_str(), kWatchMask);
    if (wd == node.wd) {
        return fd;
    }
    if (wd >= 0 && tree_.Find(wd).empty()) {
        inotify_rm_watch(inotify_.Get(), wd);
    }
    errno = wd < 0 ? errno : ESTALE;
    return quivra::base::UniqueFd();
}

InotifyBackend::Child InotifyBackend::EnsureChild(WatchNode& parent, int parent_fd,
                                                  const std::string& name) {
    WatchNode* const present = parent.Child(name);
    const std::string path = parent.PathOf(name);
    if (!sink_.ShouldWatch(path)) {
        if (present != nullptr) {
            Release(tree_.Remove(*present));
        }
        return {Child::State::kAbsent};
    }
    int wd = Watch(Below(parent_fd, name), false);
    if (present != nullptr && present->wd == wd) {
        return {Child::State::kPresent, present};
    }
    if (present != nullptr && wd >= 0) {
        Release(tree_.Remove(*present));
        // The directory was perhaps known below the one whose place it has taken, and its watch has
        // just been released with that one's.
        wd = Watch(Below(parent_fd, name), false);
    }
    if (wd >= 0) {
        return Adopt(parent, name, wd);
    }
    if (!IsRefusal(errno)) {
        return {Child::State::kAbsent};  // where `present` went, the events ahead will tell
    }
    Refuse(errno, parent.Root().name, path);
    return {Child::State::kRefused};
}

/// Puts a watch into the tree. When the kernel returns a watch that another node has, the directory
/// has been moved from there, or both places show it (a bind mount).
InotifyBackend::Child InotifyBackend::Adopt(WatchNode& parent, const std::string& name, int wd) {
    for (WatchNode* const other : tree_.Find(wd)) {
        if (other->parent != nullptr && !OpenVerified(*other).IsValid()) {
            Release(tree_.Move(*other, parent, name));
            if (WatchNode* const moved = parent.Child(name)) {
                return {Child::State::kMoved, moved};
            }
        }
    }
    return {Child::State::kNew, tree_.AddChild(parent, name, wd)};
}

void InotifyBackend::Appear(const NodeRef& parent, const std::string& name, int attempts) {
    if (!tree_.IsAlive(parent)) {
        return;
    }
    const quivra::base::UniqueFd fd = OpenVerified(*parent.node);
    if (!fd.IsValid()) {
        Postpone(parent, name, attempts);
        return;
    }
    const Child child = EnsureChild(*parent.node, fd.Get(), name);
    if (child.state == Child::State::kNew) {
        scans_.push_back({{child.node, child.node->wd}, false, {{child.node, child.node->wd}}});
    } else if (child.state == Child::State::kMoved || child.state == Child::State::kRefused) {
        sink_.OnChange({Change::Kind::kCreated, true, parent.node->PathOf(name)});
    }
}

/// OpenVerified has failed for the node. For want of descriptors or watches, waiting for an event
/// that explains it would be in vain, and giving the directory up wrong: the rescan takes it up.
void InotifyBackend::Postpone(const NodeRef& parent, const std::string& name, int attempts) {
    if (IsRefusal(errno)) {
        Refuse(errno, parent.node->Root().name, parent.node->PathOf(name.empty() ? "." : name));
    } else if (attempts < kMaxRetries) {
        retries_.push_back({parent, name, Clock::now() + kRetryDelay, attempts + 1});
    } else if (parent.node->parent != nullptr) {
        // Nobody has explained for seconds where the directory went: it is not below the roots.
        sink_.OnChange({Change::Kind::kDeleted, true, parent.node->Path()});
        Release(tree_.Remove(*parent.node));
    }
}

void InotifyBackend::WorkRetries(bool is_last) {
    const Time now = is_last ? Time::max() : Clock::now();
    const auto first_due = std::partition(retries_.begin(), retries_.end(),
                                          [&](const Retry& retry) { return retry.due > now; });
    const std::vector<Retry> due(first_due, retries_.end());
    retries_.erase(first_due, retries_.end());
    for (const Retry& retry : due) {
        if (!tree_.IsAlive(retry.parent)) {
            continue;
        }
        if (!retry.name.empty()) {
            Appear(retry.parent, retry.name, retry.attempts);
        } else if (OpenVerified(*retry.parent.node).IsValid()) {
            scans_.push_back({retry.parent, true, {retry.parent}});
        } else {
            Postpone(retry.parent, "", retry.attempts);
        }
    }
}

void InotifyBackend::WorkScans() {
    const Time end = Clock::now() + kScanSlice;
    while (!scans_.empty()) {
        Scan& scan = scans_.front();
        while (!scan.pending.empty()) {
            if (Clock::now() >= end) {
                return;
            }
            const NodeRef ref = scan.pending.back();
            scan.pending.pop_back();
            ScanDirectory(scan, ref);
        }
        const Scan finished = std::move(scan);
        scans_.pop_front();
        Finish(finished);
    }
}

void InotifyBackend::ScanDirectory(Scan& scan, const NodeRef& ref) {
    if (!tree_.IsAlive(ref)) {
        return;
    }
    const quivra::base::UniqueFd fd = OpenVerified(*ref.node);
    if (!fd.IsValid()) {
        Postpone(ref, "", 0);
        return;
    }
    std::vector<std::string> names;
    quivra::base::UniqueFd listing(openat(fd.Get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!listing.IsValid() || !ListDirectories(std::move(listing), names)) {
        if (IsRefusal(errno)) {
            Refuse(errno, ref.node->Root().name, ref.node->Path());
        }
        return;
    }
    for (const std::string& name : names) {
        const Child child = EnsureChild(*ref.node, fd.Get(), name);
        if (child.state == Child::State::kNew || (child.node != nullptr && scan.is_rescan)) {
            scan.pending.push_back({child.node, child.node->wd});
        }
    }
    if (scan.is_rescan) {
        DropMissing(*ref.node, {names.begin(), names.end()});
    }
}

/// Only for a rescan: in a first scan, what is missing is told by an event that is on its way.
void InotifyBackend::DropMissing(WatchNode& node, const std::set<std::string_view>& names) {
    std::vector<WatchNode*> missing;
    for (const auto& [name, child] : node.children) {
        if (!names.contains(name)) {
            missing.push_back(child.get());
        }
    }
    for (WatchNode* const child : missing) {
        Release(tree_.Remove(*child));
    }
}

/// A directory that has appeared is reported only now, with all below it watched: whoever walks it
/// then misses nothing.
void InotifyBackend::Finish(const Scan& scan) {
    if (!tree_.IsAlive(scan.top)) {
        return;
    }
    if (scans_.empty() && unwatched_.empty()) {
        problem_.clear();
        gap_delay_ = {};
    }
    if (scan.top.node->parent == nullptr) {
        sink_.OnRootComplete(scan.top.node->name);
    } else {
        sink_.OnChange({Change::Kind::kCreated, true, scan.top.node->Path()});
    }
}

}  // namespace kestotifyd
