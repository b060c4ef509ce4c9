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

#include "common/error.h"
#include "common/log.h"

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
constexpr std::chrono::minutes kRefusalRetry{30};

std::size_t ReadLimit() {
    std::size_t limit = kDefaultLimit;
    std::ifstream(kLimitFile) >> limit;
    return limit / 10 * 8;
}

struct DirectoryCloser {
    void operator()(DIR* directory) const { closedir(directory); }
};

/// The entries that are directories.
bool ListDirectories(quivra::base::UniqueFd fd, std::vector<std::string>& names) {
    const std::unique_ptr<DIR, DirectoryCloser> directory(fdopendir(fd.Get()));
    if (!directory) {
        return false;
    }
    fd.Release();  // closed with the stream
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
    }
    return true;
}

bool IsRefusal(int error_number) {
    return error_number == ENOSPC || error_number == ENOMEM || error_number == EMFILE ||
           error_number == ENFILE;
}

std::string Below(int directory, const std::string& name) {
    return "/proc/self/fd/" + std::to_string(directory) + "/" + name;
}

}  // namespace

InotifyBackend::InotifyBackend(BackendSink& sink, std::size_t max_watches)
    : sink_(sink),
      inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)),
      configured_limit_(max_watches),
      limit_(max_watches == 0 ? ReadLimit() : max_watches) {
    if (!inotify_.IsValid()) {
        const std::string reason =
            "inotify_init1 failed, reason=" + quivra::SystemErrorText(errno) +
            ". Raise the limit: sysctl fs.inotify.max_user_instances=512";
        quivra::Fail({"inotify", __LINE__}, "!inotify_.IsValid()",
                     quivra::Error(quivra::Error::kSystemCallFailed, reason));
    }
}

bool InotifyBackend::AddRoot(const std::string& path) {
    const int wd = Watch(path, true);
    if (wd < 0) {
        if (IsRefusal(errno)) {
            Refuse(errno, path, path);
        }
        return false;
    }
    WatchNode* const node = tree_.AddRoot(path, wd);
    scans_.push_back({{node, wd}, false, {{node, wd}}});
    return true;
}

void InotifyBackend::RemoveRoot(const std::string& path) {
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
    for (const std::optional<Time>& rescan : {rescan_due_, refusal_retry_due_}) {
        if (rescan) {
            consider(*rescan);
        }
    }
    return due;
}

void InotifyBackend::ReadEvents() {
    alignas(inotify_event) std::array<char, 65536> buffer;
    for (int reads = 0; reads < kMaxReads; ++reads) {
        const ssize_t size = read(inotify_.Get(), buffer.data(), buffer.size());
        if (size <= 0) {
            return;  // EAGAIN; an interrupted read is repeated by the next call
        }
        const Time now = Clock::now();
        for (const char* at = buffer.data(); at < buffer.data() + size;) {
            const auto* const event = reinterpret_cast<const inotify_event*>(at);
            const std::string name = event->len > 0 ? std::string(event->name) : std::string();
            pairing_.Push({event->wd, event->mask, event->cookie, name}, now);
            at += sizeof(inotify_event) + event->len;
        }
    }
}

void InotifyBackend::Process(bool is_last) {
    const Time now = is_last ? Time::max() : Clock::now();
    while (const std::optional<MovePairing::Paired> paired = pairing_.Pop(now)) {
        Handle(*paired);
    }
}

void InotifyBackend::Handle(const MovePairing::Paired& paired) {
    const InotifyOutcome outcome = TranslateInotify(paired, tree_);
    Release(outcome.unused_watches);
    for (const Change& change : outcome.changes) {
        sink_.OnChange(change);
    }
    for (const InotifyOutcome::Appeared& appeared : outcome.appeared) {
        Appear({appeared.parent, appeared.parent->wd}, appeared.name, 0);
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
    const bool is_due =
        (rescan_due_ && *rescan_due_ <= now) || (refusal_retry_due_ && *refusal_retry_due_ <= now);
    if (!is_due || !scans_.empty()) {
        return;
    }
    rescan_due_.reset();
    refusal_retry_due_.reset();
    roots_with_gaps_.clear();
    limit_ = configured_limit_ == 0 ? ReadLimit() : configured_limit_;
    for (const std::string& path : tree_.RootPaths()) {
        Rescan(path);
    }
}

bool InotifyBackend::IsAlive(const NodeRef& ref) const {
    const std::vector<WatchNode*> nodes = tree_.Find(ref.wd);
    return std::find(nodes.begin(), nodes.end(), ref.node) != nodes.end();
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
/// that is there already answers its descriptor: that is the proof.
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

/// Puts a watch into the tree. When the kernel answers a watch that another node has, the directory
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
    if (!IsAlive(parent)) {
        return;
    }
    const quivra::base::UniqueFd fd = OpenVerified(*parent.node);
    if (!fd.IsValid()) {
        ScheduleRetry(parent, name, attempts);
        return;
    }
    const Child child = EnsureChild(*parent.node, fd.Get(), name);
    if (child.state == Child::State::kNew) {
        scans_.push_back({{child.node, child.node->wd}, false, {{child.node, child.node->wd}}});
    } else if (child.state == Child::State::kMoved || child.state == Child::State::kRefused) {
        sink_.OnChange({Change::Kind::kCreated, true, parent.node->PathOf(name)});
    }
}

void InotifyBackend::ScheduleRetry(const NodeRef& parent, const std::string& name, int attempts) {
    if (attempts < kMaxRetries) {
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
        if (!IsAlive(retry.parent)) {
            continue;
        }
        if (!retry.name.empty()) {
            Appear(retry.parent, retry.name, retry.attempts);
        } else if (OpenVerified(*retry.parent.node).IsValid()) {
            scans_.push_back({retry.parent, true, {retry.parent}});
        } else {
            ScheduleRetry(retry.parent, "", retry.attempts);
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
    if (!IsAlive(ref)) {
        return;
    }
    const quivra::base::UniqueFd fd = OpenVerified(*ref.node);
    if (!fd.IsValid()) {
        if (IsRefusal(errno)) {
            Refuse(errno, ref.node->Root().name, ref.node->Path());
        }
        ScheduleRetry(ref, "", 0);
        return;
    }
    std::vector<std::string> names;
    quivra::base::UniqueFd listing(openat(fd.Get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!listing.IsValid() || !ListDirectories(std::move(listing), names)) {
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
    if (!IsAlive(scan.top)) {
        return;
    }
    if (scan.top.node->parent == nullptr) {
        sink_.OnRootComplete(scan.top.node->name);
    } else {
        sink_.OnChange({Change::Kind::kCreated, true, scan.top.node->Path()});
    }
}

void InotifyBackend::Refuse(int error_number, const std::string& root, const std::string& path) {
    if (!roots_with_gaps_.insert(root).second) {
        return;
    }
    refusal_retry_due_ = Clock::now() + kRefusalRetry;
    errno = error_number;
    quivra::LogError({"inotify", __LINE__},
                     "The directory %s cannot be watched, and perhaps others: %zu of at most %zu "
                     "watches are in use. Raise the limit: sysctl fs.inotify.max_user_watches=%zu",
                     path.c_str(), tree_.WatchCount(), limit_,
                     std::max<std::size_t>(limit_ * 4, 524288));
    sink_.OnGaps(root);
}

}  // namespace kestotifyd
