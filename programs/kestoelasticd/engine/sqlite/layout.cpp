#include "programs/kestoelasticd/engine/sqlite/layout.h"

#include <sqlite3.h>

#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/engine.h"

namespace elasticd::engine::sqlite {
namespace {

using ::sqlite::Database;
using ::sqlite::Statement;

/// `nodes` is a tree in itself, ordered as the children of a directory are; the index over it holds
/// the way back up. `records` and `texts` are apart from `docs`, so that looking through a typed
/// column reads a few bytes a document.
constexpr char kTables[] =
    "CREATE TABLE meta(key TEXT PRIMARY KEY, value INTEGER NOT NULL) WITHOUT ROWID;"
    "CREATE TABLE fields(number INTEGER PRIMARY KEY, name BLOB NOT NULL);"
    "CREATE TABLE nodes(parent INTEGER NOT NULL, name BLOB NOT NULL, id INTEGER NOT NULL,"
    "  flags INTEGER NOT NULL, PRIMARY KEY(parent, name)) WITHOUT ROWID;"
    "CREATE UNIQUE INDEX nodes_by_id ON nodes(id);"
    "CREATE TABLE docs(id INTEGER PRIMARY KEY);"
    "CREATE TABLE records(id INTEGER PRIMARY KEY, fields BLOB NOT NULL);"
    "CREATE TABLE texts(id INTEGER PRIMARY KEY, body BLOB NOT NULL);"
    "CREATE TABLE lengths(page INTEGER PRIMARY KEY, bytes BLOB NOT NULL);";

/// Larger buffers and rarer merges than FTS5's own: a third less written while many documents come
/// (measured with 200,000 of 1.1 kB: 742 MB against 1,001 MB), for some 3 MB of memory.
constexpr char kTuning[] =
    "INSERT INTO words(words, rank) VALUES('hashsize', 4194304);"
    "INSERT INTO words(words, rank) VALUES('automerge', 8);";

std::string WordsTable() {
    std::string sql = "CREATE VIRTUAL TABLE words USING fts5(";
    for (int column = 0; column < kColumns; ++column) {
        sql += "c" + std::to_string(column) + ",";
    }
    return sql + " content='', columnsize=0, tokenize='elasticd');";
}

}  // namespace

void CreateTables(Database& database) {
    ::sqlite::Transaction transaction(database);
    database.Execute(kTables);
    database.Execute(WordsTable());
    database.Execute(kTuning);
    WriteMeta(database, "layout", kLayout);
    for (const char* key : {kDocuments, kTotalLength, kGeneration}) {
        WriteMeta(database, key, 0);
    }
    transaction.Commit();
}

void CheckTables(Database& database) {
    try {
        if (ReadMeta(database, "layout") != kLayout) {
            throw Damaged("the index has another layout");
        }
        // Reads the root of each table, and the full-text table's list of segments.
        database.Execute(
            "SELECT max(id) FROM docs; SELECT max(id) FROM records; SELECT max(id) FROM texts;"
            "SELECT max(id) FROM nodes; SELECT max(page) FROM lengths; SELECT count(*) FROM fields;"
            "SELECT rowid FROM words WHERE words MATCH '\"\x06\"' LIMIT 1;");
    } catch (const ::sqlite::Error& error) {
        if (error.code == SQLITE_ERROR) {  // no such table, or column
            throw Damaged(std::string("the index's tables are incomplete: ") + error.what());
        }
        throw;
    }
}

std::int64_t ReadMeta(Database& database, const char* key) {
    Statement read(database, "SELECT value FROM meta WHERE key=?");
    if (!read.BindText(1, key).Step()) {
        throw Damaged(std::string("the index lacks its ") + key);
    }
    return read.Int(0);
}

void WriteMeta(Database& database, const char* key, std::int64_t value) {
    Statement(database, "INSERT OR REPLACE INTO meta VALUES(?, ?)")
        .BindText(1, key)
        .Bind(2, value)
        .Run();
}

std::string TypedColumn(unsigned int field) {
    return "v" + std::to_string(field);
}

void FieldTable::Add(const std::string& name) {
    Entry entry;
    entry.name = name;
    entry.settings = &schema_->Of(name);
    entry.searched = !name.starts_with(kUnsearchedPrefix) && name != kParentField;
    entry.typed = entry.searched && (entry.settings->IsNumeric() || entry.settings->ngram);
    const bool cut = entry.settings->HasWords() || entry.settings->ngram;
    if (name == kTextField) {
        entry.column = kTextColumn;
    } else if (entry.searched && cut && entry.settings->in_all && next_column_ < kColumns) {
        entry.column = next_column_++;
    }
    const auto number = static_cast<unsigned int>(entries_.size());
    if (entry.typed) {
        typed_.push_back(number);
    }
    entries_.push_back(std::move(entry));
    numbers_.emplace(name, number);
}

void FieldTable::Load(Database& database) {
    Statement read(database, "SELECT number, name FROM fields WHERE number>=? ORDER BY number");
    read.Bind(1, static_cast<std::int64_t>(entries_.size()));
    while (read.Step()) {
        if (read.Int(0) != static_cast<std::int64_t>(entries_.size())) {
            throw Damaged("the index's table of fields has a gap");
        }
        Add(std::string(read.Bytes(1)));
    }
    saved_ = entries_.size();
}

void FieldTable::Save(Database& database) {
    for (; saved_ < entries_.size(); ++saved_) {
        const auto number = static_cast<unsigned int>(saved_);
        Statement(database, "INSERT INTO fields VALUES(?, ?)")
            .Bind(1, std::int64_t{number})
            .BindBlob(2, entries_[saved_].name)
            .Run();
        if (entries_[saved_].typed) {
            database.Execute("ALTER TABLE docs ADD COLUMN " + TypedColumn(number));
        }
    }
}

void FieldTable::Reset() {
    *this = FieldTable(*schema_);
}

std::optional<unsigned int> FieldTable::Find(const std::string& name) const {
    const auto found = numbers_.find(name);
    return found == numbers_.end() ? std::nullopt : std::optional(found->second);
}

const FieldTable::Entry& FieldTable::Of(unsigned int number) const {
    if (number >= entries_.size()) {
        throw Damaged("a document has a field without a name");
    }
    return entries_[number];
}

unsigned int FieldTable::FindOrAdd(const std::string& name) {
    if (const std::optional<unsigned int> number = Find(name)) {
        return *number;
    }
    if (name.size() > kMaxNameSize || name.empty()) {
        throw quivra::Error(kBadDocument, "A field's name is empty or too long");
    }
    if (entries_.size() >= kMaxFields || typed_.size() >= kMaxTyped) {
        throw quivra::Error(kBadDocument, "The index has too many different fields");
    }
    Add(name);
    return static_cast<unsigned int>(entries_.size() - 1);
}

}  // namespace elasticd::engine::sqlite
