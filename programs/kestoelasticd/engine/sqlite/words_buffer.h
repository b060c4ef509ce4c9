#pragma once

#include <cstdint>
#include <vector>

#include "programs/kestoelasticd/engine/sqlite/encoder.h"
#include "programs/sqlite/statement.h"

namespace elasticd::engine::sqlite {

/// Changes of the full-text table, held back to be made in the order of the documents' numbers:
/// FTS5 begins a new segment whenever a number is lower than the one before it, so that new and old
/// documents by turns would cost a segment each. Memory is bounded.
class WordsBuffer {
  public:
    explicit WordsBuffer(::sqlite::Database& database);

    void Insert(std::int64_t id, Columns columns) { Add({id, false, std::move(columns)}); }
    /// `columns` are those that were inserted.
    void Remove(std::int64_t id, Columns columns) { Add({id, true, std::move(columns)}); }
    void Flush();
    void Drop();

  private:
    struct Change {
        std::int64_t id;
        bool remove;
        Columns columns;
    };

    void Add(Change change);
    static void Run(::sqlite::Statement& statement, const Change& change);

    ::sqlite::Statement insert_;
    ::sqlite::Statement remove_;
    std::vector<Change> changes_;
    std::size_t bytes_ = 0;
};

}  // namespace elasticd::engine::sqlite
