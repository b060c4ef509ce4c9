#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "fileindex/op.h"
#include "programs/fileindexd/backlog.h"
#include "programs/fileindexd/batch.h"
#include "programs/fileindexd/renames.h"
#include "programs/fileindexd/settle.h"

namespace fileindexd {

struct PassResult {
    bool had_work = false;  ///< there was a queue or a working copy
    int consumed = 0;       ///< queue entries
    Counts counts;
    Backlog::Addition left;            ///< what was put into the backlog
    std::vector<std::string> changed;  ///< files that the queue named, unless they were many
};

/// One pass over a share's queue: carries out what the queue holds, or what an interrupted pass
/// left, commits, and deletes the working copy. It does what is short, and puts the rest into the
/// backlog; afterwards the index equals the disk for every path that the queue named, but for what
/// is waiting there. A pass has three parts:
///   1. renames, so that documents move instead of being extracted again;
///   2. single objects: deletes, changed files, changed attributes;
///   3. both ends of the renames, reindex requests and changed settings: files are settled, trees
///      go into the backlog.
/// Every part looks at the disk, not at the events alone, and whatever order events were folded
/// in, the objects end as they are found. The parts may be repeated.
class Pass {
  public:
    struct Share {
        const quivra::base::PrivateDirectory& directory;  ///< in which the queue lies
        std::string queue_path;
        std::string root;
        Backlog& backlog;
        /// How long a pass takes files in itself: a person who saves a file is served at once, and
        /// nobody waits for the ten thousand that are being copied.
        std::chrono::milliseconds files_time{300};
    };

    /// All references must outlive the object.
    Pass(Share share, Index& index, const Scope& scope, PassListener listener);

    /// Throws quivra::Error when the queue, the index or the share cannot be worked with, and what
    /// the listener throws. The working copy is kept then, and the next pass goes on with it.
    PassResult Run();

  private:
    /// A path to be settled with what lies below it.
    struct Root {
        std::string path;
        ContentClasses again;
        bool moved = false;  ///< its documents were moved there in this pass
    };

    void CarryOut(const ShareTree& tree,
                  const std::vector<std::shared_ptr<quivra::fileindex::OP>>& ops);
    void Sort(const std::vector<std::shared_ptr<quivra::fileindex::OP>>& ops);
    bool IsOurs(const std::string& path) const;
    void SortRename(const std::string& from, const std::string& to);
    std::vector<std::string> ChangedFiles() const;
    void CheckShare(const ShareTree& tree) const;
    bool HasDocuments(const std::string& path) const;
    void RunRenames(const ShareTree& tree);
    void RunSingles();
    void RunSingle(const quivra::fileindex::OP& op);
    void UpsertFile(const std::string& path, std::int64_t size);
    void MergeRoots();
    void RunRoots();
    void RunRoot(const Root& root);
    void Leave();
    void StepDone(std::size_t step);
    void Commit(std::size_t steps);

    const Share share_;
    Index& index_;
    const Scope& scope_;
    const PassListener listener_;
    const std::string rules_;
    const std::chrono::steady_clock::time_point until_;  ///< files are taken in; then they are left

    // Of the pass at work.
    WorkingCopy copy_;
    std::size_t steps_ = 0;  ///< that the committed index holds
    std::vector<Rename> renames_;
    std::vector<std::shared_ptr<quivra::fileindex::OP>> singles_;
    std::vector<Root> roots_;
    Backlog::Addition addition_;
    std::unique_ptr<Batch> batch_;
    std::unique_ptr<Settler> settler_;
};

}  // namespace fileindexd
