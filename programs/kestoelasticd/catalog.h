#pragma once

#include <json/json.h>

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "programs/kestoelasticd/index.h"
#include "programs/kestoelasticd/registry.h"

namespace elasticd {

/// All indexes, and their making, deleting, pausing, renaming and moving. Every change is recorded
/// before it is begun, and finished or undone after an interruption. Safe from any thread; long
/// work on one index does not hold up the others.
class Catalog {
  public:
    /// Loads the registry and settles what an earlier process left half done. `min_free`: see
    /// Index.
    Catalog(const std::string& registry_path, std::uint64_t min_free);

    /// Throws Error 1404 for an unknown id, 1401 while the index is being made or deleted, or is
    /// about to get this id; 1413 when it was lost in an interrupted move.
    std::shared_ptr<Index> Find(const std::string& id);

    /// Throws Error 1405 when the id has another path or the path is another index's, 1406, 1414,
    /// 1412. Succeeds when the index is there already; makes its files anew when they are all gone.
    void Create(const std::string& id, const std::string& path, const Json::Value& mappings);
    /// Also succeeds when there is no such index.
    void Delete(const std::string& id);
    void SetPaused(const std::string& id, bool paused);
    /// Takes an index that was made anew into service again.
    void Accept(const std::string& id);

    /// Sets aside what is left of an index that was found damaged or missing, and makes it anew,
    /// empty and fresh. Does nothing when that, or a move, has happened since the `generation` that
    /// the damage was found in: several clients may meet it at once. Throws Error 1401 when it is
    /// being moved for long, 1413 where its place is missing.
    void MakeAnew(const std::string& id, const std::string& why, std::uint64_t generation);
    /// How each index is; opens those that are not in use. One that is damaged is made anew.
    Json::Value GetStates();
    /// Gives space back where nothing happens.
    void Maintain();

    /// Gives the index a new id, a new path, or both; an empty text leaves that one as it is. Other
    /// requests for the index are answered with 1401 meanwhile. Succeeds when it has been done
    /// before. Throws Error 1404, 1405, 1413, 1414, 1412; then the index is as it was.
    void Configure(const std::string& id, const std::string& new_id, const std::string& new_path);

  private:
    using Entries = std::map<std::string, IndexEntry>;

    void SettleAll();
    bool Settle(Entries::iterator& entry);
    void CheckPathIsFree(const std::string& path, const std::string& own_id) const;
    void CheckIdIsFree(const std::string& id);
    void CheckNotMoving(const std::string& id) const;
    Entries::iterator FindSettled(const std::string& id);
    Entries::iterator FindMovingTo(const std::string& id);
    std::shared_ptr<Index> Use(const std::string& id);
    static void MakeFiles(const IndexEntry& entry);
    Json::Value GetState(const std::string& id);
    Entries::iterator Rekey(Entries::iterator entry, const std::string& new_id);
    void Move(std::unique_lock<std::mutex>& lock, const std::string& id,
              const IndexEntry::Move& target);
    void CheckIsThere(std::unique_lock<std::mutex>& lock, const std::string& id,
                      const std::string& path);
    void GiveUpMove(Index& index, const std::string& id, const std::string& old_path,
                    const std::string& new_path);
    void Switch(const std::string& id, const std::string& leftover);
    void Rename(const std::string& id, const std::string& new_id);

    const std::uint64_t min_free_;
    std::mutex mutex_;
    Registry registry_;
    std::map<std::string, std::shared_ptr<Index>> in_use_;
};

}  // namespace elasticd
