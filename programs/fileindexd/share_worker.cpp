#include "programs/fileindexd/share_worker.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <ctime>

#include "base/path.h"
#include "base/queue_file.h"
#include "base/unique_fd.h"
#include "common/log.h"
#include "fileindex/elastic/protocol.h"
#include "fileindex/index_mgr.h"
#include "sdk/share.h"

namespace fileindexd {

using quivra::Error;
using quivra::base::PrivateDirectory;

namespace {

constexpr const char* kUnit = "share_worker";

/// Between two slices the queue is looked at.
constexpr std::chrono::milliseconds kSlice{500};

/// What a file costs beside its bytes, as so many bytes: extraction of small ones is all overhead.
constexpr double kFileWeight = 64 * 1024;
/// How much a slice counts in the estimate once the next one is over: it looks back some 20 slices.
constexpr double kDecay = 0.95;

/// Held during a pass or a slice, so that `--once` and a worker do not take the same working copy.
quivra::base::UniqueFd LockShare(const std::string& share, const std::function<void()>& between) {
    const std::string path = std::string(kRunDirectory) + "/" + share + ".lock";
    quivra::base::UniqueFd fd(open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    int result = fd.IsValid() ? flock(fd.Get(), LOCK_EX) : -1;
    while (fd.IsValid() && result != 0 && errno == EINTR) {
        if (between) {
            between();
        }
        result = flock(fd.Get(), LOCK_EX);
    }
    if (result != 0) {
        quivra::Fail({kUnit, __LINE__}, "flock(fd.Get(), LOCK_EX) != 0",
                     Error(Error::kLockFailed,
                           "Cannot lock " + path + ": " + quivra::SystemErrorText(errno)));
    }
    return fd;
}

/// What stops a whole share is told before its documents look gone.
void CheckIndexable(const quivra::sdk::SDKShare& share, const std::string& name) {
    if (!share.CanBeIndexed()) {
        throw Error(Error::kPathNotIndexable,
                    "The share is locked, read-only or excluded from indexing: " + name);
    }
}

bool IsSpaceShort(const std::string& share) {
    try {
        return !quivra::sdk::SDKShare(share).IsSpaceEnough();
    } catch (const Error&) {
        return false;  // the share has gone, which is another matter
    }
}

/// Nothing but files may stand where files of ours do: a FIFO would hold its reader for ever.
void CheckFiles(const PrivateDirectory& directory, const std::string& queue) {
    for (const std::string& name :
         {queue, quivra::base::WorkingCopy(queue), std::string(Backlog::kFileName)}) {
        struct stat info {};
        if (fstatat(directory.Fd(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
            !S_ISREG(info.st_mode)) {
            throw PlaceProblem(directory.Path() + "/" + name + " is not a file; remove it");
        }
    }
    errno = 0;
}

PrivateDirectory OpenPlace(const std::string& path) {
    PrivateDirectory directory = PrivateDirectory::Open(path, PrivateDirectory::Make::kMissing);
    if (directory.IsValid()) {
        return directory;
    }
    if (!directory.Problem().empty()) {
        errno = 0;
        throw PlaceProblem(directory.Problem());
    }
    throw Error(Error::kSystemCallFailed,
                "Cannot open " + path + ": " + quivra::SystemErrorText(errno));
}

/// Where the place is not right, the platform tells no path; then it is where it has always been,
/// and opening it tells what is wrong.
std::string QueuePath(const std::string& share) {
    const quivra::sdk::SDKShare record(share);
    try {
        return record.GetQueuePath();
    } catch (const Error&) {
        return record.GetPath() + "/@eaDir/fileindex/queue";
    }
}

}  // namespace

ShareWorker::ShareWorker(std::string share)
    : share_(std::move(share)), state_(share_), index_(share_) {}

std::string ShareWorker::QueueName() const {
    return std::string(quivra::base::Name(place_->queue_path));
}

void ShareWorker::Open() {
    try {
        const std::string queue = QueuePath(share_);
        if (!place_) {
            PrivateDirectory directory = OpenPlace(std::string(quivra::base::Directory(queue)));
            CheckFiles(directory, std::string(quivra::base::Name(queue)));
            place_ = std::make_unique<Place>(std::move(directory), queue);
            return;
        }
        if (place_->queue_path != queue || !place_->directory.IsStillThere()) {
            const std::string problem = place_->directory.Problem();
            errno = 0;
            if (!problem.empty()) {
                throw PlaceProblem(problem);
            }
            throw Error(Error::kSystemCallFailed,
                        "The queue's directory has gone or was replaced: " + queue);
        }
        CheckFiles(place_->directory, QueueName());
    } catch (...) {
        place_.reset();
        throw;
    }
}

template <typename Function>
auto ShareWorker::Guard(const std::function<void()>& between, Function work) {
    // Before the place is opened, so that two processes do not make a new store at once.
    const quivra::base::UniqueFd lock = LockShare(share_, between);
    try {
        Open();
        if (place_->backlog.HasChangedElsewhere()) {
            place_->catch_up.ForgetAll();  // the directory at work may have been read by `--once`
        }
        return work();
    } catch (const Stopped&) {
        throw;
    } catch (const PlaceProblem& problem) {
        state_.SetProblem(problem.what());
        throw;
    } catch (const sqlite::Error& error) {
        if (error.IsDamage() && place_) {
            Backlog::Remove(place_->directory);  // a new one begins with everything
        }
        // Opened again for the next try: a statement that failed may leave its connection unusable.
        place_.reset();
        NoteFailure(error.what());
        throw;
    } catch (const Error& error) {
        if (static_cast<int>(error.code) == quivra::fileindex::elastic::kIndexMadeAnew && place_) {
            ReindexAll("was made anew");
        }
        NoteFailure(error.what());
        throw;
    } catch (const std::exception& error) {
        NoteFailure(error.what());
        throw;
    }
}

void ShareWorker::NoteFailure(const std::string& error) {
    if (!space_notified_ && IsSpaceShort(share_)) {
        space_notified_ = true;
        quivra::fileindex::SendKOSNotify();
    }
    state_.SetLastError(error);
    state_.Set(StateFile::State::kWaiting);
}

PassListener ShareWorker::Listener(const std::function<void()>& between) {
    return [this, between](const PassState& state) {
        if (between) {
            between();
        }
        state_.SetProgress(state);
    };
}

PassResult ShareWorker::RunPass(const std::function<void()>& between) {
    return Guard(between, [&] {
        PassResult result = RunLocked(between);
        space_notified_ = false;
        state_.SetLastError("");
        if (result.had_work) {
            state_.SetLastPass(time(nullptr));
        }
        ShowWaiting();
        state_.Set(StateFile::State::kIdle);
        return result;
    });
}

/// The first work of this process: what an earlier one has left unsaid.
void ShareWorker::Begin(const std::string& root, const Scope& scope) {
    if (place_->backlog.IsNew()) {
        if (index_.ListBelow(root, "", 1).empty()) {
            place_->backlog.BeginEmpty(scope.Describe(root));
        } else {
            place_->backlog.AddReindex(root, scope.Describe(root));
        }
    }
}

PassResult ShareWorker::RunLocked(const std::function<void()>& between) {
    const quivra::sdk::SDKShare share(share_);
    const std::unique_ptr<Scope> scope = LoadScope();
    CheckIndexable(share, share_);
    const std::string root = share.GetPath();
    Begin(root, *scope);
    Backlog& backlog = place_->backlog;
    Pass pass({place_->directory, place_->queue_path, root, backlog}, index_, *scope,
              Listener(between));
    PassResult result = pass.Run();
    place_->catch_up.Forget(result.left);
    // Settings that changed during a pass may have been left to a reindex of this very pass; this
    // process or the one before it may have been that pass's.
    const std::string rules = LoadScope()->Describe(root);
    const bool is_to_be_checked = result.had_work || !was_checked_;
    if (is_to_be_checked && !backlog.Rules().empty() && backlog.Rules() != rules) {
        backlog.AddReindex(root, rules);
        place_->catch_up.ForgetAll();
    }
    was_checked_ = true;
    return result;
}

CatchUp::Slice ShareWorker::RunSlice(const std::function<void()>& between) {
    return Guard(between, [&] {
        const auto begin = CatchUp::Clock::now();
        const CatchUp::Slice slice = RunSliceLocked(between);
        NoteRate(slice, begin);
        ShowWaiting();
        return slice;
    });
}

CatchUp::Slice ShareWorker::RunSliceLocked(const std::function<void()>& between) {
    const quivra::sdk::SDKShare share(share_);
    const std::unique_ptr<Scope> scope = LoadScope();
    CheckIndexable(share, share_);
    if (WorkingCopy::At(place_->directory.Fd(), quivra::base::WorkingCopy(QueueName()))) {
        return {};  // `--once` has been interrupted: its renames come first
    }
    const ShareTree tree(share.GetPath());
    return place_->catch_up.Run({index_, tree, *scope}, Listener(between),
                                CatchUp::Clock::now() + kSlice, time(nullptr));
}

std::optional<std::chrono::seconds> ShareWorker::NextSlice() {
    const auto due = place_->backlog.NextDue();
    if (!due) {
        return std::nullopt;
    }
    return std::chrono::seconds(std::max<std::int64_t>(*due - time(nullptr), 0));
}

void ShareWorker::RetryFailures() {
    place_->backlog.RetryFailures();
}

void ShareWorker::CheckIndex() {
    if (index_.IsMadeAnew()) {
        Guard({}, [&] { ReindexAll("was made anew"); });
    }
}

/// What is to be done is durable before the index takes changes again.
void ShareWorker::ReindexAll(const std::string& why) {
    const std::string root = quivra::sdk::SDKShare(share_).GetPath();
    quivra::LogTrace({kUnit, __LINE__}, "The index of share %s %s: everything is indexed again",
                     share_.c_str(), why.c_str());
    place_->backlog.AddReindex(root, LoadScope()->Describe(root));
    place_->catch_up.ForgetAll();
    index_.Accept();
}

void ShareWorker::NoteRate(const CatchUp::Slice& slice, CatchUp::Clock::time_point begin) {
    const auto now = CatchUp::Clock::now();
    // The passes in between take their share of the time, which the estimate must not forget; after
    // a long pause they do not.
    const auto since = now - last_slice_ < 4 * kSlice ? last_slice_ : begin;
    last_slice_ = now;
    if (slice.files > 0) {
        weight_done_ = weight_done_ * kDecay + static_cast<double>(slice.bytes) +
                       kFileWeight * static_cast<double>(slice.files);
        seconds_taken_ =
            seconds_taken_ * kDecay + std::chrono::duration<double>(now - since).count();
    }
}

/// Counting a long backlog takes its time, so it may take a twentieth of it at most.
void ShareWorker::ShowWaiting() {
    const auto begin = CatchUp::Clock::now();
    if (begin < next_show_ && place_->backlog.NextDue()) {
        return;
    }
    const Backlog::Totals totals = place_->backlog.GetTotals();
    next_show_ = begin + 20 * (CatchUp::Clock::now() - begin);
    StateFile::Waiting waiting{totals.files, totals.bytes, totals.failed, "", -1};
    if (totals.places > 0) {
        waiting.phase = "names";
    } else if (totals.files > 0) {
        waiting.phase = "contents";
        const double left =
            static_cast<double>(totals.bytes) + kFileWeight * static_cast<double>(totals.files);
        if (weight_done_ > 0) {
            waiting.eta = static_cast<std::int64_t>(left * seconds_taken_ / weight_done_) + 1;
        }
    }
    state_.SetWaiting(waiting);
}

}  // namespace fileindexd
