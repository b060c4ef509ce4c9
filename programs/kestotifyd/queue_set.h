#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "programs/kestotifyd/change.h"
#include "programs/kestotifyd/queue_translator.h"
#include "programs/kestotifyd/queue_writer.h"
#include "programs/kestotifyd/registration.h"
#include "programs/kestotifyd/watched_folders.h"

namespace kestotifyd {

/// All registered queues: hands each change to those that it concerns, keeps account of what each
/// folder is owed for the time in which it was not watched, and writes the lines in batches.
class QueueSet {
  public:
    /// Lines of a busy queue wait this long after the batch before for others to share its lock
    /// with.
    static constexpr std::chrono::milliseconds kBatchTime{100};
    /// The first lines of a calm queue wait no longer than one change's events take to arrive.
    static constexpr std::chrono::milliseconds kCalmBatchTime{10};

    QueueSet(WatchedFolders& watched, QueueTranslator::NameTest is_hidden);

    /// Takes up the registrations: new, changed and removed ones. `is_start`: nothing was watched
    /// before this call, so that every folder is owed a reindex. Later that holds for the folders
    /// that come back; one that was never watched before is walked by its consumer anyway.
    void Update(const std::vector<Registration>& registrations, bool is_start, Time now);

    /// The registered folders that lie in no other one.
    std::set<std::string> OutermostFolders() const;

    /// What can be told about a registration.
    struct State {
        const Registration& registration;
        const std::string& problem;  ///< why its queue cannot be written; empty when it can
    };
    std::vector<State> States() const;

    bool Covers(const std::string& path) const;
    void Apply(const Change& change, Time now);

    /// Everything below the root is watched: writes what its folders are owed.
    void PayFolders(const std::string& root, Time now);
    /// The same when that has just become so.
    void OnRootComplete(const std::string& root, Time now);
    /// Nothing below the root is watched any more. Only a root that `is_deleted` is reported.
    void OnRootLost(const std::string& root, bool is_deleted, Time now);
    /// Events below the root were lost; the marker follows with OnRootComplete, so that it covers
    /// what is lost until then.
    void OweCrashMarker(const std::string& root);

    void Flush(Time now);
    /// Writes everything that can be written by `deadline`.
    void FlushAll(Time deadline);
    std::optional<Time> NextDue() const;

  private:
    struct Folder {
        Time since;
        bool is_pending = true;     ///< its root has not been complete since it was taken up
        bool owes_reindex = false;  ///< muted until then
        bool owes_crash = false;
    };
    struct Queue {
        std::unique_ptr<QueueTranslator> translator;
        std::unique_ptr<QueueWriter> writer;
        std::map<std::string, Folder> folders{};
        std::optional<Time> flush_due{};
        Time written{};  ///< when its last batch was
    };

    void UpdateQueue(const Registration& registration, bool is_start, Time now);
    void Pay(Queue& queue, const std::string& path, Folder& folder, Time now);
    static bool MovesQueue(const Change& change, const Queue& queue);
    static quivra::base::PrivateDirectory::Make MayMake(const Queue& queue);
    std::set<Queue*> Concerned(const Change& change) const;
    void AddConcerned(const std::string& path, std::set<Queue*>& concerned) const;
    void RebuildIndex();
    static Time BatchDue(const Queue& queue, Time now);
    void Schedule(Queue& queue, Time due);
    void FlushQueue(Queue& queue, Time now, Time held_until);

    WatchedFolders& watched_;
    QueueTranslator::NameTest is_hidden_;
    std::map<std::string, Queue> queues_;  ///< by queue path
    std::unordered_multimap<std::string, Queue*> by_folder_;
};

}  // namespace kestotifyd
