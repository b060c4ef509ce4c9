#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/private_directory.h"
#include "common/error.h"
#include "programs/kestoelasticd/engine/query.h"
#include "programs/kestoelasticd/engine/schema.h"
#include "programs/kestoelasticd/engine/value.h"

/// What the daemon needs of a search engine, and no more: an index of documents that are changed in
/// batches and searched as of the last commit. Nothing here asks for what an engine at the other
/// end of a network could not do.
///
/// All calls throw quivra::Error with the codes of codes.h: what the caller can put right (1408,
/// 1409, 1410) before anything is changed; 1412 (no space), 1400 (no memory) and 1415 (the engine
/// failed) after the whole batch was dropped; Damaged when the files cannot be trusted any more.
namespace elasticd::engine {

/// The index's files are damaged, missing or of another format: it can only be made anew.
class Damaged : public quivra::Error {
  public:
    explicit Damaged(const std::string& why);
};

struct SortKey {
    std::string field;
    bool descending = false;
};

struct SearchRequest {
    using Clock = std::chrono::steady_clock;

    Query query;
    bool by_relevance = false;  ///< else by id, byte by byte; both only where `sort` is empty
    std::vector<SortKey> sort;  ///< documents without a value come last in either order
    std::size_t offset = 0;
    std::size_t limit = SIZE_MAX;
    std::string after;  ///< a cursor: begin behind that hit, wherever it would be now
    bool count = true;  ///< false: the total is not wanted
    bool with_text = false;
    std::optional<std::set<std::string>> fields;            ///< only these; none: all
    Clock::time_point deadline = Clock::time_point::max();  ///< 1418 when it passes
    /// Search the batch, too, as far as that can be done without a reader's snapshot.
    bool with_batch = false;
};

struct Hit {
    std::string id;
    std::vector<Field> fields;  ///< stored fields, in no order that means something
    std::string cursor;         ///< for SearchRequest::after, with the same query and order
};

struct SearchResult {
    std::uint64_t total = 0;  ///< exact, whatever offset and limit
};

struct State {
    std::uint64_t documents = 0;
    std::uint64_t bytes = 0;        ///< on disk
    std::uint64_t reclaimable = 0;  ///< of them, what compaction can give back
};

/// One index. Changing calls come from one thread at a time; Search and GetState from any number,
/// at any time.
class Index {
  public:
    virtual ~Index() = default;

    /// Replaces or creates the document.
    virtual void Upsert(const Document& document) = 0;
    /// Changes the given fields of the document and no others. With another `new_id` the document
    /// takes the place of the one that has it, and everything below the old id (as a path) moves
    /// along, unless the new id lies below the old one itself. Throws Error 1408 when there is no
    /// such document.
    virtual void Set(const std::string& id, const std::string& new_id,
                     const std::vector<Field>& changes) = 0;
    /// Also succeeds when there is no such document.
    virtual void Delete(const std::string& id) = 0;
    /// Deletes what matches, the batch included.
    virtual void DeleteMatching(const Query& query) = 0;
    /// Makes the batch visible and durable, all of it or (when it throws) nothing.
    virtual void Commit() = 0;
    /// Drops the batch.
    virtual void Rollback() noexcept = 0;
    virtual bool HasChanges() const = 0;

    /// Gives the hits to `take`, in order, and returns what is true of all matches.
    virtual SearchResult Search(const SearchRequest& request,
                                const std::function<void(Hit&&)>& take) = 0;

    virtual State GetState() = 0;
    /// Looks whether the files are whole; slow. Throws Damaged when they are not.
    virtual void Check() = 0;
    /// A short step (some ten milliseconds) of giving space back, between batches; false when there
    /// is nothing left to do.
    virtual bool Compact() = 0;
};

/// Makes an empty index in the directory, or throws. `directory` outlives the call only.
using Creator = void(const quivra::base::PrivateDirectory& directory, const Schema& schema);
/// Opens the index there. `directory` outlives the index.
using Opener = std::unique_ptr<Index>(const quivra::base::PrivateDirectory& directory,
                                      std::shared_ptr<const Schema> schema);

}  // namespace elasticd::engine
