#include "fileindex/pending.h"

#include <cerrno>
#include <string_view>

#include "base/path.h"
#include "base/queue_file.h"
#include "common/log.h"
#include "fileindex/queue_directory.h"
#include "fileindex/queue_reader.h"

namespace quivra::fileindex {
namespace {

/// The unit of QueueMgr, whose questions these are.
constexpr LogUnit kLog{"queue_mgr", 2000};

bool HasEvent(const std::string& path, const std::function<bool(const Event&)>& predicate) {
    const QueueDirectory directory(path);
    if (!directory.IsValid() && !directory.IsMissing()) {
        Fail(kLog.Here(), "!input_stream",
             Error(Error::kSystemCallFailed, "Failed to open queue, reason=" + directory.Reason()));
    }
    if (!directory.HasFile(directory.QueueName())) {
        return false;
    }
    QueueReader reader(path);
    if (!reader.IsOpen() && errno == ENOENT) {
        return false;  // a pass moved or deleted it meanwhile
    }
    reader.RequireOpen(kLog.Here());
    std::string line;
    while (reader.ReadLine(line)) {
        if (predicate(Event(line))) {
            return true;
        }
    }
    return false;
}

/// Calls `visit` with the path and each of its ancestors, until it returns true.
template <typename Visit>
bool AnyUpwards(std::string_view path, const Visit& visit) {
    while (!visit(path)) {
        const std::size_t slash = path.rfind('/');
        if (slash == path.npos || slash == 0) {
            return false;
        }
        path = path.substr(0, slash);
    }
    return true;
}

}  // namespace

bool HasPendingEvent(const std::string& queue_path,
                     const std::function<bool(const Event&)>& predicate) {
    return HasEvent(queue_path, predicate) || HasEvent(base::WorkingCopy(queue_path), predicate);
}

TouchedPaths::TouchedPaths(const std::string& queue_path, const std::set<std::string>& full_paths) {
    std::set<std::string, std::less<>> missing(full_paths.begin(), full_paths.end());
    const auto look_up = [&](std::string_view path) {
        const auto found = missing.find(path);
        if (found != missing.end()) {
            touched_.insert(missing.extract(found));
        }
        return missing.empty();
    };
    try {
        HasPendingEvent(queue_path, [&](const Event& event) {
            return AnyUpwards(event.path, look_up) || AnyUpwards(event.path_old, look_up);
        });
    } catch (const Error& error) {
        failure_ = error;
    }
}

bool TouchedPaths::Contain(const std::string& full_path) const {
    const bool touched = touched_.contains(full_path);
    if (!touched && failure_) {
        throw *failure_;
    }
    return touched;
}

PendingReindexes::PendingReindexes(const std::string& queue_path) {
    try {
        HasPendingEvent(queue_path, [&](const Event& event) {
            if (event.event == EVENT_REINDEX) {
                paths_.insert(event.path);
            }
            return false;
        });
    } catch (const Error& error) {
        failure_ = error;
    }
}

bool PendingReindexes::Cover(const std::string& full_path) const {
    const bool covered =
        AnyUpwards(full_path, [&](std::string_view path) { return paths_.contains(path); });
    if (!covered && failure_) {
        throw *failure_;
    }
    return covered;
}

}  // namespace quivra::fileindex
