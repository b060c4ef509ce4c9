#include "common/error.h"
#include "common/log.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_steps.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

void AppendUnlessCovered(const std::string& queue_path, int event, const std::string& path,
                         const std::string& path_old, const Json::Value& data) {
    const QueueMgr queue(queue_path);
    if (queue.IsFullPathHasReindex(path)) {
        return;
    }
    Json::Value line;
    line["event"] = event;
    line["path"] = path;
    line["path_old"] = path_old;
    line["data"] = data;
    queue.Append(line);
}

}  // namespace

bool QueueCustomEvent(int event, const std::string& path, const std::string& path_old,
                      const Json::Value& data) {
    std::string share_name;
    try {
        std::string share_path;
        GetShareNamePathByFullPath(share_name, share_path, path);
        const sdk::SDKShare share(share_name);
        AppendUnlessCovered(share.GetQueuePath(), event, path, path_old, data);
        return true;
    } catch (const Error& error) {
        LogError({"index_mgr", __LINE__},
                 "AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex", error.code,
                 error.reason.c_str(), share_name.c_str());
    }
    if (!share_name.empty()) {
        StatusMgr().SetShareStatus(share_name, kShareNeedReindex);
    }
    return false;
}

void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data) {
    QueueCustomEvent(event, path, path_old, data);
}

}  // namespace quivra::fileindex
