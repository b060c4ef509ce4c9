#include "programs/kestotifyd/queue_translator.h"

#include <algorithm>

#include "base/path.h"
#include "base/queue_file.h"
#include "common/json.h"
#include "fileindex/event.h"

namespace kestotifyd {
namespace {

using quivra::fileindex::EVENT_ATTR;
using quivra::fileindex::EVENT_CREATE;
using quivra::fileindex::EVENT_DELETE;
using quivra::fileindex::EVENT_MODIFY;
using quivra::fileindex::EVENT_QUEUE_CRASH;
using quivra::fileindex::EVENT_REINDEX;
using quivra::fileindex::EVENT_RENAME;

/// The mask selects kinds of change. What repairs a gap is no change, and always goes out.
constexpr std::uint32_t kUnmaskedEvents = EVENT_QUEUE_CRASH | EVENT_REINDEX;

/// Above it everything held is reported at once, so that a storm of writes stays bounded in memory.
constexpr std::size_t kMaxHeld = 65536;
constexpr std::size_t kMaxDeleted = 65536;

}  // namespace

QueueTranslator::QueueTranslator(Registration registration, NameTest is_hidden)
    : registration_(std::move(registration)), is_hidden_(std::move(is_hidden)) {}

bool QueueTranslator::IsIgnoredBelow(const std::string& path, const std::string& folder) const {
    const std::vector<std::string>& ignore = registration_.ignore;
    for (std::size_t begin = folder == "/" ? 1 : folder.size() + 1; begin < path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string name = path.substr(begin, end - begin);
        if (std::find(ignore.begin(), ignore.end(), name) != ignore.end() || is_hidden_(name)) {
            return true;
        }
        begin = end + 1;
    }
    return false;
}

bool QueueTranslator::Matches(const std::string& path, bool muted_too) const {
    // A consumer that works on its own queue must not be woken by that.
    if (path == registration_.queue || path == quivra::base::WorkingCopy(registration_.queue)) {
        return false;
    }
    return std::any_of(
        registration_.folders.begin(), registration_.folders.end(), [&](const std::string& folder) {
            return quivra::base::IsAtOrBelow(path, folder) &&
                   (muted_too || !muted_.contains(folder)) && !IsIgnoredBelow(path, folder);
        });
}

void QueueTranslator::Apply(const Change& change, Time now) {
    using Kind = Change::Kind;
    if (change.kind == Kind::kReindex || change.kind == Kind::kCrashed) {
        if (!Wants(change.path)) {
            return;
        }
        Emit(change.kind == Kind::kReindex ? EVENT_REINDEX : EVENT_QUEUE_CRASH, true, change.path);
        return;
    }
    if (change.kind == Kind::kRenamed) {
        ApplyRename(change);
        return;
    }
    if (!Wants(change.path)) {
        return;
    }
    switch (change.kind) {
        case Kind::kCreated:
            EmitCreate(change.is_dir, change.path);
            break;
        case Kind::kWritten:
            Hold(change.path, now + kOpenFileInterval);
            break;
        case Kind::kClosed:
            Hold(change.path, now);
            break;
        case Kind::kAttributes:
            Emit(EVENT_ATTR, change.is_dir, change.path);
            break;
        default:
            EmitDelete(change.is_dir, change.path);
            break;
    }
}

void QueueTranslator::ApplyRename(const Change& change) {
    const bool leaves = Wants(change.path_old);
    const bool enters = Wants(change.path);
    if (leaves && enters) {
        ReleaseBelow(change.path_old, true);  // under the name that the consumer knows
        Emit(EVENT_RENAME, change.is_dir, change.path, change.path_old);
    } else if (leaves) {
        EmitDelete(change.is_dir, change.path_old);
    } else if (enters) {
        EmitCreate(change.is_dir, change.path);
    }
}

/// A consumer that folds the lines of one queue file drops the creation of a directory behind the
/// deletion of a file at the same path, but not the creation of a file. So that one goes before.
void QueueTranslator::EmitCreate(bool is_dir, const std::string& path) {
    const bool was_deleted = deleted_now_.erase(path) + deleted_.erase(path) > 0;
    if (is_dir && (was_deleted || are_deletes_unknown_)) {
        Emit(EVENT_CREATE, false, path);
    }
    Emit(EVENT_CREATE, is_dir, path);
}

void QueueTranslator::EmitDelete(bool is_dir, const std::string& path) {
    ReleaseBelow(path, false);
    Emit(EVENT_DELETE, is_dir, path);
    if (!is_dir) {
        deleted_now_.insert(path);
        are_deletes_unknown_ |= deleted_now_.size() + deleted_.size() > kMaxDeleted;
    }
    if (are_deletes_unknown_) {
        deleted_now_.clear();
        deleted_.clear();
    }
}

/// What has been deleted counts as long as its line and that of a later creation can be in one
/// queue file. A reader takes the file away at any time: the next one begins without them.
void QueueTranslator::OnWritten(bool is_new_file) {
    if (is_new_file) {
        deleted_.clear();
        are_deletes_unknown_ = false;
    }
    deleted_.merge(deleted_now_);
    deleted_now_.clear();
}

/// The earliest time wins: a file that is written without end is reported all the same.
void QueueTranslator::Hold(const std::string& path, Time due) {
    const auto [it, is_new] = held_.emplace(path, due);
    it->second = std::min(it->second, due);
    if (is_new && held_.size() > kMaxHeld) {
        Flush(Time::max());
    }
}

void QueueTranslator::ReleaseBelow(const std::string& path, bool emit) {
    const auto release = [&](auto begin, auto end) {
        for (auto it = begin; emit && it != end; ++it) {
            Emit(EVENT_MODIFY, false, it->first);
        }
        held_.erase(begin, end);
    };
    const auto own = held_.equal_range(path);
    release(own.first, own.second);
    const auto below = quivra::base::Subtree(held_, path);
    release(below.first, below.second);
}

std::optional<Time> QueueTranslator::NextDue() const {
    if (held_.empty()) {
        return std::nullopt;
    }
    return std::min_element(held_.begin(), held_.end(),
                            [](const auto& a, const auto& b) { return a.second < b.second; })
        ->second;
}

void QueueTranslator::Flush(Time now) {
    std::erase_if(held_, [&](const auto& held) {
        if (held.second > now) {
            return false;
        }
        Emit(EVENT_MODIFY, false, held.first);
        return true;
    });
}

void QueueTranslator::Emit(std::uint32_t event, bool is_dir, const std::string& path,
                           const std::string& path_old) {
    if ((event & (registration_.mask | kUnmaskedEvents)) == 0) {
        return;
    }
    Json::Value line(Json::objectValue);
    line["event"] = event;
    line["is_dir"] = is_dir;
    line["path"] = path;
    if (event == EVENT_RENAME) {
        line["path_old"] = path_old;
    }
    std::string text = quivra::toString(line) + "\n";
    // chown, chmod and utime of one file in a row say the same thing three times.
    if (lines_.empty() || lines_.back() != text) {
        lines_.push_back(std::move(text));
    }
}

}  // namespace kestotifyd
