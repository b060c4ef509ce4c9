#include "programs/kestotifyd/inotify_backend.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <memory>
#include <string_view>
#include <utility>

#include "common/log.h"
#include "programs/kestotifyd/raw_events.h"

namespace kestotifyd {
namespace {

constexpr std::uint32_t kWatchMask = IN_CREATE | IN_DELETE | IN_DELETE_SELF | IN_MOVED_FROM |
                                     IN_MOVED_TO | IN_MOVE_SELF | IN_MODIFY | IN_CLOSE_WRITE |
                                     IN_ATTRIB | IN_EXCL_UNLINK | IN_ONLYDIR;

constexpr char kLimitFile[] = "/proc/sys/fs/inotify/max_user_watches";
constexpr std::size_t kDefaultLimit = 8192;

/// How much is read and scanned in one go, so that one busy tree cannot hold up everything else.
constexpr int kMaxReads = 16;
constexpr std::chrono::milliseconds kScanSlice{10};

constexpr std::chrono::milliseconds kRetryDelay{10};
constexpr int kMaxRetries = 200;
constexpr std::chrono::seconds kRescanDelay{1};
/// While directories are unwatched: how often to look whether something has come free, how soon
/// one rescan for that may follow another (twice as long each time, since each one has the share
/// indexed again), and when to rescan in any case, because what happens in there stays unknown.
constexpr std::chrono::seconds kGapCheck{3};
constexpr std::chrono::seconds kMinGapDelay{5};
constexpr std::chrono::minutes kForcedRescan{30};
constexpr std::chrono::milliseconds kProcessSlice{50};
constexpr std::chrono::milliseconds kLastSlice{300};

std::size_t ReadLimit() {
    std::size_t limit = kDefaultLimit;
    std::ifstream(kLimitFile) >> limit;
    return limit / 10 * 8;
}

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

/// Whether the directory is there and cannot be watched. A path that is too long may become shorter
/// by a rename above.
bool IsRefusal(int error_number) {
    return IsShortage(error_number) || error_number == ENAMETOOLONG;
}

std::string Below(int directory, const std::string& name) {
    return "/proc/self/fd/" + std::to_string(directory) + "/" + name;
}

}  // namespace

std::unique_ptr<InotifyBackend> InotifyBackend::Create(BackendSink& sink, std::size_t max_watches) {
    quivra::base::UniqueFd inotify(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (!inotify.IsValid()) {
        return nullptr;
    }
    return std::unique_ptr<InotifyBackend>(
        new InotifyBackend(sink, std::move(inotify), max_watches));
}

InotifyBackend::InotifyBackend(BackendSink& sink, quivra::base::UniqueFd inotify,
                               std::size_t max_watches)
    : sink_(sink),
      inotify_(std::move(inotify)),
      configured_limit_(max_watches),
      limit_(max_watches == 0 ? ReadLimit() : max_watches) {}

bool InotifyBackend::AddRoot(const std::string& path) {
    const int wd = Watch(path, true);
    if (wd < 0) {
        return false;
    }
    WatchNode* const node = tree_.AddRoot(path, wd);
    scans_.push_back({{node, wd}, false, {{node, wd}}});
    return true;
}

void InotifyBackend::RemoveRoot(const std::string& path) {
    unwatched_.erase(path);
    WatchNode* const root = tree_.FindRoot(path);
    if (root != nullptr) {
        Release(tree_.Remove(*root));
    }
}

void InotifyBackend::Rescan(const std::string& path) {
    WatchNode* const root = tree_.FindRoot(path);
    if (root != nullptr) {
        scans_.push_back({{root, root->wd}, true, {{root, root->wd}}});
    }
}

void InotifyBackend::Work(bool is_last) {
    ReadEvents();
    Process(is_last);
    WorkRetries(is_last);
    WorkScans();
    StartRescans();
}

std::optional<Time> InotifyBackend::NextDue() const {
    if (!scans_.empty()) {
        return Time::min();
    }
    std::optional<Time> due = pairing_.NextDue();
    const auto consider = [&](Time time) { due = std::min(due.value_or(time), time); };
    for (const Retry& retry : retries_) {
        consider(retry.due);
    }
    if (rescan_due_) {
        consider(*rescan_due_);
    }
    if (!unwatched_.empty()) {
        consider(next_gap_check_);
    }
    return due;
}

void InotifyBackend::ReadEvents() {
    std::array<char, 65536> buffer;
    // What is not taken yet stays with the kernel, which says so when it becomes too much.
    for (int reads = 0; reads < kMaxReads && !pairing_.IsFull(); ++reads) {
        const ssize_t size = read(inotify_.Get(), buffer.data(), buffer.size());
        if (size <= 0) {
            return;  // EAGAIN; an interrupted read is repeated by the next call
        }
        const Time now = Clock::now();
        std::string_view events(buffer.data(), static_cast<std::size_t>(size));
        while (std::optional<InotifyEvent> event = TakeInotifyEvent(events)) {
            pairing_.Push(std::move(*event), now);
        }
    }
}

void InotifyBackend::Process(bool is_last) {
    const Time start = Clock::now();
    const Time end = start + (is_last ? kLastSlice : kProcessSlice);
    while (Clock::now() < end) {
        const auto paired = pairing_.Pop(is_last ? Time::max() : start);
        if (!paired) {
            renames_.Run(sink_, false);
            return;
        }
        Handle(*paired);
    }
}

void InotifyBackend::Handle(const MovePairing::Paired& paired) {
    const InotifyOutcome outcome = TranslateInotify(paired, tree_);
    Release(outcome.unused_watches);
    for (const Change& change : outcome.changes) {
        sink_.OnChange(change);
        if (change.kind == Change::Kind::kRenamed) {
            renames_.Add(change);
        }
    }
    if (renames_.IsFull()) {
        renames_.Run(sink_, false);
    }
    for (const InotifyOutcome::Appeared& appeared : outcome.appeared) {
        Appear(appeared.parent, appeared.name, 0);
    }
    for (const std::string& root : outcome.lost_roots) {
        RemoveRoot(root);
        sink_.OnRootLost(root);
    }
    if (outcome.is_overflow) {
        HandleOverflow();
    }
}

void InotifyBackend::HandleOverflow() {
    ++overflows_;
    errno = 0;
    quivra::LogError(
        {"inotify", __LINE__},
        "The kernel's event queue overflowed: the watched shares will be indexed again "
        "as a whole. Raise the limit: sysctl fs.inotify.max_queued_events=131072");
    for (const std::string& root : tree_.RootPaths()) {
        sink_.OnOverflow(root);
    }
    rescan_due_ = Clock::now() + kRescanDelay;
}

void InotifyBackend::StartRescans() {
    const Time now = Clock::now();
    bool is_due = rescan_due_ && *rescan_due_ <= now;
    if (!is_due && !unwatched_.empty() && next_gap_check_ <= now) {
        next_gap_check_ = now + kGapCheck;
        is_due = forced_rescan_ <= now || (now >= gap_rescan_ && IsRoomFree());
    }
    if (!is_due || !scans_.empty()) {
        return;
    }
    rescan_due_.reset();
    limit_ = configured_limit_ == 0 ? ReadLimit() : configured_limit_;
    for (const auto& [root, count] : std::exchange(unwatched_, {})) {
        sink_.OnGaps(root);  // what happened in there meanwhile is lost
    }
    gap_delay_ = std::clamp<Clock::duration>(gap_delay_ * 2, kMinGapDelay, kForcedRescan);
    gap_rescan_ = now + gap_delay_;
    forced_rescan_ = now + kForcedRescan;
    for (const std::string& path : tree_.RootPaths()) {
        Rescan(path);
    }
}

/// Whether what was refused last would be taken now.
bool InotifyBackend::IsRoomFree() {
    limit_ = configured_limit_ == 0 ? ReadLimit() : configured_limit_;
    const quivra::base::UniqueFd directory(
        open(refused_path_.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory.IsValid()) {
        return !IsRefusal(errno);  // gone, it wants no watch any more
    }
    const int wd = Watch(Below(directory.Get(), "."), true);
    if (wd >= 0 && tree_.Find(wd).empty()) {
        inotify_rm_watch(inotify_.Get(), wd);
    }
    return wd >= 0;
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
    const int wd = Watch(Below(parent_fd, name), false);
    if (wd < 0) {
        if (!IsRefusal(errno)) {
            return {Child::State::kAbsent};  // where `present` went, the events ahead will tell
        }
        Refuse(errno, parent.Root().name, path);
        return {Child::State::kRefused};
    }
    if (present != nullptr && present->wd == wd) {
        return {Child::State::kPresent, present};
    }
    if (present != nullptr) {
        Release(tree_.Remove(*present));
    }
    return Adopt(parent, name, wd);
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

void InotifyBackend::Refuse(int error_number, const std::string& root, const std::string& path) {
    const bool is_first = unwatched_.empty();
    const bool is_first_of_root = unwatched_[root]++ == 0;
    refused_path_ = path;
    std::string problem = DescribeRefusal(error_number);
    if (is_first) {
        const Time now = Clock::now();
        next_gap_check_ = now + kGapCheck;
        forced_rescan_ = std::max(forced_rescan_, now + kForcedRescan);
        if (problem_ != problem) {  // not again after each rescan
            errno = 0;
            quivra::LogError({"inotify", __LINE__}, "%s cannot be watched, and perhaps others: %s",
                             path.c_str(), problem.c_str());
        }
    }
    problem_ = std::move(problem);
    if (is_first_of_root) {
        sink_.OnGaps(root);
    }
}

std::string InotifyBackend::DescribeRefusal(int error_number) const {
    switch (error_number) {
        case ENOSPC:
            return std::to_string(tree_.WatchCount()) + " directories are watched, and " +
                   std::to_string(limit_) +
                   " may be. Raise the limit: sysctl fs.inotify.max_user_watches=" +
                   std::to_string(std::max<std::size_t>(limit_ * 4, 524288));
        case ENAMETOOLONG:
            return "its path is too long";
        default:
            return quivra::SystemErrorText(error_number) +
                   ". Raise LimitNOFILE of the service, or give the machine more memory";
    }
}

Backend::Coverage InotifyBackend::CoverageOf(const std::string& root) const {
    Coverage coverage;
    if (const WatchNode* const node = tree_.FindRoot(root)) {
        coverage.watched = WatchTree::Count(*node);
    }
    if (const auto gap = unwatched_.find(root); gap != unwatched_.end()) {
        coverage.unwatched = gap->second;
        coverage.problem = problem_;
    }
    return coverage;
}

}  // namespace kestotifyd
