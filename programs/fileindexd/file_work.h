#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "programs/fileindexd/backlog.h"
#include "programs/fileindexd/batch.h"
#include "programs/fileindexd/extract.h"

namespace fileindexd {

/// The files of the backlog, in one slice of work on it: adds those that a pass has left by their
/// name, extracts the content of those that have one. What could not be looked at or read goes back
/// into the backlog; what the batch notes as a problem is the caller's to put there.
class FileWork {
  public:
    struct Share {
        Backlog& backlog;
        Batch& batch;
        Index& index;
        const ShareTree& tree;
        const Scope& scope;
        std::chrono::steady_clock::time_point until;  ///< no file is begun afterwards
        std::int64_t now;                             ///< seconds since the epoch
    };

    explicit FileWork(const Share& share)
        : backlog_(share.backlog),
          batch_(share.batch),
          index_(share.index),
          tree_(share.tree),
          scope_(share.scope),
          until_(share.until),
          now_(share.now) {}

    /// Each takes the next few hundred files and commits. False when there are none.
    bool Name();
    bool Extract();

    /// What has been extracted so far.
    std::uint64_t Files() const { return files_; }
    std::uint64_t Bytes() const { return bytes_; }

  private:
    bool IsToBeExtracted(const Backlog::File& file, Extraction& job);
    void TakeOutcome(const Extraction& job, const Backlog::File& file);

    Backlog& backlog_;
    Batch& batch_;
    Index& index_;
    const ShareTree& tree_;
    const Scope& scope_;
    const std::chrono::steady_clock::time_point until_;
    const std::int64_t now_;
    std::uint64_t files_ = 0;
    std::uint64_t bytes_ = 0;

    // Of the files at work.
    std::vector<std::string> done_;
    std::vector<Problem> failures_;
    std::vector<Backlog::Directory> trees_;
};

}  // namespace fileindexd
