#include "programs/fileindexctl/share_operations.h"

#include <array>
#include <climits>

#include <kesto/fileidx.h>
#include <kesto/monitor_queue.h>

#include "base/path.h"
#include "common/util.h"
#include "fileindex/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/search.h"
#include "programs/fileindexctl/session.h"
#include "programs/fileindexctl/shares.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

/// Where a share's index is, below its root.
constexpr const char* kIndexDirectory = "/@eaDir/fileindex";

/// A share without folders is passed over by the library; who names it should learn that.
void NeedsFolders(const std::string& share) {
    if (!fileindex::FolderMgr().IsShareIndexed(share)) {
        throw Failure("share " + share +
                      " has no indexed folder; see 'fileindexctl folder list' for those that have");
    }
}

/// A rename that was interrupted may have moved the folders already.
void NeedsFoldersOfEither(const std::string& from, const std::string& to) {
    if (!fileindex::FolderMgr().IsShareIndexed(to)) {
        NeedsFolders(from);
    }
}

/// The same for a volume, by the rule that the library selects its folders by.
void NeedsFoldersBelow(const std::string& mount_point) {
    const fileindex::FolderMgr folders;
    for (const auto& folder : folders.GetFolders()) {
        if (!RootOf(folder->GetShare()).empty() && folder->GetFullPath().starts_with(mount_point)) {
            return;
        }
    }
    throw Failure("volume " + mount_point +
                  " has no indexed folder; see 'fileindexctl status' for those that have");
}

/// Without one the library would report success and do nothing.
void NeedsFoldersToClean(const std::string& mount_point) {
    const fileindex::FolderMgr folders;
    for (const auto& folder : folders.GetFolders()) {
        if (folder->GetPaused() && folder->GetVolumeToBeClean() == mount_point) {
            return;
        }
    }
    throw Failure("volume " + mount_point + " has no paused folder that waits to be cleared");
}

/// The last component of a share's root is its name.
void RequireRootName(const std::string& share, const std::string& root) {
    // Typed wrong, the path would lead to another share's queue and index, which are removed.
    if (base::Name(root) != share) {
        throw Failure("the root of share " + share + " ends in /" + share + ", so it was not " +
                      root);
    }
}

/// What keeps the queue of a share filling and its worker running, for one that the platform does
/// not know any more: SharePause would ask it for the share.
void Detach(const std::string& share, const std::string& root) {
    Json::Value data(Json::objectValue);
    data["share_name"] = share;
    fileindex::SendCommandToDaemon("worker_delete", data);
    std::array<char, PATH_MAX> queue{};
    if (FILEIDXQueuePathCompose(root.c_str(), queue.data(), static_cast<int>(queue.size())) < 0 ||
        !KESTO::KESTOTIFYD::MonitorQueue::Delete(queue.data(), fileindex::kAppName,
                                                 MONITOR_QUEUE_TYPE_APPLICATION)) {
        throw Failure("cannot clear share " + share +
                      ": its registration with the file monitor cannot be removed");
    }
}

}  // namespace

void PauseShare(const std::string& share) {
    NeedsFolders(share);
    // Checked here, because the library first tells the daemon to end the worker.
    RequirePlaceOfIndex(share);
    fileindex::SharePause(share);
}

void ResumeShare(const std::string& share) {
    NeedsFolders(share);
    RequirePlaceOfIndex(share);
    fileindex::ShareResume(share);
}

/// The library forgets a share that is at rest; here it is brought to rest first.
void ClearShare(const std::string& share, const std::string& path) {
    const std::string root = CanonicalPath(path);
    RequireRootName(share, root);
    const std::string present_root = RootOf(share);
    if (!present_root.empty() && present_root != root) {
        throw Failure("cannot clear share " + share + " at " + root + ": its root is " +
                      present_root);
    }
    // A worker at work would make its files anew, and the monitor the queue.
    if (fileindex::FolderMgr().IsShareIndexed(share)) {
        present_root.empty() ? Detach(share, root) : fileindex::SharePause(share);
    } else if (!IsDirExist(root + kIndexDirectory, false)) {
        throw Failure("there is nothing to clear: no folder of share " + share +
                      " is indexed, and no index lies below " + root);
    }
    fileindex::ShareClearPaused(share, root);
}

void RenameShare(const std::string& from, const std::string& to) {
    NeedsFoldersOfEither(from, to);
    // The library would carry the folders over, and leave a share that looks as if never indexed.
    if (!RootOf(from).empty()) {
        throw Failure("cannot rename share " + from + " to " + to + ": share " + from +
                      " still has its old name; rename it in /etc/kesto/shares.conf first");
    }
    fileindex::ShareRename(from, to);
}

void MigrateShare(const std::string& share, const std::string& path) {
    NeedsFolders(share);
    const std::string old_root = CanonicalPath(path);
    RequireRootName(share, old_root);
    const std::string root = sdk::SDKShare(share).GetPath();
    const std::string attempt = "cannot migrate share " + share + " from " + old_root + ": ";
    if (root == old_root) {
        throw Failure(attempt + "it still lies there; move it in /etc/kesto/shares.conf first");
    }
    if (!IsDirExist(root, false)) {
        throw Failure(attempt + "its present root " + root +
                      " is not there; mount the volume or make the directory first");
    }
    // An index that was moved along with its share cannot be asked before the daemon knows where it
    // is, and proves the old root by not being there any more. Any other can: documents are kept by
    // their full paths.
    const bool moved_along =
        !IsDirExist(old_root + kIndexDirectory, false) && IsDirExist(root + kIndexDirectory, false);
    if (!moved_along && CountDocuments(share, old_root) == 0) {
        throw Failure(attempt +
                      "its index holds nothing below that path; name the root that the "
                      "share had before");
    }
    fileindex::ShareMigrate(share, old_root);
}

void CheckRecycleBin(const std::string& share) {
    NeedsFolders(share);
    RequirePlaceOfIndex(share);
    fileindex::ShareCheckRecycle(share);
}

void PauseVolume(const std::string& mount_point) {
    NeedsFoldersBelow(mount_point);
    fileindex::VolumePause(mount_point);
}

void ResumeVolume(const std::string& mount_point) {
    NeedsFoldersBelow(mount_point);
    fileindex::VolumeResume(mount_point);
}

void ClearVolume(const std::string& mount_point) {
    NeedsFoldersToClean(mount_point);
    fileindex::VolumeClearPaused(mount_point);
}

}  // namespace quivra::ctl
