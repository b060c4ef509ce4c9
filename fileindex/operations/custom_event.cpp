#include <map>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/event.h"
#include "fileindex/index_mgr.h"
#include "fileindex/operations/steps.h"
#include "fileindex/pending.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

using EventList = std::vector<const CustomEvent*>;

void LogLoss(const Error& error, const std::string& share) {
    LogError(unit::kCustomEvent.Here(),
             "AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex", error.code,
             error.reason.c_str(), share.c_str());
}

Json::Value LineOf(const CustomEvent& event) {
    Json::Value line;
    line["event"] = event.event;
    line["path"] = event.path;
    line["path_old"] = event.path_old;
    line["data"] = event.data;
    return line;
}

/// One reading of the queue serves all events: a thousand folders would else read it a thousand
/// times, and it grows by each of them.
void AppendUnlessCovered(const std::string& share_name, const EventList& events) {
    const std::string queue_path = sdk::SDKShare(share_name).GetQueuePath();
    PendingReindexes reindexes(queue_path);
    std::vector<Json::Value> lines;
    for (const CustomEvent* event : events) {
        if (reindexes.Cover(event->path)) {
            continue;
        }
        lines.push_back(LineOf(*event));
        if (event->event == static_cast<int>(EVENT_REINDEX)) {
            reindexes.Add(event->path);
        }
    }
    if (!lines.empty()) {
        QueueMgr(queue_path).AppendAll(lines);
    }
}

std::map<std::string, EventList> ByShare(const std::vector<CustomEvent>& events,
                                         std::set<std::string>& lost) {
    std::map<std::string, EventList> shares;
    for (const CustomEvent& event : events) {
        std::string share_name;
        std::string share_path;
        try {
            GetShareNamePathByFullPath(share_name, share_path, event.path);
            shares[share_name].push_back(&event);
        } catch (const Error& error) {
            LogLoss(error, share_name);  // there is no share to flag
            lost.insert(event.path);
        }
    }
    return shares;
}

}  // namespace

std::set<std::string> QueueCustomEvents(const std::vector<CustomEvent>& events) {
    std::set<std::string> lost;
    for (const auto& [share, list] : ByShare(events, lost)) {
        try {
            AppendUnlessCovered(share, list);
        } catch (const Error& error) {
            LogLoss(error, share);
            StatusMgr().SetShareStatus(share, kShareNeedReindex);
            for (const CustomEvent* event : list) {
                lost.insert(event->path);
            }
        }
    }
    return lost;
}

void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data) {
    QueueCustomEvents({{event, path, path_old, data}});
}

}  // namespace quivra::fileindex
