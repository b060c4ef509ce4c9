#include "programs/fileindexd/backlog.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <utility>

#include "base/path.h"
#include "common/log.h"

namespace fileindexd {

namespace base = quivra::base;
using sqlite::Statement;
using sqlite::Transaction;

namespace {

constexpr const char* kUnit = "backlog";

/// Paths are blobs: bytes in no encoding, compared one by one. The version is the file's
/// user_version; another one means that the store is made anew, with a reindex.
constexpr const char* kTables = R"(
PRAGMA user_version = 2;
CREATE TABLE meta(key TEXT PRIMARY KEY, value BLOB NOT NULL) STRICT, WITHOUT ROWID;
CREATE TABLE trees(id INTEGER PRIMARY KEY, path BLOB NOT NULL UNIQUE, again INTEGER NOT NULL,
                   listed BLOB NOT NULL) STRICT;
CREATE TABLE directories(id INTEGER PRIMARY KEY, path BLOB NOT NULL UNIQUE,
                         again INTEGER NOT NULL) STRICT;
CREATE TABLE files(path BLOB NOT NULL UNIQUE, size INTEGER NOT NULL, due INTEGER NOT NULL,
                   tries INTEGER NOT NULL, since INTEGER NOT NULL, reason BLOB,
                   named INTEGER NOT NULL) STRICT;
CREATE INDEX files_due ON files(due) WHERE due >= 0;
CREATE INDEX files_unnamed ON files(named) WHERE named = 0;
CREATE INDEX files_failed ON files(path) WHERE reason IS NOT NULL;
)";
constexpr std::int64_t kVersion = 2;

constexpr const char* kTablesOfPaths[] = {"trees", "directories", "files"};

/// The bounds of the paths below a directory.
struct Below {
    explicit Below(const std::string& path) : begin(path + "/"), end(path + "0") {}
    std::string begin;
    std::string end;  ///< '0' follows '/'
};

std::string Sql(const char* before, const char* table, const char* behind) {
    return std::string(before) + table + behind;
}

}  // namespace

Backlog::Backlog(const base::PrivateDirectory& directory) {
    try {
        Open(directory);
    } catch (const sqlite::Error& error) {
        if (!error.IsDamage()) {
            throw;
        }
        quivra::LogError({kUnit, __LINE__}, "The backlog in %s is damaged and made anew: %s",
                         directory.Path().c_str(), error.what());
        Close();
        Remove(directory);
        Open(directory);
    }
}

void Backlog::Open(const base::PrivateDirectory& directory) {
    // A front end that lists failures, or `--once`, may hold the lock for a moment.
    database_.emplace(directory.Fd(), kFileName,
                      sqlite::Options{.busy_timeout = std::chrono::seconds(5)});
    const std::int64_t version = Number("PRAGMA user_version");
    if (version != 0 && version != kVersion) {
        Close();
        Remove(directory);
        return Open(directory);
    }
    if (version == 0) {
        CreateTables();
    }
    CheckWhole();
    is_new_ = Meta("state") == "new";
}

/// Statements are kept: parsing one costs more than running it.
Statement& Backlog::Prepared(const std::string& sql) {
    auto found = statements_.find(sql);
    if (found == statements_.end()) {
        found = statements_.emplace(sql, Statement(*database_, sql)).first;
    }
    return found->second;
}

/// Where an index and its table disagree, or a number is no number, the same work would come again
/// and again. A second or two for a million entries, when a worker starts.
void Backlog::CheckWhole() {
    Statement check(*database_, "PRAGMA integrity_check(1)");
    if (!check.Step() || check.Bytes(0) != "ok") {
        throw sqlite::Error(SQLITE_CORRUPT, "the backlog is not whole");
    }
}

/// An entry that was read can be changed, unless table and index disagree: then the same work would
/// come again and again.
void Backlog::CheckChanged() {
    if (database_->Changes() == 0) {
        throw sqlite::Error(SQLITE_CORRUPT, "an entry of the backlog cannot be found again");
    }
}

void Backlog::CreateTables() {
    Transaction transaction(*database_);
    database_->Execute(kTables);
    SetMeta("state", "new");
    transaction.Commit();
}

void Backlog::Close() {
    statements_.clear();
    database_.reset();
}

void Backlog::Remove(const base::PrivateDirectory& directory) {
    // The log must go too: it would be played back into the next database of that name.
    for (const char* suffix : {"", "-wal", "-shm"}) {
        unlinkat(directory.Fd(), (std::string(kFileName) + suffix).c_str(), 0);
    }
    errno = 0;
}

std::string Backlog::Meta(const char* key) {
    Statement& get = Prepared("SELECT value FROM meta WHERE key = ?1");
    const sqlite::ResetAtEnd reset(get);
    get.BindText(1, key);
    return get.Step() ? std::string(get.Bytes(0)) : "";
}

void Backlog::SetMeta(const char* key, const std::string& value) {
    Statement& set = Prepared("INSERT OR REPLACE INTO meta VALUES(?1, ?2)");
    set.BindText(1, key).BindBlob(2, value).Run();
}

