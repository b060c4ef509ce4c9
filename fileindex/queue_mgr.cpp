#include "fileindex/queue_mgr.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/path.h"
#include "base/queue_file.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/pending.h"
#include "fileindex/queue_directory.h"

namespace quivra::fileindex {
namespace {

/// Below 1000 are marks that support tools know.
constexpr LogUnit kLog{"queue_mgr", 1000};

/// Throws where something else than the share's own directory holds the queue, or nothing can be
/// told. The lock could not be had either, so the error is its.
void RequireUsable(const QueueDirectory& directory) {
    QUIVRA_FAIL_IF(kLog, !directory.IsValid() && !directory.IsMissing(),
                   Error(Error::kLockFailed, "open failed, reason=" + directory.Reason()));
}

/// Whether `path` is `top` or below it. Nothing lies below "/" here: no share has that path.
bool IsTouched(const std::string& path, const std::string& top) {
    return top == "/" ? path == top : base::IsAtOrBelow(path, top);
}

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path)
    : queue_path_(queue_path), queue_path_tmp_(base::WorkingCopy(queue_path)) {}

void QueueMgr::PrepareTmpQueue() {
    const QueueDirectory directory(queue_path_);
    RequireUsable(directory);
    if (!directory.HasFile(directory.QueueName())) {
        return;
    }
    // When another pass takes the queue between the check and the lock, the lock makes an empty
    // file, which then waits here or gives an empty pass. It must not be deleted: a writer may
    // have opened it already.
    const LockFile lock(directory.Fd(), directory.QueueName(), true, base::kQueueMode);
    if (directory.HasFile(directory.CopyName())) {
        return;
    }
    if (renameat(directory.Fd(), directory.QueueName().c_str(), directory.Fd(),
                 directory.CopyName().c_str()) < 0) {
        const std::string reason = "rename failed, reason=" + SystemErrorText(errno);
        Fail({"queue_mgr", 136}, "0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())",
             Error(Error::kSystemCallFailed, reason));
    }
}

void QueueMgr::Append(const Json::Value& event) const {
    AppendAll({event});
}

void QueueMgr::AppendAll(const std::vector<Json::Value>& events) const {
    std::string lines;
    for (const Json::Value& event : events) {
        lines += toString(event) + "\n";
    }
    const QueueDirectory directory(queue_path_);
    QUIVRA_FAIL_IF(kLog, !directory.IsValid(),
                   Error(Error::kLockFailed, "open failed, reason=" + directory.Reason()));
    const LockFile lock(directory.Fd(), directory.QueueName(), true, base::kQueueMode);
    if (base::AppendLines(lock.Fd(), lines) != lines.size()) {
        const std::string reason = "Failed to write queue, reason=" + SystemErrorText(errno);
        Fail(kLog.Here(), "!(queue << line << std::endl)", Error(Error::kSystemCallFailed, reason));
    }
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
    return std::make_shared<OPTree>(queue_path_);
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
    return std::make_shared<OPTree>(queue_path_tmp_);
}

int QueueMgr::DeleteTmp() {
    const QueueDirectory directory(queue_path_);
    return directory.IsValid() ? unlinkat(directory.Fd(), directory.CopyName().c_str(), 0) : -1;
}

int QueueMgr::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn, bool use_tmp) {
    if (use_tmp) {
        PrepareTmpQueue();
    }
    const QueueDirectory directory(queue_path_);
    RequireUsable(directory);
    if (!directory.HasFile(use_tmp ? directory.CopyName() : directory.QueueName())) {
        return 0;
    }
    return (use_tmp ? GetOPTreeTmp() : GetOPTree())->ProcessOP(fn);
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) const {
    // Not consulted: who asks learns here when the configured folders cannot be read.
    const FolderMgr folder_mgr;
    return HasPendingEvent(queue_path_, [&](const Event& event) {
        return IsTouched(event.path, full_path) || IsTouched(event.path_old, full_path);
    });
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) const {
    return HasPendingEvent(queue_path_, [&](const Event& event) {
        return event.event == EVENT_REINDEX && IsTouched(full_path, event.path);
    });
}

}  // namespace quivra::fileindex
