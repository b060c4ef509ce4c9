#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/event.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_status.h"
#include "fileindex/index_mgr.h"
#include "fileindex/operations/steps.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

using FolderPtr = FolderMgr::FolderPtr;

/// What a request changed in the set, before anybody is told.
struct Changes {
    std::vector<FolderPtr> diffs;  // in the request's order
    std::set<std::string> shares;
};

/// Makes one element of a request part of the set.
void UpsertFolder(FolderMgr& folder_mgr, Changes& changes, const Json::Value& element, bool create,
                  bool updater_mode) {
    const auto folder_new = std::make_shared<Folder>(element);
    QUIVRA_FAIL_IF(unit::kFolderOperations,
                   !CanPathBeIndexed(folder_new->GetPath()) && !updater_mode,
                   Error(Error::kPathNotIndexable, "Path cannot index: " + folder_new->GetPath()));
    QUIVRA_FAIL_IF(unit::kFolderOperations, create && folder_mgr.HasFolder(folder_new->GetPath()),
                   Error(Error::kDuplicateFolder, "Duplicated ID: " + folder_new->GetPath()));
    folder_mgr.Upsert(changes.diffs.emplace_back(), folder_new);
    if (changes.shares.contains(folder_new->GetShare())) {
        return;  // one look at its space serves all its folders
    }
    const sdk::SDKShare share(folder_new->GetShare());
    QUIVRA_FAIL_IF(
        unit::kFolderOperations, !share.IsSpaceEnough(),
        Error(Error::kSpaceNotEnough, "Share (" + folder_new->GetShare() + ") space not enough"));
    changes.shares.insert(folder_new->GetShare());
}

bool HasChangedContent(const Folder& diff) {
    return diff.GetDocument() || diff.GetAudio() || diff.GetVideo() || diff.GetPhoto();
}

/// The content that a change adds or drops.
CustomEvent ConfigEvent(const Folder& diff) {
    return {EVENT_UPDATE_CFG, diff.GetFullPath(), "", diff.GetIndexCfg()};
}

void UpsertFolders(const Json::Value& folder_list, bool create, bool updater_mode) {
    const LockFile lock(kFileIndexFoldersLockPath, true);
    FolderMgr folder_mgr;
    const FolderMgr folder_mgr_before;
    QUIVRA_FAIL_IF(unit::kFolderOperations, !folder_list.isArray(),
                   Error(Error::kBadArgument, "Not an array" + AppendData(folder_list)));
    Changes changes;
    for (const Json::Value& element : folder_list) {
        UpsertFolder(folder_mgr, changes, element, create, updater_mode);
    }
    folder_mgr.Save();
    SwitchServices(true);
    for (const std::string& share : changes.shares) {
        if (create && !folder_mgr_before.IsShareIndexed(share)) {
            elastic::ShareIndexCreate(share);
        }
        NotifySettingChanged(share, true);
        UpsertMonitorQueue(share);
    }
    std::vector<CustomEvent> events;
    for (const FolderPtr& diff : changes.diffs) {
        if (HasChangedContent(*diff)) {
            events.push_back(ConfigEvent(*diff));
        }
    }
    QueueCustomEvents(events);
}

struct Reindexes {
    std::vector<CustomEvent> events;
    std::map<std::string, std::string> shares;  // by the full path of an event
};

void AddReindex(Reindexes& reindexes, const std::string& path, const FolderMgr& folder_mgr) {
    std::string share_name;
    GetShareNameByPath(share_name, path);
    if (!folder_mgr.IsShareIndexed(share_name)) {
        return;
    }
    std::string full_path;
    GetFullPath(full_path, path);
    reindexes.events.push_back({EVENT_REINDEX, full_path, "", Json::Value()});
    reindexes.shares.emplace(full_path, share_name);
}

/// A share without folders left: its index and data go.
void DropShare(const std::string& share_name) {
    const sdk::SDKShare share(share_name);
    DeleteMonitorQueue(share_name);
    elastic::ShareIndexDelete(share_name);
    RemoveShareIndexData(share_name, share.GetPath());
}

}  // namespace

