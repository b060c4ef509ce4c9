#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/sqlite/bitmap.h"
#include "programs/kestoelasticd/engine/sqlite/encoder.h"
#include "programs/kestoelasticd/engine/sqlite/layout.h"
#include "programs/kestoelasticd/engine/sqlite/lengths.h"
#include "programs/kestoelasticd/engine/sqlite/tree.h"
#include "programs/kestoelasticd/engine/sqlite/words_buffer.h"
#include "programs/kestoelasticd/engine/value.h"

namespace elasticd::engine::sqlite {

/// Reads the documents that a connection sees.
class Documents {
  public:
    Documents(::sqlite::Database& database, Tree& tree, const FieldTable& fields);

    Record ReadRecord(std::int64_t id, std::string_view name);
    /// No value where the document has no text.
    Value ReadText(std::int64_t id);
    Tree& GetTree() { return tree_; }
    const FieldTable& Fields() const { return fields_; }

  private:
    Tree& tree_;
    const FieldTable& fields_;
    ::sqlite::Statement record_;
    ::sqlite::Statement text_;
};

/// The changing side of one index, in one transaction from the first change to Commit. What is
/// refused (quivra::Error 1408, 1409) is refused before anything is written; after any other
/// exception the caller rolls back.
class Writer {
  public:
    Writer(::sqlite::Database& database, const Schema& schema, Lengths& lengths);

    void Upsert(const Document& document);
    void Set(const std::string& id, const std::string& new_id, const std::vector<Field>& changes);
    void Delete(const std::string& id);
    void DeleteAll(const Bitmap& ids);

    /// Makes the typed column of the field quick to search and sort by, with the next Commit.
    void WantIndex(unsigned int field) { wanted_indexes_.push_back(field); }
    void Commit();
    void Rollback() noexcept;
    bool HasChanges() const { return transaction_.has_value(); }

    /// So that a search in this connection sees all of the batch.
    void FlushWords() { words_.Flush(); }
    Documents& GetDocuments() { return documents_; }

  private:
    void Begin();
    Record MakeRecord(const std::vector<Field>& fields, Value& text);
    void Store(std::int64_t id, std::string_view name, const Encoded& encoded);
    void StoreTyped(std::int64_t id, const Encoded& encoded);
    void StoreText(std::int64_t id, const Value& text);
    void Remove(std::int64_t id, std::string_view name);
    void CountLength(std::int64_t id, std::size_t length);
    void ForgetLength(std::int64_t id);
    void Rewrite(std::int64_t id, std::string_view old_name, std::string_view new_name,
                 const std::vector<Field>& changes);
    void MoveTree(const Node& node, const std::string& new_id);
    void MoveAlone(const Node& node, const std::string& id, const std::string& new_id,
                   const std::vector<Field>& changes);
    void Merge(const Node& source, const Node& target, std::int64_t parent,
               const std::string& name);

    ::sqlite::Database& database_;
    FieldTable fields_;
    Tree tree_;
    Documents documents_;
    Lengths& lengths_;
    WordsBuffer words_;
    std::optional<::sqlite::Transaction> transaction_;
    std::int64_t document_count_ = 0;
    std::int64_t total_length_ = 0;
    std::size_t typed_count_ = SIZE_MAX;  ///< for how many columns insert_typed_ was made
    std::optional<::sqlite::Statement> insert_typed_;
    ::sqlite::Statement insert_record_;
    ::sqlite::Statement insert_text_;
    std::vector<unsigned int> wanted_indexes_;
};

}  // namespace elasticd::engine::sqlite
