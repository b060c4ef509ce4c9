#pragma once

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <string>
#include <vector>

#include "base/private_directory.h"
#include "programs/kestoelasticd/engine/engine.h"
#include "programs/kestoelasticd/search.h"

namespace elasticd {

/// One index in use: its engine, and who may use it now. Safe from any thread; nothing that happens
/// here holds up another index.
///
/// Changes gather in a batch that readers do not see, and that is durable and visible as a whole
/// after Commit. What is refused (Error 1408, 1409, 1410) leaves the batch as it was. When the
/// engine itself fails, the batch is gone: the error says so, and so does the next Commit (1411),
/// after which all is well again.
class Index {
  public:
    struct Place {
        std::string path;
        std::string uuid;
    };

    /// Opens nothing yet. `min_free` bytes must be free on the file system for a document to be
    /// added or changed.
    Index(Place place, std::shared_ptr<const engine::Schema> schema, bool paused, bool fresh,
          std::uint64_t min_free);

    /// The library's clients sleep for a quarter of an hour after a 1401, and nearly all moves take
    /// moments.
    static constexpr std::chrono::seconds kMovePatience{30};

    /// Each throws Error 1401 when the index is being moved for so long, 1413 when its place is
    /// missing, and engine::Damaged when what is there is not the index any more: it is to be made
    /// anew. Those that change also throw 1407 while paused, 1417 while fresh; all but deletes and
    /// commits 1412 without space.
    void Upsert(const std::string& id, const Json::Value& data);
    void Set(const std::string& id, const Json::Value& changes);
    void Delete(const std::string& id);
    void DeleteByQuery(const Json::Value& qsl);
    void Commit();
    SearchResult Query(const Json::Value& query);
    engine::State GetState();

    /// Pausing drops the batch and closes all files. The two steps, of which only the second waits
    /// for those who use the index, may come from several threads: the last wish holds.
    void WantPaused(bool paused) { want_paused_ = paused; }
    void ApplyPaused();
    void SetFresh(bool fresh) { fresh_ = fresh; }

    /// Gives space back, in short steps, when nothing has changed for a while.
    void Maintain();

    /// From now on, everybody waits for EndMove. False when that is so already.
    bool BeginMove() { return !moving_.exchange(true); }
    bool IsMoving() const { return moving_; }
    /// Waits for the end of a move. Throws Error 1401 when that takes longer than kMovePatience.
    void AwaitMove();
    /// How many moves, or makings anew, have ended: tells which files a failure was about.
    std::uint64_t Generation() const { return generation_; }
    /// After BeginMove: waits for those who still use the index, commits the batch and closes all
    /// files. A batch that cannot be committed is lost, and the next commit will say so.
    void CommitAndClose();
    /// The same for an index that goes, or is made anew: nobody misses the batch.
    void Close();
    /// Continues, in the directory that it was moved to.
    void EndMove(std::string path);

  private:
    using Clock = std::chrono::steady_clock;
    enum class Kind { kAdds, kRemoves, kCommits };

    std::shared_lock<std::shared_mutex> Use();
    void Change(Kind kind, const std::function<void(engine::Index&)>& change);
    void CheckSpace();
    void CheckPlace();
    std::unique_ptr<engine::Index> Open(quivra::base::PrivateDirectory& directory) const;
    engine::Index& Engine();
    void Read(const std::function<void(engine::Index&)>& read);
    void CloseFiles();
    bool SeesBatch(const engine::Query& query);

    const std::shared_ptr<const engine::Schema> schema_;
    const std::uint64_t min_free_;
    std::atomic<bool> moving_ = false;
    std::atomic<std::uint64_t> generation_ = 0;
    std::mutex move_mutex_;
    std::condition_variable moved_;  ///< moving_ has become false
    std::atomic<bool> want_paused_;
    std::atomic<bool> fresh_;

    std::shared_mutex use_;  ///< exclusive: nobody uses the files
    Place place_;            ///< changed under the exclusive lock only, as is paused_
    bool paused_;

    std::mutex open_mutex_;
    quivra::base::PrivateDirectory directory_;
    std::unique_ptr<engine::Index> engine_;

    std::mutex write_mutex_;  ///< the batch, and all below
    bool batch_lost_ = false;
    std::vector<std::string> moved_away_;  ///< ids that the batch has moved with what is below them
    Clock::time_point space_checked_{};
    Clock::time_point last_change_{};
    bool unkempt_ = true;  ///< there may be space to give back
};

}  // namespace elasticd
