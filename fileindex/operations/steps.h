#pragma once

#include <json/json.h>

#include <set>
#include <string>
#include <vector>

#include "common/log.h"

/// The steps that the management operations share. None takes a lock. They throw Error 502 when
/// the indexing daemon or the file monitor fails, and what SDKShare throws for a share.
namespace quivra::fileindex {

/// All operations log under one given name; each source has a thousand of its own.
namespace unit {

inline constexpr LogUnit kFolderOperations{"index_mgr", 0};
inline constexpr LogUnit kCustomEvent{"index_mgr", 1000};
inline constexpr LogUnit kServices{"index_mgr", 2000};
inline constexpr LogUnit kShareOperations{"index_mgr", 3000};
inline constexpr LogUnit kSteps{"index_mgr", 4000};
inline constexpr LogUnit kShareMoves{"index_mgr", 5000};

}  // namespace unit

/// Tells the indexing daemon that a share's folders changed, or that it is to start or drop the
/// share's worker.
void NotifySettingChanged(const std::string& share, bool is_upsert);
void CreateWorker(const std::string& share);
void DeleteWorker(const std::string& share);

/// Registers the share's queue with the file monitor, for the folders that the saved set holds.
void UpsertMonitorQueue(const std::string& share);

/// Removes the registration of the share's queue, or of a given queue path of it.
void DeleteMonitorQueue(const std::string& share);
void DeleteMonitorQueue(const std::string& share, const std::string& queue_path);

/// Where the queue of a share with that root lies, known to the platform or not.
std::string ComposeQueuePath(const std::string& share_path);

/// Deletes a share's queue, working copy and index from the disk, and forgets its flags. What
/// cannot be deleted is logged.
void RemoveShareIndexData(const std::string& share, const std::string& share_path);

/// Starts or stops the services that indexing needs; what fails is logged.
void SwitchServices(bool enable);

/// What AddCustomEvent takes.
struct CustomEvent {
    int event = 0;
    std::string path;
    std::string path_old;
    Json::Value data;
};

/// AddCustomEvent for several events, in their order; each share's queue is read and locked once.
/// Returns the paths of the events that are neither queued nor covered by a queued reindex.
std::set<std::string> QueueCustomEvents(const std::vector<CustomEvent>& events);

}  // namespace quivra::fileindex
