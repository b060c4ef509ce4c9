#pragma once

#include <functional>
#include <set>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/engine.h"
#include "programs/kestoelasticd/engine/sqlite/deadline.h"
#include "programs/kestoelasticd/engine/sqlite/lengths.h"
#include "programs/kestoelasticd/engine/sqlite/matcher.h"
#include "programs/kestoelasticd/engine/sqlite/plan.h"
#include "programs/kestoelasticd/engine/sqlite/writer.h"

namespace elasticd::engine::sqlite {

/// Carries out one search on a connection, within one snapshot of it.
class Searcher {
  public:
    using Take = std::function<void(Hit&&)>;

    /// `lengths` may be newer than the snapshot.
    Searcher(::sqlite::Database& database, Documents& documents, Lengths::View lengths,
             const SearchRequest& request, const Take& take);

    SearchResult Run();
    /// Typed columns that were sorted or filtered by and that have no index yet.
    const std::set<unsigned int>& WantedIndexes() const { return wanted_; }

  private:
    /// A place in the order: where a page begins, and what a hit's cursor says.
    struct Place {
        std::string key;
        std::int64_t id = 0;
    };

    void ByRelevance(const Plan& plan);
    void ById(const Plan& plan);
    void ByIdWalking(const Plan& plan, const Bitmap* matches);
    void BySort(const Plan& plan);
    bool ByIndex(const Bitmap& matches, class SortOrder& order);
    void TakeSorted(std::vector<Place> places);
    bool HasIndex(unsigned int field);
    void NoteTyped(const Plan& plan);
    bool Emit(std::int64_t id, std::string id_path, std::string cursor);
    std::size_t Wanted() const;

    ::sqlite::Database& database_;
    Documents& documents_;
    const Lengths::View lengths_;
    const SearchRequest& request_;
    const Take& take_;
    Deadline deadline_;
    Matcher matcher_;
    SearchResult result_;
    std::size_t skip_ = 0;  ///< hits that still come before the page
    std::size_t left_ = 0;  ///< hits that still go onto it
    std::set<unsigned int> wanted_;
};

}  // namespace elasticd::engine::sqlite
