#include "programs/sqlite/database.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "base/unique_fd.h"
#include "programs/sqlite/vfs.h"

namespace sqlite {
namespace {

/// Extended codes hold the primary one in their low byte.
constexpr int kPrimaryCode = 0xff;

/// SQLite would wait for a FIFO's other end and wake a device. A missing file is made here, because
/// SQLite's own mode for it depends on the umask. An existing one is not opened: closing it again
/// would drop the locks that other connections of this process hold on it.
void CheckFile(int directory, const std::string& name, bool make) {
    struct stat status {};
    if (fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
        if (!S_ISREG(status.st_mode)) {
            throw Error(SQLITE_CANTOPEN, name + " is not a file");
        }
        return;
    }
    const int flags = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    const quivra::base::UniqueFd made(
        errno == ENOENT && make ? openat(directory, name.c_str(), flags, 0600) : -1);
    if (!made.IsValid()) {
        const int code = errno == ENOSPC || errno == EDQUOT ? SQLITE_FULL : SQLITE_CANTOPEN;
        throw Error(code, "cannot open " + name + ": " + std::strerror(errno));
    }
}

void Configure(sqlite3* handle, const Options& options) {
    sqlite3_extended_result_codes(handle, 1);
    sqlite3_busy_timeout(handle, static_cast<int>(options.busy_timeout.count()));
    sqlite3_db_config(handle, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
    sqlite3_db_config(handle, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
    sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_TRIGGER, 0, nullptr);
    sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_VIEW, 0, nullptr);
}

/// Zeroing freed pages (Debian's default) would write each of them once more.
constexpr char kPragmas[] =
    "PRAGMA mmap_size=0; PRAGMA cell_size_check=ON; PRAGMA secure_delete=OFF;"
    "PRAGMA temp_store=MEMORY; PRAGMA synchronous=FULL;";

}  // namespace

bool Error::IsDamage() const {
    const int primary = code & kPrimaryCode;
    return primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB || primary == SQLITE_FORMAT;
}

bool Error::IsFull() const {
    return (code & kPrimaryCode) == SQLITE_FULL;
}

bool Error::IsBusy() const {
    const int primary = code & kPrimaryCode;
    return primary == SQLITE_BUSY || primary == SQLITE_LOCKED;
}

bool Error::IsInterrupted() const {
    return (code & kPrimaryCode) == SQLITE_INTERRUPT;
}

void Check(sqlite3* database, int code, const char* what) {
    const int primary = code & kPrimaryCode;
    if (primary == SQLITE_OK || code == SQLITE_ROW || code == SQLITE_DONE) {
        return;
    }
    // A full disk shows as SQLITE_FULL from write, as SQLITE_IOERR from what comes before it.
    const int system_error = database == nullptr ? 0 : sqlite3_system_errno(database);
    if (primary == SQLITE_IOERR && (system_error == ENOSPC || system_error == EDQUOT)) {
        code = SQLITE_FULL;
    }
    std::string text = sqlite3_errstr(code);
    if (database != nullptr && sqlite3_extended_errcode(database) == code) {
        text = sqlite3_errmsg(database);
    }
    throw Error(code, std::string(what) + ": " + text + " (" + std::to_string(code) + ")");
}

Database::Database(int directory, const std::string& name, const Options& options) {
    CheckFile(directory, name, !options.read_only);
    const int access = options.read_only ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE;
    const int code =
        sqlite3_open_v2(NameInDirectory(directory, name).c_str(), &handle_,
                        access | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_NOMUTEX, PrivateVfs());
    try {
        Check(handle_, code, "open");
        Configure(handle_, options);
        Execute(kPragmas);
        Execute("PRAGMA cache_size=-" + std::to_string(options.cache_kib));
        if (!options.read_only) {
            // Of a new file only, and before its first page is written: freed pages can be given
            // back then ("PRAGMA incremental_vacuum") without copying all others.
            Execute("PRAGMA auto_vacuum=INCREMENTAL; PRAGMA journal_mode=WAL");
        }
    } catch (...) {
        sqlite3_close_v2(handle_);  // also where opening failed
        throw;
    }
}

Database::~Database() {
    sqlite3_close_v2(handle_);
}

Database::Database(Database&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

Database& Database::operator=(Database&& other) noexcept {
    std::swap(handle_, other.handle_);
    return *this;
}

void Database::Execute(const char* statements) {
    Check(handle_, sqlite3_exec(handle_, statements, nullptr, nullptr, nullptr), statements);
}

std::int64_t Database::LastRowId() const {
    return sqlite3_last_insert_rowid(handle_);
}

int Database::Changes() const {
    return sqlite3_changes(handle_);
}

bool Database::InTransaction() const {
    return sqlite3_get_autocommit(handle_) == 0;
}

void Database::Interrupt() noexcept {
    sqlite3_interrupt(handle_);
}

Transaction::Transaction(Database& database) : database_(&database) {
    database.Execute("BEGIN IMMEDIATE");
}

Transaction::~Transaction() {
    // Some errors (a full disk, for one) have rolled back already.
    if (database_ != nullptr && database_->InTransaction()) {
        sqlite3_exec(database_->Handle(), "ROLLBACK", nullptr, nullptr, nullptr);
    }
}

void Transaction::Commit() {
    database_->Execute("COMMIT");
    database_ = nullptr;
}

}  // namespace sqlite
