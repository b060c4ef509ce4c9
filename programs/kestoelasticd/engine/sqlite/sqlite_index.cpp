#include "programs/kestoelasticd/engine/sqlite/sqlite_index.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <mutex>
#include <new>
#include <utility>

#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/fts.h"
#include "programs/kestoelasticd/engine/sqlite/searcher.h"
#include "programs/kestoelasticd/engine/sqlite/writer.h"

namespace elasticd::engine {

Damaged::Damaged(const std::string& why) : quivra::Error(kIndexUnavailable, why) {}

namespace sqlite {
namespace {

using quivra::Error;
using ::sqlite::Database;
using ::sqlite::Statement;

constexpr int kWriterCache = 12 * 1024;
constexpr int kReaderCache = 2 * 1024;
constexpr std::size_t kMaxIdleReaders = 4;
/// Pages of 4 kB that the write-ahead log may hold before a commit moves them into the file. Each
/// move writes a page once, however often it was changed: so not too soon.
constexpr int kLogPages = 8000;
constexpr int kPagesPerStep = 256;

[[noreturn]] void RethrowTranslated() {
    try {
        throw;
    } catch (const Error&) {
        throw;
    } catch (const ::sqlite::Error& error) {
        const std::string text = std::string("Search engine: ") + error.what();
        if (error.IsDamage()) {
            throw Damaged(text);
        }
        throw Error(error.IsFull()                  ? kNoSpace
                    : error.IsInterrupted()         ? kTooSlow
                    : error.code == SQLITE_NOMEM    ? kOutOfMemory
                    : error.code == SQLITE_CANTOPEN ? kIndexUnavailable
                                                    : kEngineFailed,
                    text);
    } catch (const std::bad_alloc&) {
        throw Error(kOutOfMemory, "Out of memory");
    }
}

template <typename Action>
auto Translated(const Action& action) -> decltype(action()) {
    try {
        return action();
    } catch (...) {
        RethrowTranslated();
    }
}

/// One more connection, for searches: it sees the last commit.
struct Reader {
    Reader(const quivra::base::PrivateDirectory& directory, const Schema& schema)
        : database(directory.Fd(), kFileName, {.read_only = true, .cache_kib = kReaderCache}),
          fields(schema) {
        RegisterFts(database);
        tree.emplace(database);
        documents.emplace(database, *tree, fields);
    }

    Database database;
    FieldTable fields;
    std::optional<Tree> tree;
    std::optional<Documents> documents;
};

class SqliteIndex : public Index {
  public:
    SqliteIndex(const quivra::base::PrivateDirectory& directory,
                std::shared_ptr<const Schema> schema)
        : directory_(directory),
          schema_(std::move(schema)),
          database_(directory.Fd(), kFileName,
                    {.cache_kib = kWriterCache, .busy_timeout = std::chrono::seconds(5)}) {
        RegisterFts(database_);
        CheckTables(database_);
        database_.Execute("PRAGMA wal_autocheckpoint=0");
        database_.Execute("PRAGMA journal_size_limit=" + std::to_string(kLogPages * 4096));
        sqlite3_wal_hook(
            database_.Handle(),
            [](void* self, sqlite3*, const char*, int pages) {
                static_cast<SqliteIndex*>(self)->log_pages_ = pages;
                return SQLITE_OK;
            },
            this);
        lengths_.Load(database_);
        writer_.emplace(database_, *schema_, lengths_);
    }

    void Upsert(const Document& document) override {
        Change([&] { writer_->Upsert(document); });
    }
    void Set(const std::string& id, const std::string& new_id,
             const std::vector<Field>& changes) override {
        Change([&] { writer_->Set(id, new_id, changes); });
    }
    void Delete(const std::string& id) override {
        Change([&] { writer_->Delete(id); });
    }

    void DeleteMatching(const Query& query) override {
        Change([&] {
            writer_->FlushWords();
            Documents& documents = writer_->GetDocuments();
            const Deadline none(database_, Deadline::Clock::time_point::max());
            Matcher matcher(database_, documents.GetTree(), none);
            writer_->DeleteAll(
                matcher.Match(MakePlan(query, documents.Fields(), documents.GetTree())));
        });
    }

    void Commit() override {
        TakeWanted();
        Change([&] { writer_->Commit(); });
        if (log_pages_ > kLogPages) {
            Checkpoint(SQLITE_CHECKPOINT_PASSIVE);
        }
    }

    void Rollback() noexcept override { writer_->Rollback(); }
    bool HasChanges() const override { return writer_->HasChanges(); }

    SearchResult Search(const SearchRequest& request,
                        const std::function<void(Hit&&)>& take) override {
        return Translated([&] {
            if (request.with_batch) {
                writer_->FlushWords();
                Searcher searcher(database_, writer_->GetDocuments(), lengths_.GetView(), request,
                                  take);
                return searcher.Run();
            }
            return SearchCommitted(request, take);
        });
    }

