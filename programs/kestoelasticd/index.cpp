#include "programs/kestoelasticd/index.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "base/path.h"
#include "common/error.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/sqlite_index.h"
#include "programs/kestoelasticd/index_directory.h"
#include "programs/kestoelasticd/json_values.h"

namespace elasticd {
namespace {

using quivra::Error;

constexpr std::chrono::milliseconds kSpaceCheckInterval{500};
constexpr std::chrono::seconds kIdle{5};
constexpr std::size_t kMaxDocumentText = 64 << 20;
/// More moves in one batch than anybody makes; what comes behind them is listed as committed.
constexpr std::size_t kMaxMovedAway = 10000;

std::size_t SizeOf(const engine::Value& value) {
    std::size_t size = 0;
    engine::ForEachText(value, [&](std::string_view text) { size += text.size(); });
    return size;
}

std::vector<engine::Field> ToFields(const Json::Value& data) {
    std::vector<engine::Field> fields;
    std::size_t size = 0;
    for (auto it = data.begin(); it != data.end(); ++it) {
        fields.push_back({it.name(), ToValue(*it)});
        size += SizeOf(fields.back().value);
        if (size > kMaxDocumentText) {
            throw Error(kBadDocument, "The document is too large");
        }
    }
    return fields;
}

}  // namespace

Index::Index(Place place, std::shared_ptr<const engine::Schema> schema, bool paused, bool fresh,
             std::uint64_t min_free)
    : schema_(std::move(schema)),
      min_free_(min_free),
      want_paused_(paused),
      fresh_(fresh),
      place_(std::move(place)),
      paused_(paused) {}

void Index::AwaitMove() {
    std::unique_lock lock(move_mutex_);
    if (!moved_.wait_for(lock, kMovePatience, [&] { return !moving_; })) {
        throw Error(kBusy, "The index is being moved");
    }
}

std::shared_lock<std::shared_mutex> Index::Use() {
    while (true) {
        AwaitMove();
        std::shared_lock lock(use_);
        if (!moving_) {  // the next move may have begun before the lock was taken
            return lock;
        }
    }
}

std::unique_ptr<engine::Index> Index::Open(quivra::base::PrivateDirectory& directory) const {
    Look look = LookAt(place_.path, place_.uuid);
    switch (look.found) {
        case Found::kIndex:
            break;
        case Found::kOldFormat:
            throw engine::Damaged(place_.path + " has the format of an earlier release");
        case Found::kNothing:
        case Found::kRemains:
            throw engine::Damaged(look.problem);
        case Found::kForeign:
        case Found::kNoRoot:
        case Found::kRefused:
            throw Error(kIndexUnavailable, look.problem);
    }
    directory = std::move(look.directory);
    return engine::sqlite::Open(directory, schema_);
}

/// The engine of an index in use, opened where that is not done yet.
engine::Index& Index::Engine() {
    const std::lock_guard lock(open_mutex_);
    if (!engine_) {
        engine_ = Open(directory_);
    }
    return *engine_;
}

/// Runs what only reads. Of a paused index, no file stays open.
void Index::Read(const std::function<void(engine::Index&)>& read) {
    const auto use = Use();
    if (!paused_) {
        read(Engine());
        return;
    }
    quivra::base::PrivateDirectory directory;
    const std::unique_ptr<engine::Index> engine = Open(directory);
    read(*engine);
}

/// The directory may have been renamed, with another, or nothing, in its place: what is written
/// then would never be seen again.
void Index::CheckPlace() {
    if (directory_.IsStillThere()) {
        return;
    }
    const bool passing = errno == EMFILE || errno == ENFILE || errno == ENOMEM;
    if (!directory_.Problem().empty()) {
        throw Error(kIndexUnavailable, directory_.Problem());
    }
    if (passing) {
        throw Error(kIndexUnavailable, place_.path + ": " + quivra::SystemErrorText(errno));
    }
    throw engine::Damaged(place_.path + " is not the index's directory any more");
}

void Index::CheckSpace() {
    const auto now = Clock::now();
    if (now - space_checked_ < kSpaceCheckInterval) {
        return;
    }
    struct statvfs status {};
    if (fstatvfs(directory_.Fd(), &status) == 0 &&
        std::uint64_t{status.f_bavail} * status.f_frsize < min_free_) {
        throw Error(kNoSpace, "Too little space is left for " + place_.path);
    }
    space_checked_ = now;
}

/// Runs what changes the batch. Refusals leave it alone; any other failure has dropped it.
void Index::Change(Kind kind, const std::function<void(engine::Index&)>& change) {
    const auto use = Use();
    if (paused_) {
        throw Error(kPaused, "The index is paused");
    }
    if (fresh_) {
        throw Error(kIndexMadeAnew, "The index was made anew; reindex, then send index_accept");
    }
    const std::lock_guard lock(write_mutex_);
    engine::Index& engine = Engine();
    const bool had_changes = engine.HasChanges();
    try {
        if (!had_changes) {
            CheckPlace();
        }
        if (kind == Kind::kAdds) {
            CheckSpace();
        }
        change(engine);
        last_change_ = Clock::now();
        unkempt_ = true;
    } catch (const Error& error) {
        if (!IsRefusal(error.code) && !engine.HasChanges()) {
            // A failed commit tells of the loss itself.
            batch_lost_ = kind != Kind::kCommits && (batch_lost_ || had_changes);
            moved_away_.clear();
        }
        throw;
    }
}

void Index::Upsert(const std::string& id, const Json::Value& data) {
    for (const std::string& field : schema_->RequiredFields()) {
        if (!data.isMember(field) || data[field].isNull()) {
            throw Error(kBadDocument, "A required field is missing: " + field);
        }
    }
    const std::string& id_field = schema_->IdField();
    if (const Json::Value& own = data[id_field]; !own.isNull() && own != id) {
        throw Error(kBadDocument, "The document names another id: " + id_field);
    }
    const engine::Document document{id, ToFields(data)};
    Change(Kind::kAdds, [&](engine::Index& engine) { engine.Upsert(document); });
}

void Index::Set(const std::string& id, const Json::Value& changes) {
    const Json::Value& id_change = changes[schema_->IdField()];
    if (changes.isMember(schema_->IdField()) &&
        (!id_change.isString() || id_change.asString().empty())) {
        throw Error(kBadDocument, "A document cannot lose its id");
    }
    for (const std::string& field : schema_->RequiredFields()) {
        if (changes.isMember(field) && changes[field].isNull()) {
            throw Error(kBadDocument, "A required field cannot be removed: " + field);
        }
    }
    const std::string new_id = id_change.isString() ? id_change.asString() : id;
    const std::vector<engine::Field> fields = ToFields(changes);
    Change(Kind::kAdds, [&](engine::Index& engine) {
        engine.Set(id, new_id, fields);
        if (new_id != id && moved_away_.size() < kMaxMovedAway) {
            moved_away_.push_back(id);
        }
    });
}

void Index::Delete(const std::string& id) {
    Change(Kind::kRemoves, [&](engine::Index& engine) { engine.Delete(id); });
}

void Index::DeleteByQuery(const Json::Value& qsl) {
    const ParsedQuery parsed = ParseQuery(qsl, *schema_);
    Change(Kind::kRemoves, [&](engine::Index& engine) { engine.DeleteMatching(parsed.query); });
}

void Index::Commit() {
    Change(Kind::kCommits, [&](engine::Index& engine) {
        if (batch_lost_) {
            engine.Rollback();
            throw Error(kBatchLost, "Changes since the last commit were lost; repeat them");
        }
        CheckPlace();
        engine.Commit();
        moved_away_.clear();
    });
}

/// A list of what lies below a directory that the batch has moved away. The client that renames
/// asks for it next, to move every document by itself: it is to find that nothing is left to do.
bool Index::SeesBatch(const engine::Query& query) {
    if (query.form != engine::Query::Form::kPrefix || query.field != schema_->IdField() ||
        !query.text.ends_with('/')) {
        return false;
    }
    const std::string directory = query.text.substr(0, query.text.size() - 1);
    return std::any_of(moved_away_.begin(), moved_away_.end(), [&](const std::string& moved) {
        return quivra::base::IsAtOrBelow(directory, moved);
    });
}

SearchResult Index::Query(const Json::Value& query) {
    Search search(query, *schema_);
    SearchResult result;
    Read([&](engine::Index& engine) {
        if (search.request.query.form == engine::Query::Form::kPrefix) {
            const std::lock_guard lock(write_mutex_);
            search.request.with_batch = SeesBatch(search.request.query);
            if (search.request.with_batch) {
                result = RunSearch(search, *schema_, engine);
            }
        }
        if (!search.request.with_batch) {
            result = RunSearch(search, *schema_, engine);
        }
    });
    return result;
}

engine::State Index::GetState() {
    engine::State state;
    Read([&](engine::Index& engine) { state = engine.GetState(); });
    return state;
}

void Index::Maintain() {
    const auto use = Use();
    for (bool more = true; more && !paused_;) {
        const std::lock_guard lock(write_mutex_);
        if (!engine_ || !unkempt_ || Clock::now() - last_change_ < kIdle || engine_->HasChanges()) {
            return;
        }
        more = unkempt_ = engine_->Compact();
    }
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
        if (engine_ && engine_->HasChanges()) {
            engine_->Commit();
        }
    } catch (const Error& error) {
        quivra::LogError({"index", __LINE__}, "batch lost in a move: %s", error.what());
        batch_lost_ = true;
    }
    CloseFiles();
}

void Index::Close() {
    const std::unique_lock lock(use_);
    CloseFiles();
    batch_lost_ = false;
}

void Index::CloseFiles() {
    engine_.reset();
    directory_ = {};
    moved_away_.clear();
}

void Index::EndMove(std::string path) {
    {
        const std::unique_lock lock(use_);
        place_.path = std::move(path);
        ++generation_;
    }
    const std::lock_guard lock(move_mutex_);
    moving_ = false;
    moved_.notify_all();
}

}  // namespace elasticd
