#include "programs/fileindexd/repair.h"

#include <algorithm>
#include <climits>
#include <memory>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"

namespace fileindexd {

using namespace quivra::fileindex;

namespace {

std::vector<std::shared_ptr<Folder>> FoldersOf(const std::string& share) {
    std::vector<std::shared_ptr<Folder>> folders;
    unsigned int total = 0;
    FolderMgr().List(folders, total, 0, UINT_MAX, "path", "");
    std::erase_if(folders, [&](const auto& folder) { return folder->GetShare() != share; });
    return folders;
}

void Reindex(const std::vector<std::shared_ptr<Folder>>& folders) {
    Json::Value paths(Json::arrayValue);
    for (const auto& folder : folders) {
        paths.append(folder->GetPath());
    }
    FolderReindex(paths);
}

}  // namespace

void QueueReindex(const std::string& share) {
    Reindex(FoldersOf(share));
}

void RepairIfNeeded(const std::string& share) {
    if ((StatusMgr().GetShareStatus(share) & kShareNeedReindex) == 0) {
        return;
    }
    const quivra::sdk::SDKShare record(share);
    const auto folders = FoldersOf(share);
    if (folders.empty() || !record.IsSpaceEnough()) {
        return;
    }
    Reindex(folders);
    // An event that could not be queued has set the flag, which was then taken back all the same.
    const QueueMgr queue(record.GetQueuePath());
    if (!std::all_of(folders.begin(), folders.end(), [&](const auto& folder) {
            return queue.IsFullPathHasReindex(folder->GetFullPath());
        })) {
        StatusMgr().SetShareStatus(share, kShareNeedReindex);
    }
}

}  // namespace fileindexd
