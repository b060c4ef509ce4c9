#include "programs/kestoelasticd/index.h"

#include <sys/statvfs.h>

#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine_error.h"
#include "programs/kestoelasticd/index_directory.h"

namespace elasticd {
namespace {

using quivra::Error;

constexpr int kMaxAttempts = 8;
constexpr std::size_t kMaxIdleReaders = 4;
constexpr std::chrono::milliseconds kSpaceCheckInterval{500};

}  // namespace

Index::Index(std::string directory, std::shared_ptr<const Mapping> mapping, bool paused,
             std::uint64_t min_free)
    : mapping_(std::move(mapping)),
      min_free_(min_free),
      want_paused_(paused),
      directory_(std::move(directory)),
      paused_(paused) {
    MakeWriter();
}

void Index::MakeWriter() {
    writer_ = std::make_unique<IndexWriter>(DatabasePath(directory_), mapping_);
}

std::shared_lock<std::shared_mutex> Index::Use() {
    std::shared_lock lock(use_, std::defer_lock);
    if (!moving_) {
        lock.lock();
    }
    if (moving_) {
        throw Error(kBusy, "The index is being moved");
    }
    return lock;
}

void Index::CheckSpace() {
    const auto now = std::chrono::steady_clock::now();
    if (now - space_checked_ < kSpaceCheckInterval) {
        return;
    }
    struct statvfs status {};
    if (statvfs(directory_.c_str(), &status) == 0 &&
        std::uint64_t{status.f_bavail} * status.f_frsize < min_free_) {
        throw Error(kNoSpace, "Too little space is left for " + directory_);
    }
    space_checked_ = now;
}

void Index::Write(const std::function<void(IndexWriter&)>& change) {
    Reduce([&](IndexWriter& writer) {
        CheckSpace();
        change(writer);
    });
}

void Index::Reduce(const std::function<void(IndexWriter&)>& change) {
    const auto use = Use();
    if (paused_) {
        throw Error(kPaused, "The index is paused");
    }
    const std::lock_guard lock(write_mutex_);
    change(*writer_);
}

std::unique_ptr<Index::Reader> Index::TakeReader() {
    std::unique_ptr<Reader> reader;
    {
        const std::lock_guard lock(readers_mutex_);
        if (!idle_readers_.empty()) {
            reader = std::move(idle_readers_.back());
            idle_readers_.pop_back();
        }
    }
    if (!reader) {
        reader = std::make_unique<Reader>();
        reader->database = Xapian::Database(DatabasePath(directory_));
    }
    reader->database.reopen();
    const std::string names = reader->database.get_metadata(kFieldTableKey);
    if (names != reader->field_names) {
        reader->fields.Load(names);
        reader->field_names = names;
    }
    return reader;
}

SearchResult Index::Query(const Json::Value& query) {
    const auto use = Use();
    return TranslateEngineErrors([&] {
        for (int attempt = 1;; ++attempt) {
            try {
                std::unique_ptr<Reader> reader = TakeReader();
                SearchResult result = Search(query, *mapping_, reader->fields, reader->database);
                const std::lock_guard lock(readers_mutex_);
                if (!paused_ && idle_readers_.size() < kMaxIdleReaders) {
                    idle_readers_.push_back(std::move(reader));
                }
                return result;
            } catch (const Xapian::DatabaseModifiedError&) {
                // Commits have overtaken the query: its blocks may be in use for something else.
                if (attempt == kMaxAttempts) {
                    throw;
                }
            }
        }
    });
}

void Index::ApplyPaused() {
    const std::unique_lock lock(use_);
    paused_ = want_paused_;
    if (paused_) {
        CloseFiles();
    }
}

void Index::CommitAndClose() {
    const std::unique_lock lock(use_);
    try {
        if (writer_->HasChanges()) {
            writer_->Commit();
        }
    } catch (const Error& error) {
        quivra::LogError({"index", __LINE__}, "batch lost in a move: %s", error.what());
        writer_->SetBatchLost();
    }
    CloseFiles();
}

void Index::Close() {
    const std::unique_lock lock(use_);
    CloseFiles();
}

void Index::CloseFiles() {
    writer_->Close();
    idle_readers_.clear();
}

void Index::EndMove(std::string directory) {
    const std::unique_lock lock(use_);
    const bool lost = writer_->IsBatchLost();
    directory_ = std::move(directory);
    MakeWriter();
    if (lost) {
        writer_->SetBatchLost();
    }
    moving_ = false;
}

}  // namespace elasticd
