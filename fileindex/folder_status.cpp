#include "fileindex/folder_status.h"

#include <ctime>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

/// The unit of Folder, on whose behalf this speaks. Below 1000 are marks that support tools know.
constexpr LogUnit kLog{"folder.cpp", 1000};

/// What lies in no share cannot be indexed either.
bool CanBeIndexed(const Folder& folder) {
    try {
        return CanPathBeIndexed(folder.GetPath());
    } catch (const Error& error) {
        if (error.code != Error::kNoSuchShare) {
            throw;
        }
        return false;
    }
}

bool IsPausedNow(const StatusMgr& status) {
    const std::int64_t resume_time = status.GetPauseInfo();
    return resume_time == kPausedWithoutEnd || time(nullptr) < resume_time;
}

}  // namespace

const StatusMgr& FolderStatus::Status() {
    if (!status_) {
        status_.emplace();
    }
    return *status_;
}

bool FolderStatus::IsIndexing(const Folder& folder) {
    const std::string& share = folder.GetShare();
    auto known = touched_.find(share);
    if (known == touched_.end()) {
        // Not consulted: who asks learns here when the configured folders cannot be read.
        const FolderMgr folder_mgr;
        std::set<std::string> full_paths;
        for (const Folder* other : folders_) {
            if (other->GetShare() == share) {
                full_paths.insert(other->GetFullPath());
            }
        }
        const std::string queue_path = sdk::SDKShare(share).GetQueuePath();
        known = touched_.emplace(share, TouchedPaths(queue_path, full_paths)).first;
    }
    return known->second.Contain(folder.GetFullPath());
}

void FolderStatus::Write(Json::Value& out, const Folder& folder) {
    const StatusMgr& status = Status();
    if (!out.isObject()) {
        out = Json::Value(Json::objectValue);
    }
    if (!CanBeIndexed(folder)) {
        out["text"] = "error";
        out["desc"] = "invalid_path";
    } else if ((status.GetShareStatus(folder.GetShare()) & kShareNeedReindex) != 0) {
        out["text"] = "need_reindex";
    } else if (!IsIndexing(folder)) {
        out["text"] = "finished";
    } else {
        out["text"] = IsPausedNow(status) ? "paused" : "processing";
    }
}

Json::Value FolderStatus::DataWithAdditional(const Folder& folder, const Json::Value& additionals) {
    Json::Value data = folder.GetData();
    if (!additionals.isArray()) {
        Fail({"folder.cpp", 45}, "!addiitionals.isArray()",
             Error(Error::kBadArgument, toString(additionals)));
    }
    for (const Json::Value& it : additionals) {
        if (!it.isString()) {
            Fail({"folder.cpp", 48}, "!it.isString()", Error(Error::kBadArgument, toString(it)));
        }
        const std::string name = it.asString();
        QUIVRA_FAIL_IF(kLog, "status" != name,
                       Error(Error::kBadArgument, "Unknown additioal: " + name));
        Write(data["additional"]["status"], folder);
    }
    return data;
}

}  // namespace quivra::fileindex
