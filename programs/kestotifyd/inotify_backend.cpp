#include "programs/kestotifyd/inotify_backend.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <fstream>
#include <memory>
#include <string_view>
#include <utility>

#include "common/log.h"
#include "programs/kestotifyd/raw_events.h"

namespace kestotifyd {
namespace {

constexpr char kLimitFile[] = "/proc/sys/fs/inotify/max_user_watches";
constexpr std::size_t kDefaultLimit = 8192;

/// How much is read and scanned in one go, so that one busy tree cannot hold up everything else.
constexpr int kMaxReads = 16;
constexpr std::chrono::seconds kRescanDelay{1};
/// While directories are unwatched: how often to look whether something has come free, how soon
/// one rescan for that may follow another (twice as long each time, since each one has the share
/// indexed again), and when to rescan in any case, because what happens in there stays unknown.
constexpr std::chrono::seconds kGapCheck{3};
constexpr std::chrono::seconds kMinGapDelay{5};
constexpr std::chrono::minutes kForcedRescan{30};
constexpr std::chrono::milliseconds kProcessSlice{50};
constexpr std::chrono::milliseconds kLastSlice{300};

/// A part of the limit: it is one for all programs of the user.
std::size_t ReadLimit() {
    std::size_t limit = kDefaultLimit;
    std::ifstream(kLimitFile) >> limit;
    return limit / 10 * 8;
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

/// A path that is too long may become shorter by a rename above.
bool InotifyBackend::IsRefusal(int error_number) {
    return IsShortage(error_number) || error_number == ENAMETOOLONG;
}

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
    // After the reports: a scan takes in what the events behind this one will tell again.
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
    // Not at once: while the storm goes on, new directories would only be missed again.
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
    const int wd = Watch(refused_path_, false);
    if (wd >= 0 && tree_.Find(wd).empty()) {
        inotify_rm_watch(inotify_.Get(), wd);
    }
    return wd >= 0;
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
