#include <set>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/operations/steps.h"
#include "fileindex/status_mgr.h"

namespace quivra::fileindex {
namespace {

void SavePausedOfShare(const FolderMgr& folder_mgr, const std::string& share, bool paused) {
    for (const auto& folder : folder_mgr.GetFolders()) {
        if (folder->GetShare() == share) {
            folder->SetPaused(paused);
        }
    }
    folder_mgr.Save();
}

/// Marks the folders of a volume; returns their shares.
std::set<std::string> SavePausedOfVolume(const std::string& mount_point, bool paused) {
    const FolderMgr folder_mgr;
    std::set<std::string> shares;
    for (const auto& folder : folder_mgr.GetFolders()) {
        // A plain prefix, without regard to components, is what callers rely on. A folder whose
        // share is gone is on no volume.
        const std::string* full_path = folder_mgr.FindFullPath(*folder);
        if (full_path != nullptr && StringStartWith(*full_path, mount_point)) {
            folder->SetPaused(paused);
            shares.insert(folder->GetShare());
        }
    }
    folder_mgr.Save();
    return shares;
}

void SaveAfterClear(const FolderMgr& folder_mgr) {
    folder_mgr.Save();
    if (folder_mgr.GetFolders().empty()) {
        SwitchServices(false);
    }
}

bool IsToBeCleaned(const Folder& folder, const std::string& mount_point) {
    if (log_level == kLogLevelDebug) {
        LogTrace(unit::kShareOperations.Here(), "Examine path=%s, paused=%d, volume_to_be_clean=%s",
                 folder.GetPath().c_str(), folder.GetPaused() ? 1 : 0,
                 folder.GetVolumeToBeClean().c_str());
    }
    return folder.GetPaused() && folder.GetVolumeToBeClean() == mount_point;
}

}  // namespace

void SharePause(const std::string& share_name) {
    const FolderMgr folder_mgr;
    QUIVRA_FAIL_IF(unit::kShareOperations, share_name.empty(),
                   Error(Error::kBadArgument, "Missing share name"));
    if (!folder_mgr.IsShareIndexed(share_name)) {
        return;
    }
    // The worker first, or it would meet a paused index; the mark last, so that a failure leaves a
    // share that is not called paused and can be paused again.
    DeleteWorker(share_name);
    DeleteMonitorQueue(share_name);
    elastic::ShareIndexPause(share_name);
    SavePausedOfShare(folder_mgr, share_name, true);
}

void ShareResume(const std::string& share_name) {
    const FolderMgr folder_mgr;
    QUIVRA_FAIL_IF(unit::kShareOperations, share_name.empty(),
                   Error(Error::kBadArgument, "Missing share name"));
    if (!folder_mgr.IsShareIndexed(share_name)) {
        return;
    }
    elastic::ShareIndexResume(share_name);
    UpsertMonitorQueue(share_name);
    CreateWorker(share_name);
    SavePausedOfShare(folder_mgr, share_name, false);
}

void VolumePause(const std::string& mount_point) {
    QUIVRA_FAIL_IF(unit::kShareOperations, mount_point.empty(),
                   Error(Error::kBadArgument, "Missing mount point"));
    for (const std::string& share : SavePausedOfVolume(mount_point, true)) {
        DeleteWorker(share);
        DeleteMonitorQueue(share);
        elastic::ShareIndexPause(share);
    }
}

void VolumeResume(const std::string& mount_point) {
    QUIVRA_FAIL_IF(unit::kShareOperations, mount_point.empty(),
                   Error(Error::kBadArgument, "Missing mount point"));
    for (const std::string& share : SavePausedOfVolume(mount_point, false)) {
        elastic::ShareIndexResume(share);
        CreateWorker(share);
        UpsertMonitorQueue(share);
    }
}

void ShareClearPaused(const std::string& share_name, const std::string& share_path) {
    FolderMgr folder_mgr;
    QUIVRA_FAIL_IF(unit::kShareOperations, share_name.empty(),
                   Error(Error::kBadArgument, "Missing share name"));
    QUIVRA_FAIL_IF(unit::kShareOperations, share_path.empty(),
                   Error(Error::kBadArgument, "Missing share path"));
    RemoveShareIndexData(share_name, share_path);
    elastic::ShareIndexDelete(share_name);
    folder_mgr.DeleteByShare(share_name);
    SaveAfterClear(folder_mgr);
}

void VolumeClearPaused(const std::string& mount_point) {
    QUIVRA_FAIL_IF(unit::kShareOperations, mount_point.empty(),
                   Error(Error::kBadArgument, "Missing mount point"));
    FolderMgr folder_mgr;
    StatusMgr status_mgr;
    std::set<std::string> shares;
    for (const auto& folder : folder_mgr.GetFolders()) {
        if (IsToBeCleaned(*folder, mount_point)) {
            shares.insert(folder->GetShare());
        }
    }
    for (const std::string& share : shares) {
        // Nothing else: the volume is gone, and with it queues and indexes.
        status_mgr.ClearShareStatus(share);
        folder_mgr.DeleteByShare(share);
    }
    SaveAfterClear(folder_mgr);
}

}  // namespace quivra::fileindex