std::int64_t Backlog::Number(const char* sql) {
    Statement& get = Prepared(sql);
    const sqlite::ResetAtEnd reset(get);
    return get.Step() ? get.Int(0) : 0;
}

void Backlog::AddReindex(const std::string& root, const std::string& rules) {
    Transaction transaction(*database_);
    // The tree at the root says all of it.
    database_->Execute("DELETE FROM trees; DELETE FROM directories; DELETE FROM files;");
    AddTree({0, root, {true, true, true, true}});
    SetMeta("rules", rules);
    SetMeta("state", "in use");
    transaction.Commit();
    is_new_ = false;
}

void Backlog::BeginEmpty(const std::string& rules) {
    Transaction transaction(*database_);
    SetMeta("rules", rules);
    SetMeta("state", "in use");
    transaction.Commit();
    is_new_ = false;
}

bool Backlog::HasChangedElsewhere() {
    const std::int64_t version = Number("PRAGMA data_version");
    return std::exchange(data_version_, version) != version;
}

std::size_t Backlog::Steps(const WorkingCopy& copy) {
    return Meta("copy") == copy.Identity() ? std::strtoull(Meta("steps").c_str(), nullptr, 10) : 0;
}

void Backlog::StoreSteps(const WorkingCopy& copy, std::size_t steps) {
    Transaction transaction(*database_);
    SetMeta("copy", copy.Identity());
    SetMeta("steps", std::to_string(steps));
    transaction.Commit();
}

bool Backlog::IsMerged(const WorkingCopy& copy) {
    return Meta("merged") == copy.Identity();
}

std::string Backlog::Rules() {
    return Meta("rules");
}

void Backlog::Merge(const Addition& addition, const WorkingCopy& copy, const std::string& rules,
                    std::int64_t now) {
    Transaction transaction(*database_);
    // What was waiting moves first: what the pass adds is about places after the renames.
    for (const Addition::Move& move : addition.moves) {
        Apply(move);
    }
    for (const std::string& path : addition.dropped) {
        DropPaths(path);
    }
    for (const Directory& tree : addition.trees) {
        AddTree(tree);
    }
    for (const std::string& path : addition.done) {
        RemoveFile(path);
    }
    for (const File& file : addition.files) {
        AddFile(file);
    }
    for (const File& file : addition.unnamed) {
        AddFile(file, false);
    }
    for (const Problem& problem : addition.failures) {
        AddFailure(problem, now);
    }
    // In the same transaction: applied a second time, the moves of an exchange would undo it.
    SetMeta("merged", copy.Identity());
    SetMeta("rules", rules);
    transaction.Commit();
}

void Backlog::Apply(const Addition::Move& move) {
    if (!move.keeps_old && !base::IsAtOrBelow(move.from, move.to)) {
        // What was waiting at the new place has been replaced by what came there.
        DropPaths(move.to);
    }
    for (const char* table : kTablesOfPaths) {
        MovePaths(table, move);
    }
}

/// Gives what waits at or below a path the new path, or a double there.
void Backlog::MovePaths(const char* table, const Addition::Move& move) {
    const bool is_files = std::string_view(table) == "files";
    const std::string moved = "CAST(?2 || substr(path, length(?1) + 1) AS BLOB)";
    const std::string which = " WHERE path = ?1 OR (path >= ?3 AND path < ?4)";
    const std::string columns = is_files ? "size, due, tries, since, reason, named"
                                : std::string_view(table) == "trees" ? "again, x''"
                                                                     : "again";
    const std::string names = is_files                             ? columns
                              : std::string_view(table) == "trees" ? "again, listed"
                                                                   : "again";
    const std::string sql =
        move.keeps_old ? "INSERT OR IGNORE INTO " + std::string(table) + "(path, " + names +
                             ") SELECT " + moved + ", " + columns + " FROM " + table + which
                       : "UPDATE OR REPLACE " + std::string(table) + " SET path = " + moved + which;
    const Below below(move.from);
    Statement& change = Prepared(sql);
    change.BindBlob(1, move.from).BindBlob(2, move.to);
    change.BindBlob(3, below.begin).BindBlob(4, below.end).Run();
    if (std::string_view(table) == "trees" && !move.keeps_old) {
        // A listing goes by paths: it begins again.
        Statement& restart = Prepared(
            "UPDATE trees SET listed = x'' WHERE path = ?1 OR "
            "(path >= ?2 AND path < ?3)");
        const Below there(move.to);
        restart.BindBlob(1, move.to).BindBlob(2, there.begin).BindBlob(3, there.end).Run();
    }
}

void Backlog::DropPaths(const std::string& path) {
    const Below below(path);
    for (const char* table : kTablesOfPaths) {
        Statement& drop =
            Prepared(Sql("DELETE FROM ", table, " WHERE path = ?1 OR (path >= ?2 AND path < ?3)"));
        drop.BindBlob(1, path).BindBlob(2, below.begin).BindBlob(3, below.end).Run();
    }
}

}  // namespace fileindexd
