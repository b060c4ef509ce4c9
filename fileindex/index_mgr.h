#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

/// The management operations: what a front end calls. Every failure is a quivra::Error; errors of
/// the calls inside pass through: 502 and 913 when the indexing or the search daemon cannot be
/// reached, 800 and 502 for shares, 504, 505 and 120 for the configuration files, 506 for locks.
/// A search daemon that is busy is waited for. The functions keep no state, but not two threads of
/// one process may save configuration at the same time (the effective user is switched meanwhile).
namespace quivra::fileindex {

/// The name under which queues are registered with the file monitor.
inline constexpr const char* kAppName = "fileindex";

// --- Folders -------------------------------------------------------------------------------------

/// Add folders, or add and replace them: `folder_list` is an array of Folder::GetData objects and
/// is taken as a whole or not at all. Once the set is saved, services are started; for each touched
/// share an index is created (by FolderAdd, where no folder of the share was there before), the
/// indexing daemon told and the queue registered with the file monitor; then the content that
/// changed is queued. `updater_mode` accepts paths that may not be indexed. Both hold the folder
/// lock throughout.
///
/// Error 120: not an array, or a malformed element; 903: the path may not be indexed; 901
/// (FolderAdd): exists already; 900: more than 1000 folders; 1003: no space left on the share's
/// volume. In all these cases nothing has changed. A failure after the save (of a daemon, 502 of
/// the file monitor) leaves the set saved and the rest undone: delete the folders and add them
/// again.
QUIVRA_EXPORT void FolderAdd(const Json::Value& folder_list, bool updater_mode);
QUIVRA_EXPORT void FolderSet(const Json::Value& folder_list, bool updater_mode);

/// Removes the folders with these share paths (an array of strings) and queues the removal of
/// their content. A share without folders left loses its index, its queue and its registration; a
/// set without folders left stops the services. Holds the folder lock. Error 120: not an array,
/// or an element that is not a string; 902: no such folder. In these cases nothing has changed. A
/// failure after the save leaves the set saved; ShareClearPaused then drops what is left of a
/// share.
QUIVRA_EXPORT void FolderDelete(const Json::Value& path_list);

/// One page of the folders: {"folder": [Folder::GetDataWithAdditional...], "total": number of all
/// folders, "offset": as asked}. For the order see FolderMgr::List. With the status, each share's
/// queue is read once. Takes no lock.
QUIVRA_EXPORT void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                              const std::string& sort_by, const std::string& sort_direction,
                              const Json::Value& additional);

/// The Folder::GetData of the folder with this share path. Error 902 when there is none; `result`
/// is left as it was. Takes no lock.
QUIVRA_EXPORT void FolderGet(Json::Value& result, const std::string& path);

/// Queues a reindex of each share path in the array and ends the need for one that a share may be
/// flagged with. Paths in shares that no folder indexes are passed over. Error 120: not an
/// array, or an element that is not a string; those before it are queued then.
QUIVRA_EXPORT void FolderReindex(const Json::Value& path_list);

// --- Shares and volumes --------------------------------------------------------------------------

/// Stop and restart the indexing of one share: its worker, its file-monitor registration and its
/// index. Its folders are marked in the folders file as the last step, so a failure leaves them as
/// they were and the call can be repeated. A share that no folder indexes is passed over. Error
/// 120 "Missing share name". They take no folder lock: do not run them beside folder changes.
QUIVRA_EXPORT void SharePause(const std::string& share_name);
QUIVRA_EXPORT void ShareResume(const std::string& share_name);

/// The same for every share with a folder whose full path begins with the text `mount_point` (a
/// plain prefix: /volume1 takes /volume10 in). The folders are marked first. A folder whose share
/// is gone lies on no volume and stays as it is. Error 120 "Missing mount point".
QUIVRA_EXPORT void VolumePause(const std::string& mount_point);
QUIVRA_EXPORT void VolumeResume(const std::string& mount_point);

/// Forgets a share for good, after it is gone: queue, index and folders. `share_path` is the full
/// path of the root that it had. Error 120 "Missing share name", "Missing share path". No lock.
QUIVRA_EXPORT void ShareClearPaused(const std::string& share_name, const std::string& share_path);

/// Forgets every share with a paused folder whose volume_to_be_clean is the mount point: its
/// flags and folders; indexes and data stay. Error 120 "Missing mount point". No lock.
QUIVRA_EXPORT void VolumeClearPaused(const std::string& mount_point);

/// Carries a share's index, folders, flags and registration over to its new name; call it once the
/// platform knows the share under that name. An interrupted call is finished by the same call. A
/// share that no folder indexes is passed over. Holds the folder lock. Error 120 "Missing
/// share_from", "Missing share_to".
QUIVRA_EXPORT void ShareRename(const std::string& share_from, const std::string& share_to);

/// The same for a share that keeps its name and has moved; `share_path_from` is the full path of
/// the root that it had. Error 120 "Missing share name", "Missing share path".
QUIVRA_EXPORT void ShareMigrate(const std::string& share, const std::string& share_path_from);

/// Queues a reindex of the share's recycle directory and, for "homes", of each user's: call it
/// when a recycle bin was switched on or off. A share that no folder indexes is passed over. Error
/// 120 "Missing share name".
QUIVRA_EXPORT void ShareCheckRecycle(const std::string& share);

// --- Services, notifications, custom events ------------------------------------------------------

/// Starts the services that indexing needs when at least one folder is configured, else stops
/// them. Failures of a service are logged and not thrown.
QUIVRA_EXPORT void PrepareServices();

/// Tell administrators that the index has no space left, or that memory is short. The result is
/// the notification tool's: its exit status, negative when it could not be run.
QUIVRA_EXPORT int SendKOSNotify();
QUIVRA_EXPORT int NotifyLackOfMemory();

/// Appends an event (EVENT_* bits) to the queue of the share that holds the full path `path`, under
/// the queue's lock; nothing is written when a pending reindex covers the path. When that fails,
/// the share is flagged as needing a reindex instead and the failure is logged, not thrown; where
/// even the share cannot be found, it is only logged. Throws when the flag cannot be set.
QUIVRA_EXPORT void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                                  const Json::Value& data);

}  // namespace quivra::fileindex
