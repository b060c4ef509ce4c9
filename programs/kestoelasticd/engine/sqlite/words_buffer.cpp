#include "programs/kestoelasticd/engine/sqlite/words_buffer.h"

#include <algorithm>

namespace elasticd::engine::sqlite {
namespace {

constexpr std::size_t kMaxBytes = 1 << 20;
constexpr std::size_t kMaxChanges = 512;

std::string Sql(const std::string& first_column, const std::string& first_value) {
    std::string columns = "INSERT INTO words(" + first_column + "rowid";
    std::string values = ") VALUES(" + first_value + "?1";
    for (int column = 0; column < kColumns; ++column) {
        columns += ",c" + std::to_string(column);
        values += ",?" + std::to_string(column + 2);
    }
    return columns + values + ")";
}

}  // namespace

WordsBuffer::WordsBuffer(::sqlite::Database& database)
    : insert_(database, Sql("", "")), remove_(database, Sql("words,", "'delete',")) {}

void WordsBuffer::Add(Change change) {
    for (const ColumnText& column : change.columns) {
        bytes_ += column.Bytes().size();
    }
    changes_.push_back(std::move(change));
    if (bytes_ > kMaxBytes || changes_.size() >= kMaxChanges) {
        Flush();
    }
}

void WordsBuffer::Flush() {
    // Stable: a document's removal stays before its insertion.
    std::stable_sort(changes_.begin(), changes_.end(),
                     [](const Change& a, const Change& b) { return a.id < b.id; });
    for (const Change& change : changes_) {
        Run(change.remove ? remove_ : insert_, change);
    }
    Drop();
}

void WordsBuffer::Drop() {
    changes_.clear();
    bytes_ = 0;
}

void WordsBuffer::Run(::sqlite::Statement& statement, const Change& change) {
    statement.Bind(1, change.id);
    for (int column = 0; column < kColumns; ++column) {
        const ColumnText& text = change.columns[static_cast<std::size_t>(column)];
        if (text.IsEmpty()) {
            statement.BindNull(column + 2);
        } else {
            statement.BindText(column + 2, text.Bytes());
        }
    }
    statement.Run();
}

}  // namespace elasticd::engine::sqlite
