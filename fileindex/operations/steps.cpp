#include "fileindex/operations/steps.h"

#include <kesto/fileidx.h>
#include <kesto/monitor_queue.h>
#include <kesto/process.h>

#include "base/queue_file.h"
#include "common/error.h"
#include "common/log.h"
#include "common/mutex.h"
#include "fileindex/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/credentials.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

using KESTO::KESTOTIFYD::MonitorQueue;

/// What the file monitor reports: of the low sixteen event bits all but 0x1, 0x8, 0x10 and 0x20.
constexpr int kMonitorMask = 0xFFC6;
constexpr const char* kMonitorIgnored = "@eaDir";
constexpr std::size_t kPathSize = 4096;

void SendWorkerCommand(const char* command, const std::string& share) {
    Json::Value data;
    data["share_name"] = share;
    SendCommandToDaemon(command, data);
}

Json::Value DescribeMonitorQueue(const std::string& share) {
    // As saved, not as the caller holds it: the monitor watches what the next start would read.
    const FolderMgr folder_mgr;
    Json::Value config;
    config["path"] = Json::Value(Json::arrayValue);
    for (const auto& folder : folder_mgr.GetFolders()) {
        if (folder->GetShare() == share) {
            config["path"].append(folder->GetFullPath());
        }
    }
    config["mask"] = kMonitorMask;
    config["ignore"].append(kMonitorIgnored);
    Json::Value description;
    description["queue"] = sdk::SDKShare(share).GetQueuePath();
    description["config"] = config;
    return description;
}

void RemoveTree(const std::string& path) {
    const char* const arguments[] = {"-rf", path.c_str(), nullptr};
    if (KLIBCExec("/bin/rm", arguments) != 0) {
        LogError(unit::kSteps.Here(), "Failed to remove %s", path.c_str());
    }
}

std::string ComposeDBPath(const std::string& share_path) {
    char path[kPathSize] = "";
    const LockMutex lock(sdk::SDKMutex());
    QUIVRA_FAIL_IF(
        unit::kSteps, 0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path)),
        Error(Error::kSystemCallFailed, "FILEIDXDBPathCompose failed, share_path=" + share_path));
    return path;
}

}  // namespace

void NotifySettingChanged(const std::string& share, bool is_upsert) {
    Json::Value data;
    data["share_name"] = share;
    data["is_upsert"] = is_upsert;
    SendCommandToDaemon("notify_setting_changed", data);
}

void CreateWorker(const std::string& share) {
    SendWorkerCommand("worker_create", share);
}

void DeleteWorker(const std::string& share) {
    SendWorkerCommand("worker_delete", share);
}

void UpsertMonitorQueue(const std::string& share) {
    const MonitorQueue monitor_queue(DescribeMonitorQueue(share));
    QUIVRA_FAIL_IF(unit::kSteps,
                   !MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION),
                   Error(Error::kSystemCallFailed, "MonitorQueue::Upsert failed, share=" + share));
}

void DeleteMonitorQueue(const std::string& share) {
    DeleteMonitorQueue(share, sdk::SDKShare(share).GetQueuePath());
}

void DeleteMonitorQueue(const std::string& share, const std::string& queue_path) {
    if (!MonitorQueue::Delete(queue_path, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)) {
        Fail(unit::kSteps.Here(),
             "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
             "MONITOR_QUEUE_TYPE_APPLICATION)",
             Error(Error::kSystemCallFailed, "MonitorQueue::Delete failed, share=" + share));
    }
}

std::string ComposeQueuePath(const std::string& share_path) {
    char path[kPathSize] = "";
    const LockMutex lock(sdk::SDKMutex());
    QUIVRA_FAIL_IF(unit::kSteps,
                   0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path)),
                   Error(Error::kSystemCallFailed,
                         "FILEIDXQueuePathCompose failed, share_path=" + share_path));
    return path;
}

void RemoveShareIndexData(const std::string& share, const std::string& share_path) {
    const std::string queue_path = ComposeQueuePath(share_path);
    RemoveTree(queue_path);
    RemoveTree(base::WorkingCopy(queue_path));
    RemoveTree(ComposeDBPath(share_path));
    StatusMgr().ClearShareStatus(share);
}

}  // namespace quivra::fileindex
