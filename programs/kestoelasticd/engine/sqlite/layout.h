#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "programs/kestoelasticd/engine/schema.h"
#include "programs/sqlite/statement.h"

/// The tables of one index:
///
///   meta      what is true of all: the layout's number, counts
///   fields    the fields' names by number
///   nodes     paths as a tree: (parent, name) -> id; a document has the number of its node
///   docs      a row a document, with a typed column "v<field>" for each number and n-gram value
///   records   the other fields, encoded (record.h)
///   texts     the file's text, compressed
///   lengths   a byte a document, for ranking (lengths.h)
///   words     the full-text table: contentless, positions kept, no row of lengths
///
/// All of it is on disk; a change needs another kLayout.
namespace elasticd::engine::sqlite {

inline constexpr char kFileName[] = "index.sqlite";
inline constexpr int kLayout = 1;

/// Columns of the full-text table. A field gets one of its own when it is first used, as long as
/// there are any; the rest share one, where their words carry the field's number.
inline constexpr int kTextColumn = 0;
inline constexpr int kTokenColumn = 1;  ///< keywords and numbers: tokens that no other column holds
inline constexpr int kSharedColumn = 2;
inline constexpr int kColumns = 48;

/// The rows of `meta`.
inline constexpr char kDocuments[] = "documents";
inline constexpr char kTotalLength[] = "total_length";
inline constexpr char kGeneration[] = "generation";

void CreateTables(::sqlite::Database& database);
/// Throws Damaged when the tables are not what CreateTables made.
void CheckTables(::sqlite::Database& database);

std::int64_t ReadMeta(::sqlite::Database& database, const char* key);
void WriteMeta(::sqlite::Database& database, const char* key, std::int64_t value);

/// Numbers the fields of one index, so that a record spends a byte on its field. Numbers are never
/// reused. Kept with the documents that use it.
class FieldTable {
  public:
    static constexpr std::size_t kMaxFields = 8192;
    static constexpr std::size_t kMaxTyped = 1500;  ///< SQLite's own limit is 2,000 columns
    static constexpr std::size_t kMaxNameSize = 256;

    struct Entry {
        std::string name;
        const FieldSettings* settings = nullptr;
        int column = kSharedColumn;
        bool typed = false;     ///< has a column in `docs`
        bool searched = false;  ///< not one of those that are only kept

        /// Whether its words need the field's number in the shared column.
        bool IsScoped() const { return column == kSharedColumn || !settings->in_all; }
    };

    explicit FieldTable(const Schema& schema) : schema_(&schema) {}

    /// Reads what was added since the last time.
    void Load(::sqlite::Database& database);
    /// Writes what was added since.
    void Save(::sqlite::Database& database);
    /// Forgets what was not saved, and what was saved in a transaction that is gone.
    void Reset();

    std::optional<unsigned int> Find(const std::string& name) const;
    /// Throws Error 1409 when the name is too long or the table is full.
    unsigned int FindOrAdd(const std::string& name);
    /// Throws Damaged for a number that no field has.
    const Entry& Of(unsigned int number) const;
    std::size_t Size() const { return entries_.size(); }
    /// Numbers of the fields with a typed column, in the order of the columns.
    const std::vector<unsigned int>& Typed() const { return typed_; }
    const Schema& GetSchema() const { return *schema_; }

  private:
    void Add(const std::string& name);

    const Schema* schema_;
    std::vector<Entry> entries_;
    std::vector<unsigned int> typed_;
    std::unordered_map<std::string, unsigned int> numbers_;
    std::size_t saved_ = 0;
    int next_column_ = kSharedColumn + 1;
};

std::string TypedColumn(unsigned int field);

}  // namespace elasticd::engine::sqlite
