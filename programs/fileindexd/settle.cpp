#include "programs/fileindexd/settle.h"

#include <algorithm>
#include <system_error>
#include <unordered_map>

#include "fileindex/util.h"
#include "programs/fileindexd/paths.h"

namespace fileindexd {

namespace {

constexpr std::size_t kListPage = 20000;  // documents read at once
constexpr std::size_t kFindChunk = 500;   // paths asked for at once

}  // namespace

Settler::Settler(Batch& batch, Index& index, const ShareTree& tree, const Scope& scope,
                 std::int64_t fresh_since)
    : batch_(batch), index_(index), tree_(tree), scope_(scope), fresh_since_(fresh_since) {}

void Settler::Settle(const std::string& path, const ContentClasses& again) {
    again_ = again;
    std::optional<Attributes> there;
    if (!batch_.Look(there, path)) {
        return;
    }
    if (there) {
        SettleThere(path, *there);
    } else {
        batch_.Drop(path);
    }
}

void Settler::SettleMoved(const std::string& path) {
    std::optional<Attributes> there;
    if (!batch_.Look(there, path)) {
        return;
    }
    if (!there || there->is_dir || !scope_.Covers(path, false)) {
        Settle(path);
        return;
    }
    const std::vector<Document> found = index_.Find({path});
    const bool same = !found.empty() && IsSameContent(found.front().attributes, *there);
    batch_.DropBelow(path);
    if (same) {
        batch_.Refresh(path, false);
    } else {
        batch_.Upsert(path, false);
    }
}

/// Whether a document that was moved is the file's. An earlier pass may already have seen, at the
/// old place, what came there after the rename: such a document is a young one.
bool Settler::IsSameContent(const Attributes& moved, const Attributes& there) const {
    return !moved.is_dir && moved.size == there.size && moved.modified == there.modified &&
           std::max(moved.modified, moved.changed) < fresh_since_;
}

void Settler::SettleThere(const std::string& path, const Attributes& there) {
    const std::vector<std::string> roots = scope_.RootsWithin(path);
    if (roots.empty()) {
        batch_.Drop(path);
    } else if (there.is_dir) {
        DropStale(path);
        for (const std::string& root : roots) {
            Walk(root);
        }
    } else if (scope_.Covers(path, false)) {
        batch_.DropBelow(path);
        Take(path, there);
        Flush();
    } else {
        batch_.Drop(path);
    }
}

void Settler::DropStale(const std::string& path) {
    dropped_.clear();
    for (const Document& document : index_.Find({path})) {
        DropIfStale(document);
    }
    // Nothing is committed meanwhile, so the pages fit together.
    for (std::size_t offset = 0;; offset += kListPage) {
        const std::vector<Document> page = index_.ListBelow(path, offset, kListPage);
        for (const Document& document : page) {
            DropIfStale(document);
        }
        if (page.size() < kListPage) {
            return;
        }
    }
}

void Settler::DropIfStale(const Document& document) {
    const std::string& path = document.path;
    std::optional<Attributes> there;
    batch_.Announce(path);
    if ((!dropped_.empty() && IsBelow(path, dropped_)) || !batch_.Look(there, path)) {
        return;
    }
    if (there && scope_.Covers(path, there->is_dir)) {
        return;
    }
    if (!there && document.attributes.is_dir) {
        batch_.Drop(path);
        dropped_ = path;
    } else {
        batch_.DropOne(path);
    }
}

void Settler::Walk(const std::string& root) {
    std::optional<Attributes> there;
    if (!batch_.Look(there, root) || !there || !scope_.Covers(root, there->is_dir)) {
        return;
    }
    directories_.clear();
    entries_.clear();
    Take(root, *there);
    while (!directories_.empty()) {
        const std::string directory = std::move(directories_.back());
        directories_.pop_back();
        ReadDirectory(directory);
    }
    Flush();
}

void Settler::ReadDirectory(const std::string& directory) {
    try {
        tree_.ReadDirectory(directory, [&](const std::string& name, const Attributes& attributes) {
            const std::string path = directory + "/" + name;
            if (scope_.Covers(path, attributes.is_dir)) {
                Take(path, attributes);
            }
        });
    } catch (const std::system_error& error) {
        batch_.Skip(directory, error.what());
    }
}

void Settler::Take(const std::string& path, const Attributes& attributes) {
    batch_.Expect(1);
    if (attributes.is_dir) {
        directories_.push_back(path);
    }
    entries_.push_back({path, attributes});
    if (entries_.size() >= kFindChunk) {
        Flush();
    }
}

void Settler::Flush() {
    const std::vector<Entry> entries = std::exchange(entries_, {});
    if (entries.empty()) {
        return;
    }
    std::vector<std::string> paths;
    paths.reserve(entries.size());
    for (const Entry& entry : entries) {
        paths.push_back(entry.path);
    }
    std::unordered_map<std::string, Attributes> indexed;
    for (Document& document : index_.Find(paths)) {
        indexed.emplace(std::move(document.path), document.attributes);
    }
    for (const Entry& entry : entries) {
        batch_.Announce(entry.path);
        const auto found = indexed.find(entry.path);
        if (found == indexed.end() || !IsCurrent(entry, found->second)) {
            batch_.Upsert(entry.path, entry.attributes.is_dir);
            if (batch_.IsCommitDue()) {
                batch_.Commit();
            }
        }
        batch_.Finish();
    }
}

bool Settler::IsCurrent(const Entry& entry, const Attributes& indexed) const {
    const Attributes& there = entry.attributes;
    // The size of a directory is the file system's own affair.
    if (there.is_dir != indexed.is_dir || (!there.is_dir && there.size != indexed.size) ||
        there.modified != indexed.modified || there.changed != indexed.changed) {
        return false;
    }
    if (there.is_dir || indexed_.contains(std::hash<std::string>{}(entry.path))) {
        return true;
    }
    return std::max(indexed.modified, indexed.changed) < fresh_since_ &&
           !(again_.Any() && again_.Has(quivra::fileindex::GetFileTypeByFullPath(entry.path)));
}

}  // namespace fileindexd
