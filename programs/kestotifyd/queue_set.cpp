#include "programs/kestotifyd/queue_set.h"

#include <algorithm>
#include <thread>
#include <utility>

#include "base/path.h"
#include "common/json.h"
#include "fileindex/event.h"

namespace kestotifyd {
namespace {

/// A new folder's consumer walks it without a reindex from here. But where setting the watches took
/// longer than this, the walk may have been faster than the watches.
constexpr std::chrono::seconds kQuickStart{1};

/// A reader holds the lock for a rename, so a busy queue is free in a moment. What has failed wants
/// somebody to act.
constexpr std::chrono::milliseconds kBusyRetry{20};
constexpr std::chrono::seconds kFailedRetry{2};

/// A storm's lines are written without waiting for their batch: 8,192 take about a megabyte.
constexpr std::size_t kMaxBatchLines = 8192;

std::string CrashLine(const Registration& registration) {
    Json::Value line(Json::objectValue);
    line["event"] = static_cast<unsigned int>(quivra::fileindex::EVENT_QUEUE_CRASH);
    line["is_dir"] = true;
    line["path"] = registration.folders.empty() ? "/" : registration.folders.front();
    return quivra::toString(line) + "\n";
}

}  // namespace

QueueSet::QueueSet(WatchedFolders& watched, QueueTranslator::NameTest is_hidden)
    : watched_(watched), is_hidden_(std::move(is_hidden)) {}

void QueueSet::Update(const std::vector<Registration>& registrations, bool is_start, Time now) {
    std::set<std::string> present;
    for (const Registration& registration : registrations) {
        present.insert(registration.queue);
        UpdateQueue(registration, is_start, now);
    }
    // What a removed queue had not written yet is found by the reindex when it returns.
    std::erase_if(queues_, [&](const auto& queue) { return !present.contains(queue.first); });
    RebuildIndex();
    watched_.Save();
}

/// A changed registration keeps the writer, with whatever waits in it, and what its folders are
/// owed. The translator is made anew: lines for the old one's folders and mask are taken out first.
void QueueSet::UpdateQueue(const Registration& registration, bool is_start, Time now) {
    Queue& queue = queues_[registration.queue];
    if (queue.translator && queue.translator->GetRegistration() == registration) {
        return;
    }
    if (queue.translator) {
        queue.translator->Flush(Time::max());
        queue.writer->Add(queue.translator->TakeLines());
        queue.flush_due = now;
    } else {
        queue.writer = std::make_unique<QueueWriter>(registration.queue, CrashLine(registration));
    }
    queue.translator = std::make_unique<QueueTranslator>(registration, is_hidden_);
    std::map<std::string, Folder> before = std::exchange(queue.folders, {});
    for (const std::string& path : registration.folders) {
        const bool was_watched = is_start || watched_.Has(registration.queue, path);
        const auto known = before.find(path);
        const Folder& folder =
            queue.folders
                .emplace(path, known != before.end() ? known->second
                                                     : Folder{now, true, was_watched, false})
                .first->second;
        if (folder.owes_reindex) {
            queue.translator->Mute(path);
        }
        watched_.Add(registration.queue, path);
    }
}

/// A volume's events are many and most concern no queue: they are sorted out by looking up each
/// directory above in a table, however many folders are registered.
void QueueSet::RebuildIndex() {
    by_folder_.clear();
    for (auto& [path, queue] : queues_) {
        for (const auto& [folder, state] : queue.folders) {
            by_folder_.emplace(folder, &queue);
        }
    }
}

std::set<std::string> QueueSet::OutermostFolders() const {
    std::set<std::string> all;
    for (const auto& [folder, queue] : by_folder_) {
        all.insert(folder);
    }
    std::set<std::string> outermost;
    for (const std::string& folder : all) {
        const bool is_inside = std::any_of(all.begin(), all.end(), [&](const std::string& other) {
            return other != folder && quivra::base::IsAtOrBelow(folder, other);
        });
        if (!is_inside) {
            outermost.insert(folder);
        }
    }
    return outermost;
}

/// The queues with a folder at the path or above it.
void QueueSet::AddConcerned(const std::string& path, std::set<Queue*>& concerned) const {
    for (std::string at = path; !at.empty();) {
        const auto [begin, end] = by_folder_.equal_range(at);
        for (auto it = begin; it != end; ++it) {
            concerned.insert(it->second);
        }
        const std::size_t slash = at.rfind('/');
        if (at == "/" || slash == std::string::npos) {
            return;
        }
        at.resize(std::max<std::size_t>(slash, 1));
    }
}

std::set<QueueSet::Queue*> QueueSet::Concerned(const Change& change) const {
    std::set<Queue*> concerned;
    AddConcerned(change.path, concerned);
    if (change.kind == Change::Kind::kRenamed) {
        AddConcerned(change.path_old, concerned);
    }
    return concerned;
}

std::vector<QueueSet::State> QueueSet::States() const {
    std::vector<State> states;
    for (const auto& [path, queue] : queues_) {
        states.push_back({queue.translator->GetRegistration(), queue.writer->Problem()});
    }
    return states;
}

bool QueueSet::Covers(const std::string& path) const {
    std::set<Queue*> concerned;
    AddConcerned(path, concerned);
    return std::any_of(concerned.begin(), concerned.end(),
                       [&](const Queue* queue) { return queue->translator->Covers(path); });
}

void QueueSet::Apply(const Change& change, Time now) {
    for (Queue* const queue : Concerned(change)) {
        queue->translator->Apply(change, now);
        if (queue->translator->LineCount() > 0 || MovesQueue(change, *queue)) {
            Schedule(*queue, BatchDue(*queue, now));
        } else if (const std::optional<Time> due = queue->translator->NextDue()) {
            Schedule(*queue, std::max(*due, BatchDue(*queue, now)));
        }
        if (queue->translator->LineCount() > kMaxBatchLines) {
            FlushQueue(*queue, now, now);
        }
    }
}

/// Whether the change may put another directory in the place of the queue's. Nothing needs to be
/// written then, but what was written last may be out of the reader's reach.
bool QueueSet::MovesQueue(const Change& change, const Queue& queue) {
    using Kind = Change::Kind;
    const std::string& directory = queue.writer->Directory();
    const bool is_move = change.kind == Kind::kRenamed || change.kind == Kind::kDeleted ||
                         change.kind == Kind::kCreated;
    return is_move && (quivra::base::IsAtOrBelow(directory, change.path) ||
                       (change.kind == Kind::kRenamed &&
                        quivra::base::IsAtOrBelow(directory, change.path_old)));
}

Time QueueSet::BatchDue(const Queue& queue, Time now) {
    return std::max(now + kCalmBatchTime, queue.written + kBatchTime);
}

void QueueSet::Schedule(Queue& queue, Time due) {
    queue.flush_due = std::min(queue.flush_due.value_or(due), due);
}

void QueueSet::PayFolders(const std::string& root, Time now) {
    for (auto& [queue_path, queue] : queues_) {
        for (auto& [path, folder] : queue.folders) {
            if (quivra::base::IsAtOrBelow(path, root)) {
                Pay(queue, path, folder, now);
            }
        }
    }
}

void QueueSet::OnRootComplete(const std::string& root, Time now) {
    PayFolders(root, now);
    for (auto& [queue_path, queue] : queues_) {
        // A file system mounted below a folder, with whatever it holds by now.
        if (!queue.folders.contains(root) && queue.translator->Covers(root)) {
            queue.translator->Apply({Change::Kind::kReindex, true, root}, now);
            Schedule(queue, now + kBatchTime);
        }
        for (auto& [path, folder] : queue.folders) {
            if (folder.owes_crash && !folder.owes_reindex &&
                quivra::base::IsAtOrBelow(root, path)) {
                Pay(queue, path, folder, now);
            }
        }
    }
}

void QueueSet::Pay(Queue& queue, const std::string& path, Folder& folder, Time now) {
    const bool was_slow = folder.is_pending && now - folder.since > kQuickStart;
    if (folder.owes_reindex || was_slow) {
        queue.translator->Unmute(path);
        queue.translator->Apply({Change::Kind::kReindex, true, path}, now);
    }
    if (folder.owes_crash) {
        queue.translator->Apply({Change::Kind::kCrashed, true, path}, now);
    }
    Schedule(queue, now + kBatchTime);
    folder = {folder.since, false, false, false};
}

void QueueSet::OnRootLost(const std::string& root, bool is_deleted, Time now) {
    for (auto& [queue_path, queue] : queues_) {
        for (auto& [path, folder] : queue.folders) {
            if (!quivra::base::IsAtOrBelow(path, root)) {
                continue;
            }
            if (is_deleted) {
                queue.translator->Apply({Change::Kind::kDeleted, true, path}, now);
            }
            queue.translator->Mute(path);
            folder.owes_reindex = true;
        }
        Schedule(queue, now + kBatchTime);
    }
}

void QueueSet::OweCrashMarker(const std::string& root) {
    for (auto& [queue_path, queue] : queues_) {
        for (auto& [path, folder] : queue.folders) {
            folder.owes_crash |=
                quivra::base::IsAtOrBelow(path, root) || quivra::base::IsAtOrBelow(root, path);
        }
    }
}

void QueueSet::Flush(Time now) {
    for (auto& [path, queue] : queues_) {
        if (queue.flush_due && *queue.flush_due <= now) {
            FlushQueue(queue, now, now);
        }
    }
}

void QueueSet::FlushQueue(Queue& queue, Time now, Time held_until) {
    queue.translator->Flush(held_until);
    queue.writer->Add(queue.translator->TakeLines());
    switch (queue.writer->Write(MayMake(queue))) {
        case QueueWriter::Result::kDone:
            queue.translator->OnWritten(queue.writer->HasBegunFile());
            queue.written = now;
            queue.flush_due = queue.translator->NextDue();
            break;
        case QueueWriter::Result::kBusy:
            queue.flush_due = now + kBusyRetry;
            break;
        case QueueWriter::Result::kFailed:
            queue.flush_due = now + kFailedRetry;
            break;
    }
}

/// A directory that is missing is made anew, but not at once, and only while the folder is watched:
/// else it may be the volume that is missing, and what is made in its place would make an absent
/// volume look like an empty one.
quivra::base::PrivateDirectory::Make QueueSet::MayMake(const Queue& queue) {
    using Make = quivra::base::PrivateDirectory::Make;
    const bool is_watched = std::any_of(
        queue.folders.begin(), queue.folders.end(),
        [](const auto& entry) { return !entry.second.is_pending && !entry.second.owes_reindex; });
    return is_watched && !queue.writer->Problem().empty() ? Make::kMissing : Make::kNo;
}

void QueueSet::FlushAll(Time deadline) {
    for (auto& [path, queue] : queues_) {
        FlushQueue(queue, Clock::now(), Time::max());
    }
    for (auto& [path, queue] : queues_) {
        while (!queue.writer->IsEmpty() && Clock::now() < deadline &&
               queue.writer->Write() == QueueWriter::Result::kBusy) {
            std::this_thread::sleep_for(kBusyRetry);
        }
    }
}

std::optional<Time> QueueSet::NextDue() const {
    std::optional<Time> due;
    for (const auto& [path, queue] : queues_) {
        if (queue.flush_due) {
            due = std::min(due.value_or(*queue.flush_due), *queue.flush_due);
        }
    }
    return due;
}

}  // namespace kestotifyd
