#pragma once

#include <memory>
#include <string>
#include <vector>

#include "fileindex/op.h"
#include "programs/fileindexd/applied_rules.h"
#include "programs/fileindexd/batch.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/renames.h"
#include "programs/fileindexd/settle.h"

namespace fileindexd {

struct PassResult {
    bool had_work = false;  ///< there was a queue or a working copy
    int consumed = 0;       ///< queue entries
    Counts counts;
    std::vector<std::string> changed;  ///< files that the queue named, unless they were many
};

/// One pass over a share's queue: carries out what the queue holds, or what an interrupted pass
/// left, commits, and deletes the working copy. Afterwards the index equals the disk for every path
/// that the queue named. A pass has three parts:
///   1. renames, so that documents move instead of being extracted again;
///   2. single objects: deletes, changed files, changed attributes;
///   3. whole trees: both ends of the renames, reindex requests, changed settings.
/// Every part looks at the disk, not at the events alone, and whatever order events were folded
/// in, the objects end as they are found. The parts may be repeated.
class Pass {
  public:
    /// `root` is the share's root. All references must outlive the object.
    Pass(std::string queue_path, std::string root, Index& index, const Scope& scope,
         PassListener listener);

    /// Throws quivra::Error when the queue, the index or the share cannot be worked with, and what
    /// the listener throws. The working copy is kept then, and the next pass goes on with it.
    PassResult Run();

  private:
    /// A tree to be settled.
    struct Root {
        std::string path;
        ContentClasses again;
        bool moved = false;  ///< its documents were moved there in this pass
    };

    void Sort(const std::vector<std::shared_ptr<quivra::fileindex::OP>>& ops);
    std::vector<std::string> ChangedFiles() const;
    void CheckShare(const ShareTree& tree) const;
    bool HasDocuments(const std::string& path) const;
    void RunRenames(const ShareTree& tree);
    void RunSingles();
    void RunSingle(const quivra::fileindex::OP& op);
    void MergeRoots();
    void RunRoots();
    void StepDone(std::size_t step);
    void Commit(std::size_t steps);

    const std::string queue_path_;
    const std::string root_;
    Index& index_;
    const Scope& scope_;
    const PassListener listener_;
    const std::string rules_;
    const AppliedRules applied_rules_;

    // Of the pass at work.
    std::vector<Rename> renames_;
    std::vector<std::shared_ptr<quivra::fileindex::OP>> singles_;
    std::vector<Root> roots_;
    std::unique_ptr<Batch> batch_;
    std::unique_ptr<Settler> settler_;
    std::unique_ptr<Progress> progress_;
};

}  // namespace fileindexd
