#include "programs/fileindexd/backlog.h"

#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
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

/// A lease, a short memory, a program that writes: gone within seconds, mostly. A disk may be
/// replaced next week. In seconds.
constexpr std::int64_t kFirstWait = 5;
constexpr std::int64_t kLastWait = 24 * 60 * 60;

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

// Bits on disk.
std::int64_t BitsOf(const ContentClasses& classes) {
    return (classes.document ? 1 : 0) | (classes.audio ? 2 : 0) | (classes.video ? 4 : 0) |
           (classes.photo ? 8 : 0);
}

ContentClasses ClassesOf(std::int64_t bits) {
    return {(bits & 1) != 0, (bits & 2) != 0, (bits & 4) != 0, (bits & 8) != 0};
}

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

ContentClasses Backlog::AgainAt(const std::string& path) {
    ContentClasses again;
    for (const char* table : {"trees", "directories"}) {
        Statement& get = Prepared(Sql("SELECT again FROM ", table, " WHERE path = ?1"));
        const sqlite::ResetAtEnd reset(get);
        for (std::string_view at = path; at.size() > 1; at = base::Directory(at)) {
            get.BindBlob(1, at);
            if (get.Step()) {
                again.Add(ClassesOf(get.Int(0)));
            }
            get.Reset();
        }
    }
    return again;
}

/// A tree above that has not been begun will pass here.
void Backlog::AddTree(const Directory& tree) {
    Statement& get = Prepared("SELECT again FROM trees WHERE path = ?1 AND length(listed) = 0");
    const sqlite::ResetAtEnd reset(get);
    for (std::string_view at = tree.path; at.size() > 1; at = base::Directory(at)) {
        get.BindBlob(1, at);
        const bool is_implied = get.Step() && ClassesOf(get.Int(0)).Includes(tree.again);
        get.Reset();
        if (is_implied) {
            return;
        }
    }
    Statement& add = Prepared(
        "INSERT INTO trees(path, again, listed) VALUES(?1, ?2, x'') ON CONFLICT(path) DO "
        "UPDATE SET again = again | excluded.again, listed = x''");
    add.BindBlob(1, tree.path).Bind(2, BitsOf(tree.again)).Run();
}

void Backlog::AddDirectory(Directory& directory) {
    Statement& add = Prepared(
        "INSERT INTO directories(path, again) VALUES(?1, ?2) ON CONFLICT(path) DO UPDATE "
        "SET again = again | excluded.again RETURNING id");
    add.BindBlob(1, directory.path).Bind(2, BitsOf(directory.again));
    const sqlite::ResetAtEnd reset(add);
    if (add.Step()) {
        directory.id = add.Int(0);
    }
}

void Backlog::AddFile(const File& file, bool is_named) {
    Statement& add = Prepared("INSERT OR REPLACE INTO files VALUES(?1, ?2, 0, 0, 0, NULL, ?3)");
    add.BindBlob(1, file.path).Bind(2, file.size).Bind(3, std::int64_t{is_named}).Run();
}

void Backlog::AddFailure(const Problem& problem, std::int64_t now) {
    std::int64_t size = 0;
    std::int64_t tries = 0;
    std::int64_t since = now;
    {
        Statement& get = Prepared("SELECT size, tries, since FROM files WHERE path = ?1");
        const sqlite::ResetAtEnd reset(get);
        get.BindBlob(1, problem.path);
        if (get.Step()) {
            size = get.Int(0);
            tries = get.Int(1);
            since = tries > 0 ? get.Int(2) : now;
        }
    }
    // 2^20 seconds are more than kLastWait.
    const std::int64_t wait =
        std::min(kFirstWait << std::clamp<std::int64_t>(tries, 0, 20), kLastWait);
    Statement& add = Prepared("INSERT OR REPLACE INTO files VALUES(?1, ?2, ?3, ?4, ?5, ?6, 1)");
    add.BindBlob(1, problem.path).Bind(2, size).Bind(3, problem.can_pass ? now + wait : kNever);
    add.Bind(4, tries + 1).Bind(5, since).BindBlob(6, problem.reason).Run();
}

void Backlog::RemoveFile(const std::string& path) {
    Statement& remove = Prepared("DELETE FROM files WHERE path = ?1");
    remove.BindBlob(1, path).Run();
}

std::optional<Backlog::Tree> Backlog::FirstTree() {
    Statement& get = Prepared("SELECT id, path, again, listed FROM trees ORDER BY id LIMIT 1");
    const sqlite::ResetAtEnd reset(get);
    if (!get.Step()) {
        return std::nullopt;
    }
    return Tree{get.Int(0), std::string(get.Bytes(1)), ClassesOf(get.Int(2)),
                std::string(get.Bytes(3))};
}

void Backlog::NoteListed(const Tree& tree, const std::string& up_to) {
    Statement& set = Prepared("UPDATE trees SET listed = ?2 WHERE id = ?1");
    set.Bind(1, tree.id).BindBlob(2, up_to).Run();
    CheckChanged();
}

void Backlog::FinishListing(const Tree& tree, const std::vector<Directory>& roots) {
    Transaction transaction(*database_);
    Statement& remove = Prepared("DELETE FROM trees WHERE id = ?1");
    remove.Bind(1, tree.id).Run();
    CheckChanged();
    for (Directory root : roots) {
        AddDirectory(root);
    }
    transaction.Commit();
}

