#pragma once

#include <chrono>
#include <cstdint>
#include <stdexcept>
#include <string>

struct sqlite3;

namespace sqlite {

/// What SQLite reported. `code` is its extended result code (sqlite3.h).
class Error : public std::runtime_error {
  public:
    Error(int error_code, const std::string& text) : std::runtime_error(text), code(error_code) {}

    /// The file is not what SQLite wrote: damaged, or no database at all.
    bool IsDamage() const;
    /// The disk, or the user's quota on it, is full.
    bool IsFull() const;
    /// Another connection holds the lock.
    bool IsBusy() const;
    /// The progress handler, or Interrupt, ended a statement.
    bool IsInterrupted() const;

    int code;
};

/// Throws an Error with the connection's message unless `code` is one of success.
void Check(sqlite3* database, int code, const char* what);

struct Options {
    bool read_only = false;
    int cache_kib = 2048;                       ///< memory that the page cache may take
    std::chrono::milliseconds busy_timeout{0};  ///< how long to wait for another writer
};

/// One connection to a database file that lies in a directory of ours. It is opened with every
/// defence against a damaged or hostile file that SQLite has (defensive mode, cell sizes checked,
/// the schema not trusted, no memory map, no link followed) and, once it is written, a write-ahead
/// log that is synced at every commit. Used by one thread at a time.
class Database {
  public:
    /// Opens the file of that name in the open directory, and makes it (mode 0600) where it is
    /// missing, unless read_only. The directory's descriptor must stay open as long as the
    /// database. Throws Error: SQLITE_CANTOPEN where there is no file, or something else than a
    /// file; SQLITE_NOTADB, SQLITE_CORRUPT for a damaged one.
    Database(int directory, const std::string& name, const Options& options = {});
    ~Database();
    Database(Database&& other) noexcept;
    Database& operator=(Database&& other) noexcept;
    Database(const Database&) = delete;
    Database& operator=(const Database&) = delete;

    /// Runs statements that have no parameters and whose rows nobody needs.
    void Execute(const char* statements);
    void Execute(const std::string& statements) { Execute(statements.c_str()); }

    std::int64_t LastRowId() const;
    /// Rows that the last INSERT, UPDATE or DELETE changed.
    int Changes() const;
    bool InTransaction() const;
    /// Ends the statement that runs in another thread. The one call that any thread may make.
    void Interrupt() noexcept;

    /// For what this class does not offer. Stays owned by it.
    sqlite3* Handle() const { return handle_; }

  private:
    sqlite3* handle_ = nullptr;
};

/// Everything between construction and Commit happens as a whole, or not at all.
class Transaction {
  public:
    /// Takes the write lock at once, so that no later statement can fail for it.
    explicit Transaction(Database& database);
    /// Rolls back what was not committed.
    ~Transaction();
    Transaction(const Transaction&) = delete;
    Transaction& operator=(const Transaction&) = delete;

    /// Durable when it returns. Throws Error; then all is rolled back by the destructor.
    void Commit();

  private:
    Database* database_;
};

}  // namespace sqlite