    State GetState() override {
        return Translated([&] {
            std::unique_ptr<Reader> reader = TakeReader();
            State state;
            state.documents = static_cast<std::uint64_t>(ReadMeta(reader->database, kDocuments));
            state.reclaimable =
                static_cast<std::uint64_t>(ReadPragma(reader->database, "freelist_count")) * 4096;
            PutBack(std::move(reader));
            for (const char* suffix : {"", "-wal", "-shm"}) {
                struct stat status {};
                const std::string name = std::string(kFileName) + suffix;
                if (fstatat(directory_.Fd(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
                    state.bytes += static_cast<std::uint64_t>(status.st_blocks) * 512;
                }
            }
            return state;
        });
    }

    void Check() override {
        Translated([&] {
            Statement check(database_, "PRAGMA quick_check(1)");
            if (check.Step() && check.Bytes(0) != "ok") {
                throw Damaged("the index's file is damaged: " + std::string(check.Bytes(0)));
            }
            database_.Execute("INSERT INTO words(words) VALUES('integrity-check')");
        });
    }

    bool Compact() override {
        return Translated([&] {
            if (writer_->HasChanges()) {
                return false;
            }
            const std::int64_t before = ReadPragma(database_, "freelist_count");
            if (before > 0) {
                database_.Execute("PRAGMA incremental_vacuum(" + std::to_string(kPagesPerStep) +
                                  ")");
                return ReadPragma(database_, "freelist_count") < before;
            }
            if (log_pages_ > 0) {
                Checkpoint(SQLITE_CHECKPOINT_TRUNCATE);
                sqlite3_db_release_memory(database_.Handle());
                const std::lock_guard lock(mutex_);
                idle_.clear();
            }
            return false;
        });
    }

  private:
    template <typename Action>
    void Change(const Action& action) {
        try {
            Translated(action);
        } catch (const Error& error) {
            // What is refused changes nothing; anything else leaves a batch of unknown content.
            if (!IsRefusal(error.code)) {
                writer_->Rollback();
            }
            throw;
        }
    }

    static std::int64_t ReadPragma(Database& database, const char* name) {
        Statement read(database, std::string("PRAGMA ") + name);
        return read.Step() ? read.Int(0) : 0;
    }

    void Checkpoint(int mode) {
        int pages = 0;
        int done = 0;
        // Where a reader still needs the log, the next one does it.
        if (sqlite3_wal_checkpoint_v2(database_.Handle(), nullptr, mode, &pages, &done) ==
            SQLITE_OK) {
            log_pages_ = mode == SQLITE_CHECKPOINT_TRUNCATE ? 0 : pages - done;
        }
    }

    SearchResult SearchCommitted(const SearchRequest& request,
                                 const std::function<void(Hit&&)>& take) {
        std::unique_ptr<Reader> reader = TakeReader();
        reader->tree->Forget();
        SearchResult result;
        {
            // One snapshot for all statements; nothing to commit.
            reader->database.Execute("BEGIN");
            struct End {
                Database& database;
                ~End() { sqlite3_exec(database.Handle(), "ROLLBACK", nullptr, nullptr, nullptr); }
            } end{reader->database};
            reader->fields.Load(reader->database);
            Searcher searcher(reader->database, *reader->documents, lengths_.GetView(), request,
                              take);
            result = searcher.Run();
            const std::lock_guard lock(mutex_);
            wanted_.insert(searcher.WantedIndexes().begin(), searcher.WantedIndexes().end());
        }
        PutBack(std::move(reader));
        return result;
    }

    std::unique_ptr<Reader> TakeReader() {
        {
            const std::lock_guard lock(mutex_);
            if (!idle_.empty()) {
                std::unique_ptr<Reader> reader = std::move(idle_.back());
                idle_.pop_back();
                return reader;
            }
        }
        return std::make_unique<Reader>(directory_, *schema_);
    }

    void PutBack(std::unique_ptr<Reader> reader) {
        const std::lock_guard lock(mutex_);
        if (idle_.size() < kMaxIdleReaders) {
            idle_.push_back(std::move(reader));
        }
    }

    void TakeWanted() {
        const std::lock_guard lock(mutex_);
        for (const unsigned int field : std::exchange(wanted_, {})) {
            writer_->WantIndex(field);
        }
    }

    const quivra::base::PrivateDirectory& directory_;
    const std::shared_ptr<const Schema> schema_;
    Lengths lengths_;
    Database database_;
    std::optional<Writer> writer_;
    int log_pages_ = 1;  ///< perhaps: the last process may have left some

    std::mutex mutex_;
    std::vector<std::unique_ptr<Reader>> idle_;
    std::set<unsigned int> wanted_;  ///< typed columns that searches would like an index for
};

}  // namespace

void Create(const quivra::base::PrivateDirectory& directory, const Schema& /*schema*/) {
    Translated([&] {
        Database database(directory.Fd(), kFileName);
        RegisterFts(database);
        CreateTables(database);
    });
}

std::unique_ptr<Index> Open(const quivra::base::PrivateDirectory& directory,
                            std::shared_ptr<const Schema> schema) {
    struct stat status {};
    if (fstatat(directory.Fd(), kFileName, &status, AT_SYMLINK_NOFOLLOW) != 0 && errno == ENOENT) {
        throw Damaged("the index's file is missing");  // opening would make an empty one
    }
    return Translated([&]() -> std::unique_ptr<Index> {
        return std::make_unique<SqliteIndex>(directory, std::move(schema));
    });
}

}  // namespace sqlite
}  // namespace elasticd::engine
