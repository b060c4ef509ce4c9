#include "fileindex/status_mgr.h"

#include <sys/stat.h>

#include <cerrno>
#include <ctime>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/communication.h"
#include "sdk/credentials.h"

namespace quivra::fileindex {
namespace {

/// Below 1000 are marks that support tools know.
constexpr LogUnit kLog{"status_mgr.cpp", 1000};

constexpr const char* kResumeTime = "resume_time";
constexpr const char* kShare = "share";
constexpr std::uint32_t kSecondsPerHour = 3600;

/// In 32 bits, so a very long pause wraps to a negative time; unsigned, so the wrap is defined.
std::int64_t ResumeTimeIn(int hours) {
    if (hours == 0) {
        return kPausedWithoutEnd;
    }
    const auto now = static_cast<std::uint32_t>(time(nullptr));
    return static_cast<std::int32_t>(now + static_cast<std::uint32_t>(hours) * kSecondsPerHour);
}

}  // namespace

StatusMgr::StatusMgr() {
    Load();
}

void StatusMgr::Load() {
    // Aside, so that a file that cannot be read leaves this object as it was.
    Json::Value data;
    if (IsFileExist(kFileIndexStatusCfgPath) && !fromFile(data, kFileIndexStatusCfgPath)) {
        Fail(
            kLog.Here(),
            "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)",
            Error(Error::kLoadFailed, std::string("Cannot load json: ") + kFileIndexStatusCfgPath));
    }
    data_.swap(data);
}

void StatusMgr::Save() const {
    const sdk::SDKCredentials as_root("root");
    if (!toFile(data_, kFileIndexStatusCfgPath)) {
        Fail({"status_mgr.cpp", 121}, "!data_.toFile(kFileIndexStatusCfgPath)",
             Error(Error::kSaveFailed,
                   std::string("Failed to save json: ") + kFileIndexStatusCfgPath));
    }
    if (chmod(kFileIndexStatusCfgPath, 0644) == -1) {
        const std::string reason = "chmod failed, reason=" + SystemErrorText(errno);
        Fail({"status_mgr.cpp", 123}, "-1 == chmod(kFileIndexStatusCfgPath, 0644)",
             Error(Error::kSystemCallFailed, reason));
    }
}

void StatusMgr::Pause(int hours) {
    const LockFile lock(kFileIndexStatusLockPath, true);
    QUIVRA_FAIL_IF(kLog, 0 > hours,
                   Error(Error::kBadArgument, "Pause length should NOT be negative"));
    Load();
    // Saved before the daemon is told: it reads the file when it starts, and may be starting now.
    const std::int64_t resume_time = ResumeTimeIn(hours);
    SetResumeTime(resume_time);
    Json::Value data;
    data[kResumeTime] = Json::Int64{resume_time};
    SendCommandToDaemon("pause", data);
}

void StatusMgr::Resume() {
    const LockFile lock(kFileIndexStatusLockPath, true);
    Load();
    SetResumeTime(kNotPaused);
    SendCommandToDaemon("resume", Json::Value());
}

void StatusMgr::SetShareStatus(const std::string& share, ShareStatus flag) {
    const LockFile lock(kFileIndexStatusLockPath, true);
    Load();
    MutableShares()[share] = GetShareStatus(share) | flag;
    Save();
}

void StatusMgr::UnsetShareStatus(const std::string& share, ShareStatus flag) {
    const LockFile lock(kFileIndexStatusLockPath, true);
    Load();
    MutableShares()[share] = GetShareStatus(share) & ~static_cast<unsigned int>(flag);
    Save();
}

void StatusMgr::ClearShareStatus(const std::string& share) {
    const LockFile lock(kFileIndexStatusLockPath, true);
    Load();
    MutableShares().removeMember(share);
    Save();
}

std::int64_t StatusMgr::GetPauseInfo() const {
    long long resume_time = kNotPaused;
    GetJsonValue<long long>(resume_time, data_, kResumeTime, false);
    return resume_time;
}

unsigned int StatusMgr::GetShareStatus(const std::string& share) const {
    Json::Value shares;
    GetJsonValue(shares, data_, kShare, false);
    unsigned int flags = 0;
    GetJsonValue<unsigned int>(flags, shares, share, false);
    return flags;
}

void StatusMgr::SetResumeTime(std::int64_t resume_time) {
    if (!data_.isObject()) {
        data_ = Json::Value(Json::objectValue);
    }
    data_[kResumeTime] = Json::Int64{resume_time};
    Save();
}

Json::Value& StatusMgr::MutableShares() {
    // What somebody else left in the file must not stop a flag from being kept.
    if (!data_.isObject()) {
        data_ = Json::Value(Json::objectValue);
    }
    Json::Value& shares = data_[kShare];
    if (!shares.isObject()) {
        shares = Json::Value(Json::objectValue);
    }
    return shares;
}

}  // namespace quivra::fileindex
