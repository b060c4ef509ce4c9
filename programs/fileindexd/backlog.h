#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "base/private_directory.h"
#include "programs/fileindexd/index.h"
#include "programs/fileindexd/scope.h"
#include "programs/fileindexd/working_copy.h"
#include "programs/sqlite/statement.h"

namespace fileindexd {

/// The work of one share that takes long, in a small database beside its queue: trees to be
/// compared with the disk, directories to be read, files whose content is to be extracted now or
/// tried again later. Also how far the pass at work is.
///
/// Each entry says no more than "look at this path": what is done about it is decided by what
/// stands there at that time. So an entry too many costs a look, and an entry may be carried out
/// twice. Every call is one transaction, durable when it returns; sqlite::Error leaves the store as
/// it was before the call. Single-threaded.
class Backlog {
  public:
    /// A tree: first its documents are listed and those whose object is gone are dropped, then its
    /// directories are read.
    struct Tree {
        std::int64_t id = 0;
        std::string path;
        ContentClasses again;  ///< files to be extracted although they look unchanged
        std::string listed;    ///< documents up to this path have been looked at
    };
    struct Directory {
        std::int64_t id = 0;  ///< 0: not in the store yet
        std::string path;
        ContentClasses again;
    };
    struct File {
        std::string path;
        std::int64_t size = 0;
    };
    /// A file, or a directory, that could not be read. Times are seconds since the epoch.
    struct Failure {
        std::string path;
        std::string reason;
        std::int64_t since = 0;
        std::int64_t next_try = 0;  ///< soon and ever later; kNever where it cannot help
    };
    static constexpr std::int64_t kNever = -1;

    struct Totals {
        std::uint64_t places = 0;  ///< trees, directories and files to be added by name
        std::uint64_t files = 0;   ///< to be extracted for the first time
        std::uint64_t bytes = 0;   ///< their sizes
        std::uint64_t failed = 0;
    };

    /// What a pass leaves to be done, and what it has done to paths that are waiting here.
    struct Addition {
        struct Move {
            std::string from;
            std::string to;
            bool keeps_old = false;  ///< who moved cannot be told any more: look at both places
        };
        std::vector<Move> moves;           ///< carried out first, in this order
        std::vector<std::string> dropped;  ///< nothing stands at or below these paths any more
        std::vector<Directory> trees;
        std::vector<File> files;        ///< to be extracted
        std::vector<File> unnamed;      ///< to be added by name first
        std::vector<std::string> done;  ///< files that have been extracted
        std::vector<Problem> failures;
    };

    /// Opens the store in the queue's directory, which outlives this object. One that is missing,
    /// damaged or of another version is made anew. Throws sqlite::Error when it cannot be opened.
    explicit Backlog(const quivra::base::PrivateDirectory& directory);

    static constexpr const char* kFileName = "queue.backlog";

    /// Removes the files of a share's store.
    static void Remove(const quivra::base::PrivateDirectory& directory);

    /// Whether the store is a new one that has not been told of the share's documents: earlier work
    /// may be lost with the store before. Ends with AddReindex, or with BeginEmpty where there are
    /// no documents.
    bool IsNew() const { return is_new_; }
    void BeginEmpty(const std::string& rules);
    /// Everything of the share is to be looked at and extracted; replaces what was waiting.
    void AddReindex(const std::string& root, const std::string& rules);

    /// Whether another process has worked on the store since the last call.
    bool HasChangedElsewhere();

    /// How many steps of the pass over this working copy the committed index holds: repeating a
    /// rename after later steps could move newer documents.
    std::size_t Steps(const WorkingCopy& copy);
    void StoreSteps(const WorkingCopy& copy, std::size_t steps);

    /// Takes over what a pass over the copy leaves, and the rules that it worked by. From then on
    /// the copy is not needed: IsMerged.
    void Merge(const Addition& addition, const WorkingCopy& copy, const std::string& rules,
               std::int64_t now);
    bool IsMerged(const WorkingCopy& copy);

    /// The rules (Scope::Describe) of the last complete pass. The folding lets a reindex take
    /// changed settings along, so one under other rules extracts again what looks unchanged.
    std::string Rules();
    /// The classes that trees and directories at or above the path are still to extract again.
    ContentClasses AgainAt(const std::string& path);

    std::optional<Tree> FirstTree();
    void NoteListed(const Tree& tree, const std::string& up_to);
    /// The tree's documents have been listed: its directories come next.
    void FinishListing(const Tree& tree, const std::vector<Directory>& roots);

    /// The last found ones, so that few are waiting at a time.
    std::vector<Directory> LastDirectories(std::size_t limit);
    /// Adds files to be extracted and directories found (which get their ids).
    void AddFound(const std::vector<File>& files, std::vector<Directory*> found);
    void RemoveDirectories(const std::vector<std::int64_t>& ids);

    /// The first files that are to be added by name.
    std::vector<File> UnnamedFiles(std::size_t limit);
    /// They have been added, and wait for their extraction; or they need none.
    void NoteNamed(const std::vector<std::string>& named, const std::vector<std::string>& done,
                   const std::vector<Directory>& trees);

    /// Files whose time has come by `now`, in seconds since the epoch.
    std::vector<File> DueFiles(std::int64_t now, std::size_t limit);
    /// They have been extracted, or need not be.
    void NoteFiles(const std::vector<std::string>& done, const std::vector<Problem>& failures,
                   const std::vector<Directory>& trees, std::int64_t now);

    /// When the next entry is due: 0 now; none when nothing is waiting.
    std::optional<std::int64_t> NextDue();
    Totals GetTotals();
    /// The files that could not be read, in the order of their paths.
    std::vector<Failure> Failures(std::size_t limit);
    /// The same for a process that does not work on the share. Throws sqlite::Error.
    static std::vector<Failure> ReadFailures(const quivra::base::PrivateDirectory& directory,
                                             std::size_t limit);
    /// Makes all of these due.
    void RetryFailures();

  private:
    Backlog() = default;

    void Open(const quivra::base::PrivateDirectory& directory);
    void Close();
    void CreateTables();
    void CheckChanged();
    void CheckWhole();
    sqlite::Statement& Prepared(const std::string& sql);
    std::string Meta(const char* key);
    void SetMeta(const char* key, const std::string& value);
    std::int64_t Number(const char* sql);
    void Apply(const Addition::Move& move);
    void MovePaths(const char* table, const Addition::Move& move);
    void DropPaths(const std::string& path);
    void AddTree(const Directory& tree);
    void AddDirectory(Directory& directory);
    void AddFile(const File& file, bool is_named = true);
    void AddFailure(const Problem& problem, std::int64_t now);
    void RemoveFile(const std::string& path);

    std::optional<sqlite::Database> database_;
    std::unordered_map<std::string, sqlite::Statement> statements_;
    std::int64_t data_version_ = 0;
    bool is_new_ = false;
};

}  // namespace fileindexd
