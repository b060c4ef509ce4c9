#include "programs/fileindexd/state_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <ctime>

#include "base/file.h"
#include "base/unique_fd.h"
#include "common/json.h"
#include "common/log.h"

namespace fileindexd {

namespace {

constexpr const char* kUnit = "state_file";
constexpr std::chrono::seconds kWriteInterval{1};

const char* Name(StateFile::State state) {
    switch (state) {
        case StateFile::State::kIdle:
            return "idle";
        case StateFile::State::kSettling:
            return "settling";
        case StateFile::State::kProcessing:
            return "processing";
        case StateFile::State::kWaiting:
            return "waiting";
        case StateFile::State::kProblem:
            return "problem";
        case StateFile::State::kPaused:
            return "paused";
    }
    return "";
}

std::string PathOf(const std::string& share) {
    return std::string(kRunDirectory) + "/" + share + ".json";
}

/// Unlike a configuration file's, this text is not synced: it means nothing after a restart.
bool Replace(const std::string& path, const std::string& text) {
    const std::string aside = path + "." + std::to_string(getpid());
    {
        const quivra::base::UniqueFd fd(
            open(aside.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, 0600));
        if (!fd.IsValid()) {
            return false;
        }
        if (quivra::base::WriteAll(fd.Get(), text) && rename(aside.c_str(), path.c_str()) == 0) {
            return true;
        }
    }
    const int error = errno;
    unlink(aside.c_str());
    errno = error;
    return false;
}

}  // namespace

void MakeRunDirectory() {
    // The files name what other users keep private; an earlier version made it 0755.
    if ((mkdir(kRunDirectory, 0700) != 0 && errno != EEXIST) || chmod(kRunDirectory, 0700) != 0) {
        quivra::Fail({kUnit, __LINE__}, "mkdir(kRunDirectory, 0700) != 0",
                     quivra::Error(quivra::Error::kSystemCallFailed,
                                   std::string("Cannot make ") + kRunDirectory + ": " +
                                       quivra::SystemErrorText(errno)));
    }
    errno = 0;
}

StateFile::StateFile(std::string share) : share_(std::move(share)) {}

void StateFile::Set(State state) {
    if (state == state_ && !is_new_) {
        return;
    }
    state_ = state;
    progress_ = {};
    problem_.clear();
    Write();
}

void StateFile::SetProblem(const std::string& sentence) {
    if (problem_ == sentence && state_ == State::kProblem) {
        return;
    }
    state_ = State::kProblem;
    progress_ = {};
    problem_ = sentence;
    Write();
}

void StateFile::SetWaiting(const Waiting& waiting) {
    is_new_ |= !(waiting_ == waiting);
    waiting_ = waiting;
}

void StateFile::SetProgress(const PassState& progress) {
    const bool entered = state_ != State::kProcessing;
    if (!entered && std::chrono::steady_clock::now() - written_ < kWriteInterval) {
        return;
    }
    state_ = State::kProcessing;
    problem_.clear();
    progress_ = progress;
    Write();
}

void StateFile::SetLastPass(std::int64_t seconds_since_epoch) {
    is_new_ |= last_pass_ != seconds_since_epoch;
    last_pass_ = seconds_since_epoch;
}

void StateFile::SetLastError(const std::string& error) {
    is_new_ |= last_error_ != error;
    last_error_ = error;
}

void StateFile::Remove() {
    unlink(PathOf(share_).c_str());
}

Json::Value StateFile::Read(const std::string& share) {
    Json::Value state;
    int pid = 0;
    if (!quivra::fromFile(state, PathOf(share)) || !state.isObject()) {
        return Json::nullValue;
    }
    try {
        quivra::GetJsonValue(pid, state, "pid", true);
    } catch (const quivra::Error&) {
        return Json::nullValue;
    }
    return pid > 0 && kill(pid, 0) == 0 ? state : Json::Value();
}

void StateFile::Write() {
    is_new_ = false;
    written_ = std::chrono::steady_clock::now();
    Json::Value state;
    state["share"] = share_;
    state["pid"] = getpid();
    state["state"] = Name(state_);
    state["done"] = Json::UInt64(progress_.done);
    state["total"] = Json::UInt64(progress_.total);
    state["current"] = progress_.current;
    state["problem"] = problem_;
    state["waiting"] = Json::UInt64(waiting_.files);
    state["waiting_bytes"] = Json::UInt64(waiting_.bytes);
    state["failed"] = Json::UInt64(waiting_.failed);
    state["phase"] = waiting_.phase;
    state["eta"] = Json::Int64(waiting_.eta);
    state["last_error"] = last_error_;
    state["last_pass"] = Json::Int64(last_pass_);
    state["updated"] = Json::Int64(time(nullptr));
    if (!Replace(PathOf(share_), quivra::toString(state) + "\n")) {
        quivra::LogError({kUnit, __LINE__}, "Cannot write %s", PathOf(share_).c_str());
    }
}

}  // namespace fileindexd
