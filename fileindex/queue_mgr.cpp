#include "fileindex/queue_mgr.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_reader.h"

namespace quivra::fileindex {
namespace {

/// Whether an event of the file satisfies the predicate. A missing file holds none.
template <typename Predicate>
bool HasEvent(const std::string& path, const Predicate& predicate) {
    if (!IsFileExist(path)) {
        return false;
    }
    QueueReader reader(path);
    if (!reader.IsOpen() && errno == ENOENT) {
        return false;  // a pass moved or deleted it meanwhile
    }
    reader.RequireOpen({"queue_mgr", __LINE__});
    std::string line;
    while (reader.ReadLine(line)) {
        if (predicate(Event(line))) {
            return true;
        }
    }
    return false;
}

[[noreturn]] void FailAppend(const char* condition, const char* what) {
    const std::string reason = std::string(what) + " queue, reason=" + SystemErrorText(errno);
    Fail({"queue_mgr", __LINE__}, condition, Error(Error::kSystemCallFailed, reason));
}

/// Whether the last line lacks its end: a writer died, or the disk was full, in the middle of it.
bool EndsInMidLine(int fd, off_t size) {
    char last = '\n';
    return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

/// Appends the line whole or not at all.
void AppendLine(const std::string& queue_path, const std::string& line) {
    const base::UniqueFd fd(
        open(queue_path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
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

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path)
    : queue_path_(queue_path), queue_path_tmp_(queue_path + ".tmp") {}

void QueueMgr::PrepareTmpQueue() {
    if (!IsFileExist(queue_path_)) {
        return;
    }
    // When another pass takes the queue between the check and the lock, the lock makes an empty
    // file, which then waits here or gives an empty pass. It must not be deleted: a writer may
    // have opened it already.
    const LockFile lock(queue_path_, true);
    if (IsFileExist(queue_path_tmp_)) {
        return;
    }
    if (rename(queue_path_.c_str(), queue_path_tmp_.c_str()) < 0) {
        const std::string reason = "rename failed, reason=" + SystemErrorText(errno);
        Fail({"queue_mgr", 136}, "0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())",
             Error(Error::kSystemCallFailed, reason));
    }
}

void QueueMgr::Append(const Json::Value& event) const {
    const LockFile lock(queue_path_, true);
    AppendLine(queue_path_, toString(event));
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
    return std::make_shared<OPTree>(queue_path_);
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
    return std::make_shared<OPTree>(queue_path_tmp_);
}

int QueueMgr::DeleteTmp() {
    return unlink(queue_path_tmp_.c_str());
}

int QueueMgr::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn, bool use_tmp) {
    if (use_tmp) {
        PrepareTmpQueue();
    }
    if (!IsFileExist(use_tmp ? queue_path_tmp_ : queue_path_)) {
        return 0;
    }
    return (use_tmp ? GetOPTreeTmp() : GetOPTree())->ProcessOP(fn);
}

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) const {
    // Not consulted: who asks learns here when the configured folders cannot be read.
    const FolderMgr folder_mgr;
    const auto touches = [&](const Event& event) {
        return IsPathWithin(event.path, full_path) || IsPathWithin(event.path_old, full_path);
    };
    return HasEvent(queue_path_, touches) || HasEvent(queue_path_tmp_, touches);
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) const {
    const auto covers = [&](const Event& event) {
        return event.event == EVENT_REINDEX && IsPathWithin(full_path, event.path);
    };
    return HasEvent(queue_path_, covers) || HasEvent(queue_path_tmp_, covers);
}

}  // namespace quivra::fileindex
