#pragma once

#include <optional>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/engine.h"
#include "programs/kestoelasticd/engine/sqlite/writer.h"

namespace elasticd::engine::sqlite {

/// The keys of a sort, made into texts that compare, byte by byte, as the documents do. Documents
/// without a value come last in either order; the document's number makes every key different.
class SortOrder {
  public:
    /// Throws Error 1410 for a field that nothing can be sorted by.
    SortOrder(const std::vector<SortKey>& keys, ::sqlite::Database& database, Documents& documents);

    std::string KeyOf(std::int64_t id);

    /// The typed column that comes first, where one does.
    std::optional<unsigned int> FirstTyped() const;
    bool IsFirstDescending() const { return keys_.front().descending; }
    /// All typed columns that it compares.
    const std::vector<unsigned int>& TypedFields() const { return typed_; }

  private:
    enum class Source { kId, kParent, kTyped, kRecord, kNowhere };
    struct Key {
        Source source = Source::kNowhere;
        unsigned int field = 0;
        int column = 0;  ///< of typed_row_
        bool descending = false;
    };

    void AppendTyped(std::string& out, const Key& key);
    void AppendText(std::string& out, const std::optional<std::string>& text, bool descending);

    std::vector<Key> keys_;
    std::vector<unsigned int> typed_;
    Documents& documents_;
    std::optional<::sqlite::Statement> typed_row_;
};

}  // namespace elasticd::engine::sqlite