void FolderAdd(const Json::Value& folder_list, bool updater_mode) {
    UpsertFolders(folder_list, true, updater_mode);
}

void FolderSet(const Json::Value& folder_list, bool updater_mode) {
    UpsertFolders(folder_list, false, updater_mode);
}

void FolderDelete(const Json::Value& path_list) {
    const LockFile lock(kFileIndexFoldersLockPath, true);
    FolderMgr folder_mgr;
    QUIVRA_FAIL_IF(unit::kFolderOperations, !path_list.isArray(),
                   Error(Error::kBadArgument, "Not an array" + AppendData(path_list)));
    Changes changes;
    for (const Json::Value& it : path_list) {
        QUIVRA_FAIL_IF(unit::kFolderOperations, !it.isString(),
                       Error(Error::kBadArgument, "Not a string" + AppendData(it)));
        const std::string path = it.asString();
        folder_mgr.Delete(changes.diffs.emplace_back(), path);
        std::string share_name;
        GetShareNameByPath(share_name, path);
        changes.shares.insert(share_name);
    }
    folder_mgr.Save();
    std::vector<CustomEvent> events;
    for (const FolderPtr& diff : changes.diffs) {
        // Also when an enclosing folder has the same switches: it does not index all that a folder
        // of its own does (see updater_mode).
        events.push_back(ConfigEvent(*diff));
    }
    QueueCustomEvents(events);
    for (const std::string& share : changes.shares) {
        NotifySettingChanged(share, false);
        if (folder_mgr.IsShareIndexed(share)) {
            UpsertMonitorQueue(share);
        } else {
            DropShare(share);
        }
    }
    if (folder_mgr.GetFolders().empty()) {
        SwitchServices(false);
    }
}

void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional) {
    const FolderMgr folder_mgr;
    std::vector<FolderPtr> page;
    unsigned int total = 0;
    folder_mgr.List(page, total, offset, limit, sort_by, sort_direction);
    Json::Value list;
    list["folder"] = Json::Value(Json::arrayValue);
    std::vector<const Folder*> folders;
    for (const FolderPtr& folder : page) {
        folders.push_back(folder.get());
    }
    FolderStatus status(folders);
    for (const Folder* folder : folders) {
        list["folder"].append(status.DataWithAdditional(*folder, additional));
    }
    list["total"] = total;
    list["offset"] = offset;
    result = list;
}

void FolderGet(Json::Value& result, const std::string& path) {
    const FolderMgr folder_mgr;
    FolderPtr folder;
    folder_mgr.Get(folder, path);
    result = folder->GetData();
}

void FolderReindex(const Json::Value& path_list) {
    StatusMgr status_mgr;
    const FolderMgr folder_mgr;
    QUIVRA_FAIL_IF(unit::kFolderOperations, !path_list.isArray(),
                   Error(Error::kBadArgument, "Not an array" + AppendData(path_list)));
    Reindexes reindexes;
    try {
        for (const Json::Value& it : path_list) {
            QUIVRA_FAIL_IF(unit::kFolderOperations, !it.isString(),
                           Error(Error::kBadArgument, "Not a string" + AppendData(it)));
            AddReindex(reindexes, it.asString(), folder_mgr);
        }
    } catch (const Error&) {
        QueueCustomEvents(reindexes.events);  // what was asked for before the mistake
        throw;
    }
    std::set<std::string> shares;
    for (const auto& [full_path, share] : reindexes.shares) {
        shares.insert(share);
    }
    for (const std::string& full_path : QueueCustomEvents(reindexes.events)) {
        shares.erase(reindexes.shares.at(full_path));  // the need for a reindex has not ended
    }
    for (const std::string& share : shares) {
        if ((status_mgr.GetShareStatus(share) & kShareNeedReindex) != 0) {
            status_mgr.UnsetShareStatus(share, kShareNeedReindex);
        }
    }
}

}  // namespace quivra::fileindex