std::vector<Backlog::Directory> Backlog::LastDirectories(std::size_t limit) {
    Statement& get = Prepared("SELECT id, path, again FROM directories ORDER BY id DESC LIMIT ?1");
    const sqlite::ResetAtEnd reset(get);
    get.Bind(1, static_cast<std::int64_t>(limit));
    std::vector<Directory> last;
    while (get.Step()) {
        last.push_back({get.Int(0), std::string(get.Bytes(1)), ClassesOf(get.Int(2))});
    }
    return last;
}

void Backlog::AddFound(const std::vector<File>& files, std::vector<Directory*> found) {
    Transaction transaction(*database_);
    for (const File& file : files) {
        AddFile(file);
    }
    for (Directory* directory : found) {
        AddDirectory(*directory);
    }
    transaction.Commit();
}

void Backlog::RemoveDirectories(const std::vector<std::int64_t>& ids) {
    Transaction transaction(*database_);
    Statement& remove = Prepared("DELETE FROM directories WHERE id = ?1");
    for (const std::int64_t id : ids) {
        remove.Bind(1, id).Run();
        CheckChanged();
    }
    transaction.Commit();
}

std::vector<Backlog::File> Backlog::UnnamedFiles(std::size_t limit) {
    Statement& get =
        Prepared("SELECT path, size FROM files WHERE named = 0 ORDER BY rowid LIMIT ?1");
    const sqlite::ResetAtEnd reset(get);
    get.Bind(1, static_cast<std::int64_t>(limit));
    std::vector<File> files;
    while (get.Step()) {
        files.push_back({std::string(get.Bytes(0)), get.Int(1)});
    }
    return files;
}

void Backlog::NoteNamed(const std::vector<std::string>& named, const std::vector<std::string>& done,
                        const std::vector<Directory>& trees) {
    Transaction transaction(*database_);
    Statement& set = Prepared("UPDATE files SET named = 1 WHERE path = ?1");
    for (const std::string& path : named) {
        set.BindBlob(1, path).Run();
        CheckChanged();
    }
    for (const std::string& path : done) {
        RemoveFile(path);
        CheckChanged();
    }
    for (const Directory& tree : trees) {
        AddTree(tree);
    }
    transaction.Commit();
}

std::vector<Backlog::File> Backlog::DueFiles(std::int64_t now, std::size_t limit) {
    Statement& get = Prepared(
        "SELECT path, size FROM files WHERE due >= 0 AND due <= ?1 ORDER "
        "BY due, rowid LIMIT ?2");
    const sqlite::ResetAtEnd reset(get);
    get.Bind(1, now).Bind(2, static_cast<std::int64_t>(limit));
    std::vector<File> files;
    while (get.Step()) {
        files.push_back({std::string(get.Bytes(0)), get.Int(1)});
    }
    return files;
}

void Backlog::NoteFiles(const std::vector<std::string>& done, const std::vector<Problem>& failures,
                        const std::vector<Directory>& trees, std::int64_t now) {
    Transaction transaction(*database_);
    for (const std::string& path : done) {
        RemoveFile(path);
        CheckChanged();
    }
    for (const Problem& problem : failures) {
        AddFailure(problem, now);
    }
    for (const Directory& tree : trees) {
        AddTree(tree);
    }
    transaction.Commit();
}

std::optional<std::int64_t> Backlog::NextDue() {
    if (Number("SELECT EXISTS(SELECT 1 FROM trees) OR EXISTS(SELECT 1 FROM directories)") != 0) {
        return 0;
    }
    Statement& get = Prepared("SELECT due FROM files WHERE due >= 0 ORDER BY due LIMIT 1");
    const sqlite::ResetAtEnd reset(get);
    return get.Step() ? std::optional(get.Int(0)) : std::nullopt;
}

Backlog::Totals Backlog::GetTotals() {
    Statement& get = Prepared(
        "SELECT count(*), total(size), (SELECT count(*) FROM trees) + (SELECT count(*) "
        "FROM directories) + (SELECT count(*) FROM files WHERE named = 0), (SELECT count(*) FROM "
        "files WHERE reason IS NOT NULL) FROM "
        "files WHERE reason IS NULL");
    const sqlite::ResetAtEnd reset(get);
    get.Step();
    const auto number = [&](int column) {
        return static_cast<std::uint64_t>(std::max<std::int64_t>(get.Int(column), 0));
    };
    return {number(2), number(0), number(1), number(3)};
}

std::vector<Backlog::Failure> Backlog::Failures(std::size_t limit) {
    Statement& get = Prepared(
        "SELECT path, reason, since, due FROM files WHERE reason IS NOT "
        "NULL ORDER BY path LIMIT ?1");
    const sqlite::ResetAtEnd reset(get);
    get.Bind(1, static_cast<std::int64_t>(limit));
    std::vector<Failure> failures;
    while (get.Step()) {
        failures.push_back(
            {std::string(get.Bytes(0)), std::string(get.Bytes(1)), get.Int(2), get.Int(3)});
    }
    return failures;
}

std::vector<Backlog::Failure> Backlog::ReadFailures(const base::PrivateDirectory& directory,
                                                    std::size_t limit) {
    Backlog backlog;
    backlog.database_.emplace(
        directory.Fd(), kFileName,
        sqlite::Options{.read_only = true, .busy_timeout = std::chrono::seconds(1)});
    return backlog.Failures(limit);
}

void Backlog::RetryFailures() {
    database_->Execute("UPDATE files SET due = 0 WHERE reason IS NOT NULL");
}

}  // namespace fileindexd
