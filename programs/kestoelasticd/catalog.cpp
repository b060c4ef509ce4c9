#include "programs/kestoelasticd/catalog.h"

#include <sodium.h>

#include <algorithm>
#include <utility>

#include "base/path.h"
#include "common/error.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/sqlite_index.h"
#include "programs/kestoelasticd/index_directory.h"
#include "programs/kestoelasticd/mapping.h"

namespace elasticd {
namespace {

using quivra::Error;

std::string MakeUuid() {
    unsigned char bytes[16];
    char hex[2 * sizeof(bytes) + 1];
    randombytes_buf(bytes, sizeof(bytes));
    return sodium_bin2hex(hex, sizeof(hex), bytes, sizeof(bytes));
}

/// Whether one of the directories lies within the other, or they are the same.
bool Overlap(const std::string& one, const std::string& other) {
    return quivra::base::IsAtOrBelow(one, other) || quivra::base::IsAtOrBelow(other, one);
}

}  // namespace

Catalog::Catalog(const std::string& registry_path, std::uint64_t min_free)
    : min_free_(min_free), registry_(registry_path) {
    SettleAll();
}

void Catalog::SettleAll() {
    bool changed = false;
    for (auto entry = registry_.entries.begin(); entry != registry_.entries.end();) {
        try {
            changed |= Settle(entry);
        } catch (const Error& error) {
            quivra::LogError({"catalog", __LINE__}, "%s: %s", entry->first.c_str(), error.what());
            ++entry;
        }
    }
    if (changed) {
        registry_.Save();
    }
}

/// Finishes or undoes what was interrupted, and moves on to the next entry; whether that changed
/// anything. While a disk is missing, everything waits.
bool Catalog::Settle(Entries::iterator& entry) {
    IndexEntry& index = entry->second;
    if (index.deleting) {
        RemoveIndexDirectory(index.path, index.uuid);
        entry = registry_.entries.erase(entry);
        return true;
    }
    bool changed = false;
    if (index.move) {
        const bool at_old = IsIndexDirectory(index.path, index.uuid);
        if (at_old) {
            UndoMove(index.path, index.move->path, index.uuid);
            index.move.reset();
            changed = true;
        } else if (IsIndexDirectory(index.move->path, index.uuid)) {
            index.path = index.move->path;
            const std::string new_id = std::exchange(index.move, std::nullopt)->id;
            Rekey(entry++, new_id);
            return true;
        }
    }
    if (!index.leftover.empty() && IsIndexDirectory(index.path, index.uuid) &&
        RemoveIndexDirectory(index.leftover, index.uuid)) {
        index.leftover.clear();
        changed = true;
    }
    ++entry;
    return changed;
}

Catalog::Entries::iterator Catalog::Rekey(Entries::iterator entry, const std::string& new_id) {
    if (entry->first == new_id) {
        return entry;
    }
    auto node = registry_.entries.extract(entry);
    node.key() = new_id;
    return registry_.entries.insert(std::move(node)).position;
}

std::shared_ptr<Index> Catalog::Find(const std::string& id) {
    const std::lock_guard lock(mutex_);
    return Use(id);
}

/// As Find, with the lock held.
std::shared_ptr<Index> Catalog::Use(const std::string& id) {
    const auto found = in_use_.find(id);
    if (found != in_use_.end()) {
        return found->second;
    }
    const auto entry = FindSettled(id);
    if (entry == registry_.entries.end()) {
        throw Error(kNoSuchIndex, "No such index: " + id);
    }
    if (entry->second.deleting) {
        throw Error(kBusy, "The index is being made or deleted: " + id);
    }
    if (entry->second.move) {
        throw Error(kIndexUnavailable, "The index was being moved, and is at neither place: " + id);
    }
    auto index = std::make_shared<Index>(
        Index::Place{entry->second.path, entry->second.uuid},
        std::make_shared<const engine::Schema>(ReadMapping(entry->second.mappings)),
        entry->second.paused, entry->second.fresh, min_free_);
    in_use_.emplace(id, index);
    return index;
}

/// The entry that has the id, or is about to get it. An interrupted move that could not be settled
/// at the start, because its disk was missing, is settled now.
Catalog::Entries::iterator Catalog::FindSettled(const std::string& id) {
    auto entry = registry_.entries.find(id);
    if (entry == registry_.entries.end()) {
        entry = FindMovingTo(id);
    }
    if (entry == registry_.entries.end() || !entry->second.move) {
        return entry;
    }
    CheckNotMoving(entry->first);
    auto settled = entry;
    if (Settle(settled)) {
        registry_.Save();
        return registry_.entries.find(id);
    }
    return entry;
}

Catalog::Entries::iterator Catalog::FindMovingTo(const std::string& id) {
    return std::find_if(registry_.entries.begin(), registry_.entries.end(), [&](const auto& entry) {
        return entry.second.move && entry.second.move->id == id;
    });
}

void Catalog::CheckNotMoving(const std::string& id) const {
    const auto index = in_use_.find(id);
    if (index != in_use_.end() && index->second->IsMoving()) {
        throw Error(kBusy, "The index is being moved: " + id);
    }
}

/// The id that an index is about to get belongs to it already.
void Catalog::CheckIdIsFree(const std::string& id) {
    const auto mover = FindMovingTo(id);
    if (mover != registry_.entries.end()) {
        CheckNotMoving(mover->first);
        throw Error(kIndexExists, "Another index is to get this id: " + id);
    }
}

void Catalog::CheckPathIsFree(const std::string& path, const std::string& own_id) const {
    for (const auto& [id, entry] : registry_.entries) {
        const bool taken = Overlap(path, entry.path) ||
                           (entry.move && Overlap(path, entry.move->path)) ||
                           (!entry.leftover.empty() && Overlap(path, entry.leftover));
        if (id != own_id && taken) {
            throw Error(kIndexExists, "The path belongs to the index " + id + ": " + path);
        }
    }
}

void Catalog::MakeFiles(const IndexEntry& entry) {
    const engine::Schema schema = ReadMapping(entry.mappings);
    const quivra::base::PrivateDirectory directory = MakeIndexDirectory(entry.path, entry.uuid);
    try {
        engine::sqlite::Create(directory, schema);
    } catch (...) {
        RemoveIndexDirectory(entry.path, entry.uuid);
        throw;
    }
}

void Catalog::Create(const std::string& id, const std::string& path, const Json::Value& mappings) {
    std::unique_lock lock(mutex_);
    const auto found = registry_.entries.find(id);
    if (found != registry_.entries.end()) {
        CheckIsThere(lock, id, path);
        return;
    }
    CheckIdIsFree(id);
    CheckPathIsFree(path, std::string());
    ReadMapping(mappings);  // throws where it cannot be followed
    IndexEntry entry;
    entry.path = path;
    entry.uuid = MakeUuid();
    entry.mappings = mappings;
    entry.deleting = true;  // what is found half made after an interruption goes
    registry_.entries.emplace(id, entry);
    lock.unlock();
    try {
        MakeFiles(entry);
        lock.lock();
        registry_.entries.at(id).deleting = false;
        registry_.Save();
    } catch (...) {
        RemoveIndexDirectory(entry.path, entry.uuid);
        if (!lock.owns_lock()) {
            lock.lock();
        }
        registry_.entries.erase(id);
        throw;
    }
}

/// An index that has vanished is made anew; one that is only damaged is found out when it is used.
void Catalog::CheckIsThere(std::unique_lock<std::mutex>& lock, const std::string& id,
                           const std::string& path) {
    const IndexEntry& entry = registry_.entries.at(id);
    if (entry.path != path) {
        throw Error(kIndexExists, "The index has another path: " + entry.path);
    }
    const std::uint64_t generation = Use(id)->Generation();
    if (!entry.move && !IsIndexDirectory(path, entry.uuid)) {
        lock.unlock();
        MakeAnew(id, path + " is gone", generation);
    }
}

void Catalog::MakeAnew(const std::string& id, const std::string& why, std::uint64_t generation) {
    std::unique_lock lock(mutex_);
    const std::shared_ptr<Index> index = Use(id);
    if (index->Generation() != generation) {
        return;
    }
    if (!index->BeginMove()) {
        lock.unlock();
        return index->AwaitMove();
    }
    const IndexEntry entry = registry_.entries.at(id);
    lock.unlock();
    struct End {
        Index& index;
        const std::string& path;
        ~End() { index.EndMove(path); }
    } end{*index, entry.path};
    index->Close();
    std::string aside;
    try {
        aside = SetAside(entry.path);
        // Before the files: an empty index that nobody knows to be empty would stay so.
        lock.lock();
        registry_.entries.at(id).fresh = true;
        registry_.Save();
        lock.unlock();
        index->SetFresh(true);
        MakeFiles(entry);
    } catch (const Error& error) {
        const int code = error.code;
        throw Error(code == kNoSpace ? kNoSpace : kIndexUnavailable,
                    "The index " + id + " cannot be made anew: " + error.reason);
    }
    quivra::LogError({"catalog", __LINE__}, "The index %s was made anew: %s%s%s", id.c_str(),
                     why.c_str(), aside.empty() ? "" : "; what was left of it is ", aside.c_str());
}

void Catalog::Accept(const std::string& id) {
    const std::lock_guard lock(mutex_);
    const std::shared_ptr<Index> index = Use(id);
    IndexEntry& entry = registry_.entries.at(id);
    if (std::exchange(entry.fresh, false)) {
        try {
            registry_.Save();
        } catch (...) {
            entry.fresh = true;
            throw;
        }
    }
    index->SetFresh(false);
}

Json::Value Catalog::GetStates() {
    std::vector<std::string> ids;
    {
        const std::lock_guard lock(mutex_);
        for (const auto& [id, entry] : registry_.entries) {
            ids.push_back(id);
        }
    }
    Json::Value states;
    states["indexes"] = Json::arrayValue;
    for (const std::string& id : ids) {
        states["indexes"].append(GetState(id));
    }
    return states;
}

/// Twice at most: what was damaged is new then.
Json::Value Catalog::GetState(const std::string& id) {
    Json::Value json;
    json["id"] = id;
    json["problem"] = "";
    for (int attempt = 0; attempt < 2; ++attempt) {
        std::uint64_t generation = 0;
        try {
            const std::shared_ptr<Index> index = Find(id);
            generation = index->Generation();
            const engine::State state = index->GetState();
            json["documents"] = Json::UInt64{state.documents};
            json["bytes"] = Json::UInt64{state.bytes};
            json["reclaimable"] = Json::UInt64{state.reclaimable};
            break;
        } catch (const engine::Damaged& damage) {
            try {
                MakeAnew(id, damage.reason, generation);
            } catch (const Error& error) {
                json["problem"] = error.reason;
                break;
            }
        } catch (const Error& error) {
            json["problem"] = error.reason;
            break;
        }
    }
    const std::lock_guard lock(mutex_);
    const auto entry = registry_.entries.find(id);
    json["fresh"] = entry != registry_.entries.end() && entry->second.fresh;
    return json;
}

void Catalog::Maintain() {
    std::vector<std::shared_ptr<Index>> indexes;
    {
        const std::lock_guard lock(mutex_);
        for (const auto& [id, index] : in_use_) {
            indexes.push_back(index);
        }
    }
    for (const std::shared_ptr<Index>& index : indexes) {
        try {
            index->Maintain();
        } catch (const Error&) {  // whoever uses it next is told
        }
    }
}

void Catalog::Delete(const std::string& id) {
    std::unique_lock lock(mutex_);
    if (!registry_.entries.contains(id)) {
        CheckIdIsFree(id);
        return;
    }
    const std::shared_ptr<Index> index = Use(id);
    if (!index->BeginMove()) {
        throw Error(kBusy, "The index is being moved: " + id);
    }
    registry_.entries.at(id).deleting = true;
    const IndexEntry entry = registry_.entries.at(id);
    try {
        registry_.Save();
        lock.unlock();
        index->Close();
        if (!RemoveIndexDirectory(entry.path, entry.uuid)) {
            quivra::LogError({"catalog", __LINE__}, "%s is no index: left", entry.path.c_str());
        }
        lock.lock();
    } catch (...) {
        if (!lock.owns_lock()) {
            lock.lock();
        }
        registry_.entries.at(id).deleting = false;
        lock.unlock();
        index->EndMove(entry.path);
        throw;
    }
    in_use_.erase(id);
    registry_.entries.erase(id);
    registry_.Save();
}

void Catalog::SetPaused(const std::string& id, bool paused) {
    std::unique_lock lock(mutex_);
    const std::shared_ptr<Index> index = Use(id);
    CheckNotMoving(id);
    IndexEntry& entry = registry_.entries.at(id);
    if (entry.paused != paused) {
        entry.paused = paused;
        try {
            registry_.Save();
        } catch (...) {
            entry.paused = !paused;
            throw;
        }
    }
    index->WantPaused(paused);
    lock.unlock();
    index->ApplyPaused();  // waits for those who use the index
}

void Catalog::Configure(const std::string& id, const std::string& new_id,
                        const std::string& new_path) {
    std::unique_lock lock(mutex_);
    const auto found = registry_.entries.find(id);
    const auto target = registry_.entries.find(new_id);
    if (found == registry_.entries.end() && target != registry_.entries.end() &&
        (new_path.empty() || target->second.path == new_path)) {
        return;  // done before
    }
    const std::shared_ptr<Index> index = Use(id);
    const IndexEntry::Move move{new_id.empty() ? id : new_id,
                                new_path.empty() ? registry_.entries.at(id).path : new_path};
    if (move.id == id && move.path == registry_.entries.at(id).path) {
        return;
    }
    if (move.id != id && target != registry_.entries.end()) {
        throw Error(kIndexExists, "Another index has this id: " + new_id);
    }
    CheckIdIsFree(move.id);
    CheckPathIsFree(move.path, id);
    CheckNotMoving(id);
    if (move.path == registry_.entries.at(id).path) {
        Rename(id, move.id);
    } else if (index->BeginMove()) {
        Move(lock, id, move);
    } else {
        throw Error(kBusy, "The index is being moved: " + id);
    }
}

/// With the index closed to others, and without the lock while files move.
void Catalog::Move(std::unique_lock<std::mutex>& lock, const std::string& id,
                   const IndexEntry::Move& target) {
    const std::shared_ptr<Index> index = in_use_.at(id);
    const std::string old_path = registry_.entries.at(id).path;
    const std::string uuid = registry_.entries.at(id).uuid;
    bool copied = false;
    try {
        registry_.entries.at(id).move = target;
        registry_.Save();
        lock.unlock();
        index->CommitAndClose();
        copied = MoveIndexDirectory(old_path, target.path, uuid) == Moved::kCopied;
        lock.lock();
        Switch(id, copied ? old_path : std::string());
        lock.unlock();
    } catch (...) {
        if (lock.owns_lock()) {
            lock.unlock();
        }
        GiveUpMove(*index, id, old_path, target.path);
        throw;
    }
    index->EndMove(target.path);
    if (copied && RemoveIndexDirectory(old_path, uuid)) {
        lock.lock();
        registry_.entries.at(target.id).leftover.clear();
        registry_.Save();
    }
}

void Catalog::GiveUpMove(Index& index, const std::string& id, const std::string& old_path,
                         const std::string& new_path) {
    std::unique_lock lock(mutex_);
    IndexEntry& entry = registry_.entries.at(id);
    try {
        UndoMove(old_path, new_path, entry.uuid);
        entry.move.reset();
        registry_.Save();
    } catch (const Error& error) {
        // The next start tries again: the record of the move is still there, on disk.
        quivra::LogError({"catalog", __LINE__}, "cannot undo a move: %s", error.what());
        entry.move.reset();
    }
    lock.unlock();
    index.EndMove(old_path);
}

/// Records that the index is at its new place. When that cannot be saved, files that are at the new
/// place alone are found there by the next start; a copy is given up (Error 505).
void Catalog::Switch(const std::string& id, const std::string& leftover) {
    const Entries before = registry_.entries;
    const auto found = registry_.entries.find(id);
    const IndexEntry::Move target = *std::exchange(found->second.move, std::nullopt);
    found->second.path = target.path;
    found->second.leftover = leftover;
    Rekey(found, target.id);
    try {
        registry_.Save();
    } catch (const Error&) {
        if (!leftover.empty()) {
            registry_.entries = before;
            throw;
        }
    }
    auto node = in_use_.extract(id);
    node.key() = target.id;
    in_use_.insert(std::move(node));
}

/// A new id alone is one change of the registry.
void Catalog::Rename(const std::string& id, const std::string& new_id) {
    Rekey(registry_.entries.find(id), new_id);
    try {
        registry_.Save();
    } catch (...) {
        Rekey(registry_.entries.find(new_id), id);
        throw;
    }
    auto node = in_use_.extract(id);
    node.key() = new_id;
    in_use_.insert(std::move(node));
}

}  // namespace elasticd
