#include "programs/fileindexd/controller.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <csignal>
#include <ctime>
#include <memory>
#include <utility>
#include <vector>

#include "base/path.h"
#include "base/private_directory.h"
#include "common/error.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexd/backlog.h"
#include "programs/fileindexd/state_file.h"
#include "programs/fileindexd/worker.h"
#include "sdk/share.h"

namespace fileindexd {

using namespace quivra::fileindex;

namespace {

/// The system clock may be set: the end of a pause is looked at this often.
constexpr std::chrono::seconds kPauseCheck{30};

/// A killed worker ends, unless the kernel itself waits for a disk on its behalf.
constexpr std::chrono::seconds kLongestStop{10};

/// What waits for a share goes with it. Where its place cannot be reached, there is nothing to
/// drop.
void DropBacklog(const std::string& share) {
    try {
        const std::string queue = quivra::sdk::SDKShare(share).GetQueuePath();
        const auto directory =
            quivra::base::PrivateDirectory::Open(std::string(quivra::base::Directory(queue)));
        if (directory.IsValid()) {
            Backlog::Remove(directory);
        }
    } catch (const quivra::Error&) {
        errno = 0;
    }
}

}  // namespace

Controller::Controller(Supervisor& supervisor)
    : supervisor_(supervisor), resume_time_(StatusMgr().GetPauseInfo()) {
    supervisor_.SetEndListener([this](const std::string& share) { ShowStopped(share); });
    indexed_ = ReadShares();
    Reconcile(Clock::now());
}

bool Controller::IsPaused() const {
    return resume_time_ == kPausedWithoutEnd || time(nullptr) < resume_time_;
}

std::set<std::string> Controller::ReadShares() {
    std::vector<std::shared_ptr<Folder>> folders;
    unsigned int total = 0;
    FolderMgr().List(folders, total, 0, UINT_MAX, "path", "");
    std::set<std::string> all;
    std::set<std::string> unpaused;
    for (const auto& folder : folders) {
        all.insert(folder->GetShare());
        if (!folder->GetPaused()) {
            unpaused.insert(folder->GetShare());
        }
    }
    std::erase_if(commanded_, [&](const auto& entry) { return !all.contains(entry.first); });
    known_ = std::move(all);
    return unpaused;
}

void Controller::Reconcile(Clock::time_point now) {
    std::set<std::string> wanted;
    was_paused_ = IsPaused();
    if (!shut_down_) {
        wanted = indexed_;
        for (const auto& [share, created] : commanded_) {
            if (created) {
                wanted.insert(share);
            } else {
                wanted.erase(share);
            }
        }
    }
    const std::set<std::string> paused =
        was_paused_ ? std::exchange(wanted, {}) : std::set<std::string>();
    supervisor_.SetWanted(wanted, now);
    for (const std::string& share : std::exchange(paused_, paused)) {
        ShowStopped(share);
    }
    for (const std::string& share : paused_) {
        ShowStopped(share);
    }
}

void Controller::ShowStopped(const std::string& share) const {
    if (supervisor_.IsRunning(share) || supervisor_.IsWanted(share)) {
        return;  // the worker writes the file, or it is called again when the worker has ended
    }
    if (paused_.contains(share)) {
        StateFile(share).Set(StateFile::State::kPaused);
    } else {
        StateFile(share).Remove();
    }
}

void Controller::Execute(const Command& command, Reply reply, Clock::time_point now) {
    switch (command.type) {
        case Command::Type::kState:
            return reply(DataReply(DescribeShares()));
        case Command::Type::kRetry:
            return reply(Retry(command.share));
        case Command::Type::kFailed:
            return reply(ErrorReply(quivra::Error::kBadArgument, "Not answered here"));
        case Command::Type::kPause:
            resume_time_ = command.resume_time;
            break;
        case Command::Type::kResume:
            resume_time_ = kNotPaused;
            break;
        case Command::Type::kSettingChanged:
            commanded_.erase(command.share);
            indexed_ = ReadShares();
            break;
        case Command::Type::kWorkerCreate:
            indexed_ = ReadShares();
            commanded_[command.share] = true;
            break;
        case Command::Type::kWorkerDelete:
            commanded_[command.share] = false;
            break;
    }
    Reconcile(now);
    const bool must_stop = command.type == Command::Type::kWorkerDelete ||
                           command.type == Command::Type::kSettingChanged;
    if (must_stop && !supervisor_.IsWanted(command.share)) {
        // Its queue and its index may be taken away next.
        waiting_.push_back(
            {command.share, std::move(reply), now + kLongestStop,
             command.type == Command::Type::kSettingChanged && !known_.contains(command.share)});
        AnswerWaiting(now);
    } else {
        reply(SuccessReply());
    }
}

/// What the workers say of themselves; of one that says nothing, why.
Json::Value Controller::DescribeShares() const {
    std::set<std::string> shares = indexed_;
    shares.insert(paused_.begin(), paused_.end());
    for (const auto& [share, created] : commanded_) {
        created ? void(shares.insert(share)) : void(shares.erase(share));
    }
    Json::Value data;
    data["shares"] = Json::Value(Json::arrayValue);
    for (const std::string& share : shares) {
        Json::Value state = StateFile::Read(share);
        if (state.isNull()) {
            state["share"] = share;
            state["state"] = "waiting";
            state["problem"] = supervisor_.IsRunning(share)
                                   ? ""
                                   : "the worker of share " + share + " has ended; see the log";
            for (const char* member : {"waiting", "waiting_bytes", "failed"}) {
                state[member] = 0;
            }
            state["phase"] = "";
            state["eta"] = -1;
        }
        data["shares"].append(state);
    }
    return data;
}

std::string Controller::Retry(const std::string& share) const {
    const pid_t pid = supervisor_.PidOf(share);
    if (pid <= 0 || kill(pid, kRetrySignal) != 0) {
        return ErrorReply(quivra::Error::kBadArgument,
                          "Share " + share + " has no worker: it is paused, or not indexed");
    }
    return SuccessReply();
}

void Controller::Reload(Clock::time_point now) {
    const std::int64_t resume_time = StatusMgr().GetPauseInfo();
    indexed_ = ReadShares();
    resume_time_ = resume_time;
    Reconcile(now);
}

void Controller::AnswerWaiting(Clock::time_point now) {
    for (auto it = waiting_.begin(); it != waiting_.end();) {
        if (supervisor_.IsRunning(it->share) && now < it->until) {
            ++it;
        } else if (supervisor_.IsRunning(it->share)) {
            it->reply(ErrorReply(quivra::Error::kSystemCallFailed,
                                 "The worker of share " + it->share +
                                     " does not end: it waits for a disk, perhaps"));
            it = waiting_.erase(it);
        } else {
            if (it->is_dropped) {
                DropBacklog(it->share);
            }
            it->reply(SuccessReply());
            it = waiting_.erase(it);
        }
    }
}

void Controller::Update(Clock::time_point now) {
    if (was_paused_ != IsPaused()) {
        Reconcile(now);
    }
    supervisor_.Update(now);
    AnswerWaiting(now);
}

std::optional<Controller::Clock::time_point> Controller::Due(Clock::time_point now) const {
    std::optional<Clock::time_point> due = supervisor_.NextUpdate();
    for (const Waiting& waiting : waiting_) {
        due = std::min(due.value_or(waiting.until), waiting.until);
    }
    if (was_paused_ && resume_time_ != kPausedWithoutEnd) {
        const std::chrono::seconds left(std::max<std::int64_t>(resume_time_ - time(nullptr), 0));
        const Clock::time_point check = now + std::min(left, kPauseCheck);
        due = std::min(due.value_or(check), check);
    }
    return due;
}

void Controller::ShutDown(Clock::time_point now) {
    shut_down_ = true;
    Reconcile(now);
    AnswerWaiting(now);
}

}  // namespace fileindexd
