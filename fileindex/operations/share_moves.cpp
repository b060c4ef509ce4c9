#include <algorithm>
#include <filesystem>
#include <string>
#include <system_error>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/event.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/operations/steps.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

constexpr const char* kHomesShare = "homes";
constexpr const char* kRecycleDirectory = "/#recycle";

/// A share that got another name or another place.
///
/// While a move is under way the share is flagged, under its new name, as needing a reindex: for
/// that long nobody watches it. The flag is the last thing to go. An interrupted move leaves it, so
/// that the repeated call knows that there is a rest to be done even where the folders have their
/// new name already, and queues the reindex which finds what changed meanwhile. Every step may be
/// carried out twice.
struct Move {
    std::string from;
    std::string to;
    std::string root_from;
    std::string root_to;
    std::string queue_path;
    std::string db_path;
};

Move DescribeMove(const std::string& from, const std::string& to) {
    const sdk::SDKShare share(to);
    Move move;
    move.from = from;
    move.to = to;
    move.root_to = share.GetPath();
    move.root_from = Dirname(move.root_to) + "/" + from;
    move.queue_path = share.GetQueuePath();
    move.db_path = share.GetDBPath();
    return move;
}

bool IsFlagged(const std::string& share) {
    return (StatusMgr().GetShareStatus(share) & kShareNeedReindex) != 0;
}

bool IsSharePaused(const FolderMgr& folder_mgr, const std::string& share) {
    const auto& folders = folder_mgr.GetFolders();
    return std::all_of(folders.begin(), folders.end(), [&](const auto& folder) {
        return folder->GetShare() != share || folder->GetPaused();
    });
}

void MoveIndex(const Move& move) {
    if (move.from == move.to) {
        elastic::ShareIndexMigrate(move.to, move.db_path);
    } else {
        elastic::ShareIndexRename(move.from, move.to, move.db_path);
    }
}

/// Gives the folders, then the flags, the share's new name.
void MoveConfiguration(const FolderMgr& folder_mgr, const Move& move) {
    for (const auto& folder : folder_mgr.GetFolders()) {
        if (folder->GetShare() == move.from) {
            folder->SetShare(move.to);
        }
    }
    folder_mgr.Save();
    const unsigned int flags = StatusMgr().GetShareStatus(move.from);
    StatusMgr().SetShareStatus(move.to, static_cast<ShareStatus>(flags));
    StatusMgr().ClearShareStatus(move.from);
}

/// Makes the documents follow. Not as a custom event: a pending reindex of the new place makes the
/// move of what is indexed at the old one by no means redundant.
void QueueMove(const Move& move, bool with_reindex) {
    Json::Value event;
    event["event"] = static_cast<int>(EVENT_RENAME);
    event["is_dir"] = true;
    event["path"] = move.root_to;
    event["path_old"] = move.root_from;
    event["data"] = Json::Value();
    QueueMgr(move.queue_path).Append(event);
    if (with_reindex) {
        event["event"] = static_cast<int>(EVENT_REINDEX);
        event["path_old"] = "";
        QueueMgr(move.queue_path).Append(event);
    }
}

void CarryOut(const FolderMgr& folder_mgr, const Move& move) {
    const bool is_renamed = move.from != move.to;
    const bool was_interrupted = IsFlagged(move.to);
    const bool keeps_flag = is_renamed && IsFlagged(move.from);
    StatusMgr().SetShareStatus(move.to, kShareNeedReindex);
    DeleteWorker(move.from);
    DeleteMonitorQueue(move.from, ComposeQueuePath(move.root_from));
    MoveIndex(move);
    if (is_renamed) {
        MoveConfiguration(folder_mgr, move);
    }
    QueueMove(move, was_interrupted);
    if (!IsSharePaused(folder_mgr, move.to)) {
        UpsertMonitorQueue(move.to);
        CreateWorker(move.to);
    }
    if (!keeps_flag) {
        StatusMgr().UnsetShareStatus(move.to, kShareNeedReindex);
    }
}

void ReindexRecycleDirectory(const std::string& directory) {
    AddCustomEvent(EVENT_REINDEX, directory + kRecycleDirectory, "", Json::Value());
}

}  // namespace

void ShareRename(const std::string& share_from, const std::string& share_to) {
    QUIVRA_FAIL_IF(unit::kShareMoves, share_from.empty(),
                   Error(Error::kBadArgument, "Missing share_from"));
    QUIVRA_FAIL_IF(unit::kShareMoves, share_to.empty(),
                   Error(Error::kBadArgument, "Missing share_to"));
    const LockFile lock(kFileIndexFoldersLockPath, true);
    const FolderMgr folder_mgr;
    const bool is_rest_due = folder_mgr.IsShareIndexed(share_to) && IsFlagged(share_to);
    if (share_from == share_to || (!folder_mgr.IsShareIndexed(share_from) && !is_rest_due)) {
        return;
    }
    CarryOut(folder_mgr, DescribeMove(share_from, share_to));
}

void ShareMigrate(const std::string& share, const std::string& share_path_from) {
    QUIVRA_FAIL_IF(unit::kShareMoves, share.empty(),
                   Error(Error::kBadArgument, "Missing share name"));
    QUIVRA_FAIL_IF(unit::kShareMoves, share_path_from.empty(),
                   Error(Error::kBadArgument, "Missing share path"));
    const LockFile lock(kFileIndexFoldersLockPath, true);
    const FolderMgr folder_mgr;
    if (!folder_mgr.IsShareIndexed(share)) {
        return;
    }
    Move move = DescribeMove(share, share);
    move.root_from = share_path_from;
    if (move.root_from != move.root_to) {
        CarryOut(folder_mgr, move);
    }
}

void ShareCheckRecycle(const std::string& share) {
    QUIVRA_FAIL_IF(unit::kShareMoves, share.empty(),
                   Error(Error::kBadArgument, "Missing share name"));
    if (!FolderMgr().IsShareIndexed(share)) {
        return;
    }
    const std::string root = sdk::SDKShare(share).GetPath();
    ReindexRecycleDirectory(root);
    if (share != kHomesShare) {
        return;
    }
    std::error_code error;
    for (std::filesystem::directory_iterator it(root, error), end; it != end; it.increment(error)) {
        if (IsDirExist(it->path().string() + kRecycleDirectory, false)) {
            ReindexRecycleDirectory(it->path().string());
        }
    }
}

}  // namespace quivra::fileindex
