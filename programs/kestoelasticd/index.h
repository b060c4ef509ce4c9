#pragma once

#include <json/json.h>
#include <xapian.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <string>
#include <vector>

#include "programs/kestoelasticd/index_writer.h"
#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/search.h"

namespace elasticd {

/// One index in use: its writer, its readers, and who may use them now. Safe from any thread;
/// nothing that happens here holds up another index.
class Index {
  public:
    /// Opens nothing yet. `min_free` bytes must be free on the file system for a document to be
    /// added or changed.
    Index(std::string directory, std::shared_ptr<const Mapping> mapping, bool paused,
          std::uint64_t min_free);

    /// Each throws Error 1401 while the index is being moved.
    /// Adds or changes documents: also throws 1407 while paused and 1412 without space.
    void Write(const std::function<void(IndexWriter&)>& change);
    /// Removes documents or commits: as Write, but never refused for space.
    void Reduce(const std::function<void(IndexWriter&)>& change);
    SearchResult Query(const Json::Value& query);
    /// Pausing drops the batch and closes all files. The two steps, of which only the second waits
    /// for those who use the index, may come from several threads: the last wish holds.
    void WantPaused(bool paused) { want_paused_ = paused; }
    void ApplyPaused();

    /// From now on, everybody is told to come back later. False when that is so already.
    bool BeginMove() { return !moving_.exchange(true); }
    bool IsMoving() const { return moving_; }
    /// After BeginMove: waits for those who still use the index, commits the batch and closes all
    /// files. A batch that cannot be committed is lost, and the next commit will say so.
    void CommitAndClose();
    /// The same without the commit.
    void Close();
    /// Continues, in the directory that it was moved to.
    void EndMove(std::string directory);

  private:
    struct Reader {
        Xapian::Database database;
        std::string field_names;
        FieldTable fields;
    };

    std::shared_lock<std::shared_mutex> Use();
    void CheckSpace();
    std::unique_ptr<Reader> TakeReader();
    void MakeWriter();
    void CloseFiles();

    const std::shared_ptr<const Mapping> mapping_;
    const std::uint64_t min_free_;
    std::atomic<bool> moving_ = false;
    std::atomic<bool> want_paused_;

    std::shared_mutex use_;  ///< exclusive: nobody uses the files
    std::string directory_;  ///< changed under the exclusive lock only, as is paused_
    bool paused_;

    std::mutex write_mutex_;
    std::unique_ptr<IndexWriter> writer_;
    std::chrono::steady_clock::time_point space_checked_{};

    std::mutex readers_mutex_;
    std::vector<std::unique_ptr<Reader>> idle_readers_;
};

}  // namespace elasticd
