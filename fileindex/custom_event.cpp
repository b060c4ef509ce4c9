#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/unique_fd.h"
#include "common/util.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_steps.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

[[noreturn]] void FailAppend(const char* condition, const char* what) {
    const std::string reason = std::string(what) + " queue, reason=" + SystemErrorText(errno);
    Fail({"index_mgr", __LINE__}, condition, Error(Error::kSystemCallFailed, reason));
}

/// Whether the last line lacks its end: a writer died, or the disk was full, in the middle of it.
bool EndsInMidLine(int fd, off_t size) {
    char last = '\n';
    return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

/// Appends the line whole or not at all.
void AppendLine(const std::string& queue_path, const std::string& line) {
    const UniqueFd fd(open(queue_path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
    struct stat status {};
    if (!fd.IsValid() || fstat(fd.Get(), &status) != 0) {
        FailAppend("!queue", "Failed to open");
    }
    const std::string text = (EndsInMidLine(fd.Get(), status.st_size) ? "\n" : "") + line + "\n";
    if (!WriteAll(fd.Get(), text.data(), text.size())) {
        const int saved_errno = errno;
        [[maybe_unused]] const int cut = ftruncate(fd.Get(), status.st_size);
        errno = saved_errno;
        FailAppend("!(queue << line << std::endl)", "Failed to write");
    }
}

void AppendUnlessCovered(const std::string& queue_path, int event, const std::string& path,
                         const std::string& path_old, const Json::Value& data) {
    if (QueueMgr(queue_path).IsFullPathHasReindex(path)) {
        return;
    }
    Json::Value line;
    line["event"] = event;
    line["path"] = path;
    line["path_old"] = path_old;
    line["data"] = data;
    AppendEvent(queue_path, line);
}

}  // namespace

void AppendEvent(const std::string& queue_path, const Json::Value& event) {
    const LockFile lock(queue_path, true);
    AppendLine(queue_path, toString(event));
}

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
