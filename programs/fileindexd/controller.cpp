#include "programs/fileindexd/controller.h"

#include <algorithm>
#include <chrono>
#include <climits>
#include <ctime>
#include <memory>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexd/state_file.h"

namespace fileindexd {

using namespace quivra::fileindex;

namespace {

/// The system clock may be set: the end of a pause is looked at this often.
constexpr std::chrono::seconds kPauseCheck{30};

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
        waiting_.push_back({command.share, std::move(reply)});
        AnswerWaiting();
    } else {
        reply(SuccessReply());
    }
}

void Controller::Reload(Clock::time_point now) {
    const std::int64_t resume_time = StatusMgr().GetPauseInfo();
    indexed_ = ReadShares();
    resume_time_ = resume_time;
    Reconcile(now);
}

void Controller::AnswerWaiting() {
    for (auto it = waiting_.begin(); it != waiting_.end();) {
        if (supervisor_.IsRunning(it->share)) {
            ++it;
        } else {
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
    AnswerWaiting();
}

std::optional<Controller::Clock::time_point> Controller::Due(Clock::time_point now) const {
    std::optional<Clock::time_point> due = supervisor_.NextUpdate();
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
    AnswerWaiting();
}

}  // namespace fileindexd
