#include "programs/fileindexd/batch.h"

#include <system_error>

#include "common/log.h"

namespace fileindexd {

namespace {

constexpr const char* kUnit = "batch";

/// A commit costs a sync of the index, a batch that is lost its extraction again.
constexpr std::uint64_t kCommitChanges = 5000;
constexpr std::chrono::seconds kCommitAfter{10};

}  // namespace

Counts& Counts::operator+=(const Counts& other) {
    indexed += other.indexed;
    refreshed += other.refreshed;
    renamed += other.renamed;
    removed += other.removed;
    skipped += other.skipped;
    return *this;
}

Batch::Batch(Index& index, const ShareTree& tree, const Scope& scope, PassListener listener)
    : index_(index), tree_(tree), scope_(scope), listener_(std::move(listener)) {}

void Batch::Announce(const std::string& path) {
    state_.current = path;
    if (listener_) {
        listener_(state_);
    }
}

void Batch::Changed() {
    if (uncommitted_++ == 0) {
        first_uncommitted_ = std::chrono::steady_clock::now();
    }
}

void Batch::Upsert(const std::string& path, bool is_dir, bool name_only) {
    Announce(path);
    const bool need_meta = !is_dir && !name_only && scope_.NeedsMeta(path);
    try {
        UpsertAs(path, need_meta);
        if (need_meta) {
            extracted_.push_back(path);
        }
    } catch (const DocumentError& error) {
        std::optional<Attributes> there;
        if (!Look(there, path)) {
            return;
        }
        if (!there) {
            Drop(path);
        } else if (need_meta && UpsertWithoutContent(path)) {
            Fail(path, error.what(), error.can_pass);
        } else {
            Skip(path, error.what());
        }
    }
}

void Batch::UpsertAs(const std::string& path, bool need_meta) {
    index_.Upsert(path, need_meta);
    NoteIndexed();
}

/// Better found by its name than not at all.
bool Batch::UpsertWithoutContent(const std::string& path) {
    try {
        UpsertAs(path, false);
        return true;
    } catch (const DocumentError&) {
        return false;
    }
}

void Batch::NoteIndexed() {
    Changed();
    ++counts_.indexed;
}

void Batch::Fail(const std::string& path, const std::string& reason, bool can_pass) {
    problems_.push_back({path, reason, can_pass});
}

void Batch::Refresh(const std::string& path, bool is_dir) {
    Announce(path);
    try {
        if (index_.SetAttributes(path)) {
            Changed();
            ++counts_.refreshed;
            return;
        }
    } catch (const DocumentError&) {
        // The upsert finds out what is the matter.
    }
    Upsert(path, is_dir);
}

/// A directory's own document goes last: as long as it is there, what is left below it is found.
void Batch::Drop(const std::string& path) {
    Announce(path);
    index_.DeleteBelow(path);
    DropOne(path);
}

void Batch::DropOne(const std::string& path) {
    Announce(path);
    index_.Delete(path);
    Changed();
    ++counts_.removed;
}

void Batch::DropBelow(const std::string& path) {
    Announce(path);
    index_.DeleteBelow(path);
    Changed();
}

bool Batch::Rename(const std::string& to, const std::string& from) {
    Announce(to);
    Changed();
    try {
        if (index_.Rename(to, from)) {
            ++counts_.renamed;
            return true;
        }
    } catch (const DocumentError& error) {
        quivra::LogError({kUnit, __LINE__}, "%s is indexed anew instead of renamed: %s", to.c_str(),
                         error.what());
    }
    return false;
}

bool Batch::Look(std::optional<Attributes>& there, const std::string& path) {
    try {
        there = tree_.Look(path);
        return true;
    } catch (const std::system_error& error) {
        Skip(path, error.what());
        return false;
    }
}

void Batch::Skip(const std::string& path, const std::string& reason) {
    ++counts_.skipped;
    Fail(path, reason, true);
    quivra::LogError({kUnit, __LINE__}, "Skipped %s: %s", path.c_str(), reason.c_str());
}

void Batch::Commit() {
    if (uncommitted_ == 0) {
        return;
    }
    // A volume that went away in the middle has shown every file as gone.
    tree_.CheckMounted();
    index_.Commit();
    uncommitted_ = 0;
}

bool Batch::IsCommitDue() const {
    return uncommitted_ >= kCommitChanges ||
           (uncommitted_ > 0 &&
            std::chrono::steady_clock::now() - first_uncommitted_ >= kCommitAfter);
}

}  // namespace fileindexd
