#pragma once

#include <functional>
#include <optional>
#include <set>
#include <string>

#include "common/error.h"
#include "fileindex/event.h"

/// What waits in a share's queue and in its working copy. All read the queue first, then the copy,
/// without the lock: what is appended meanwhile may be missed. Error 502 when a file cannot be
/// read, and the error of the first malformed line, unless the question was settled before it: a
/// bad line must not pass for a queue without work.
namespace quivra::fileindex {

/// Whether an event satisfies the predicate. A missing file holds none.
bool HasPendingEvent(const std::string& queue_path,
                     const std::function<bool(const Event&)>& predicate);

/// Of some full paths, those that a pending event touches: it is about the path or something below.
/// One reading for all, however many folders there are and lines wait.
class TouchedPaths {
  public:
    /// Throws nothing: what goes wrong counts for the paths that were not found before it.
    TouchedPaths(const std::string& queue_path, const std::set<std::string>& full_paths);

    /// Whether the path, one of those given, is touched.
    bool Contain(const std::string& full_path) const;

  private:
    std::set<std::string> touched_;
    std::optional<Error> failure_;
};

/// The pending reindexes, read once for many questions.
class PendingReindexes {
  public:
    /// Throws nothing: what goes wrong counts for the paths that no reindex covers.
    explicit PendingReindexes(const std::string& queue_path);

    /// Whether a reindex of the path or of one of its ancestors is pending.
    bool Cover(const std::string& full_path) const;

    /// One more, which is queued by now or soon.
    void Add(const std::string& full_path) { paths_.insert(full_path); }

  private:
    std::set<std::string, std::less<>> paths_;
    std::optional<Error> failure_;
};

}  // namespace quivra::fileindex
