// What is waiting: trees, directories and files.

#include <algorithm>
#include <chrono>

#include "base/path.h"
#include "programs/fileindexd/backlog.h"

namespace fileindexd {

namespace base = quivra::base;
using sqlite::Statement;
using sqlite::Transaction;

namespace {

/// A lease, a short memory, a program that writes: gone within seconds, mostly. A disk may be
/// replaced next week. In seconds.
constexpr std::int64_t kFirstWait = 5;
constexpr std::int64_t kLastWait = 24 * 60 * 60;

// Bits on disk.
std::int64_t BitsOf(const ContentClasses& classes) {
    return (classes.document ? 1 : 0) | (classes.audio ? 2 : 0) | (classes.video ? 4 : 0) |
           (classes.photo ? 8 : 0);
}

ContentClasses ClassesOf(std::int64_t bits) {
    return {(bits & 1) != 0, (bits & 2) != 0, (bits & 4) != 0, (bits & 8) != 0};
}

}  // namespace

ContentClasses Backlog::AgainAt(const std::string& path) {
    ContentClasses again;
    for (const char* table : {"trees", "directories"}) {
        Statement& get = Prepared("SELECT again FROM " + std::string(table) + " WHERE path = ?1");
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
    // The file has changed since it failed, if it did: it begins again.
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
