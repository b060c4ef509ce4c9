#pragma once

#include <cstdint>
#include <string_view>

#include "programs/sqlite/database.h"

struct sqlite3_stmt;

namespace sqlite {

/// A prepared statement, to be kept and run many times. Its database outlives it. Parameters are
/// numbered from 1, columns from 0. Everything throws Error.
class Statement {
  public:
    /// Prepares the one statement in `sql`.
    Statement(Database& database, std::string_view sql);
    ~Statement();
    Statement(Statement&& other) noexcept;
    Statement& operator=(Statement&& other) noexcept;
    Statement(const Statement&) = delete;
    Statement& operator=(const Statement&) = delete;

    /// Sets a parameter. Texts and blobs are not copied: they stay as they are until Reset.
    Statement& Bind(int parameter, std::int64_t value);
    Statement& Bind(int parameter, double value);
    Statement& BindText(int parameter, std::string_view value);
    Statement& BindBlob(int parameter, std::string_view value);
    Statement& BindNull(int parameter);
    /// A pointer for a function of ours that knows its type by the name, a literal.
    Statement& BindPointer(int parameter, void* value, const char* type);

    /// Runs on to the next row; false at the end, where the statement is reset.
    bool Step();
    /// Runs it to its end, for what returns no rows.
    void Run();
    /// Gives up the rest of the rows, and what they hold open. Parameters keep their values.
    void Reset() noexcept;

    bool IsNull(int column) const;
    std::int64_t Int(int column) const;
    double Double(int column) const;
    /// Valid until the next Step or Reset. The bytes of texts and blobs alike.
    std::string_view Bytes(int column) const;

    sqlite3_stmt* Handle() const { return handle_; }

  private:
    sqlite3* Owner() const;

    sqlite3_stmt* handle_ = nullptr;
};

/// Resets a statement at the end of a block, however that is left: an open row would keep its
/// snapshot of the database.
class ResetAtEnd {
  public:
    explicit ResetAtEnd(Statement& statement) : statement_(statement) {}
    ~ResetAtEnd() { statement_.Reset(); }
    ResetAtEnd(const ResetAtEnd&) = delete;
    ResetAtEnd& operator=(const ResetAtEnd&) = delete;

  private:
    Statement& statement_;
};

}  // namespace sqlite
