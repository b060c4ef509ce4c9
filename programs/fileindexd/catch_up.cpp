#include "programs/fileindexd/catch_up.h"

#include <algorithm>
#include <system_error>
#include <unordered_map>
#include <utility>

#include "base/path.h"
#include "common/log.h"
#include "fileindex/util.h"
#include "programs/fileindexd/file_work.h"
#include "programs/fileindexd/settle.h"

namespace fileindexd {

using quivra::base::IsAtOrBelow;
using quivra::base::IsBelow;

namespace {

constexpr const char* kUnit = "catch_up";

constexpr std::size_t kListPage = 2000;   // documents looked at between two commits
constexpr std::size_t kFindChunk = 200;   // entries compared and committed together
constexpr std::size_t kDirectories = 64;  // taken from the store at once

}  // namespace

/// One slice.
class CatchUp::Work {
  public:
    Work(CatchUp& owner, const Share& share, const PassListener& listener, Clock::time_point until,
         std::int64_t now)
        : owner_(owner),
          backlog_(owner.backlog_),
          share_(share),
          batch_(share.index, share.tree, share.scope, listener),
          until_(until),
          now_(now),
          files_({backlog_, batch_, share.index, share.tree, share.scope, until, now}) {}

    Slice Run() {
        do {
            if (const auto tree = backlog_.FirstTree()) {
                ListTree(*tree);
            } else if (!WalkDirectories() && !files_.Name() && !files_.Extract()) {
                break;
            }
            slice_.has_worked = true;
        } while (Clock::now() < until_);
        NoteProblems();
        slice_.counts = batch_.GetCounts();
        slice_.files = files_.Files();
        slice_.bytes = files_.Bytes();
        return slice_;
    }

  private:
    void ListTree(const Backlog::Tree& tree);
    bool LookAtTree(const Backlog::Tree& tree, std::vector<Backlog::Directory>& roots);
    void DropIfStale(const Document& document);
    void TakeRoots(const std::vector<Backlog::Directory>& roots);

    bool WalkDirectories();
    bool OpenNext();
    void ReadEntries();
    void Take(const std::string& path, const Attributes& attributes, const ContentClasses& again);
    void Flush();
    void Sort(const Entry& entry, const std::unordered_map<std::string, Attributes>& indexed);

    void NoteProblems();

    CatchUp& owner_;
    Backlog& backlog_;
    const Share& share_;
    Batch batch_;
    const Clock::time_point until_;
    const std::int64_t now_;
    FileWork files_;
    Slice slice_;

    // Of a tree's listing.
    std::string dropped_;  ///< the last directory that was dropped with all below it

    // Of the walk.
    std::vector<Backlog::Directory> stack_;
    std::vector<Entry> entries_;
    std::vector<std::int64_t> finished_;  ///< to be removed once their entries are committed
    std::vector<Backlog::File> contents_;
    std::vector<std::pair<std::string, bool>> names_;  ///< and whether it is a directory
};

/// One page of the tree's documents, or its end.
void CatchUp::Work::ListTree(const Backlog::Tree& tree) {
    std::vector<Backlog::Directory> roots;
    if (tree.listed.empty() && !LookAtTree(tree, roots)) {
        batch_.Commit();
        TakeRoots(roots);
        return backlog_.FinishListing(tree, {});
    }
    const std::vector<Document> page = share_.index.ListBelow(tree.path, tree.listed, kListPage);
    for (const Document& document : page) {
        DropIfStale(document);
    }
    // Committed before the place is noted: a page that is looked at twice costs a little, one that
    // is not looked at leaves documents for ever.
    batch_.Commit();
    NoteProblems();
    if (page.size() == kListPage) {
        return backlog_.NoteListed(tree, page.back().path);
    }
    for (const std::string& root : share_.scope.RootsWithin(tree.path)) {
        roots.push_back({0, root, tree.again});
    }
    TakeRoots(roots);
    backlog_.FinishListing(tree, roots);
}

/// What stands at the top of a tree. False when there is nothing to be listed; `roots` then holds
/// what is a single file.
bool CatchUp::Work::LookAtTree(const Backlog::Tree& tree, std::vector<Backlog::Directory>& roots) {
    std::optional<Attributes> there;
    if (!IsAtOrBelow(tree.path, share_.tree.Root())) {
        quivra::LogError({kUnit, __LINE__}, "%s does not lie in the share: not looked at",
                         tree.path.c_str());
        return false;
    }
    if (!batch_.Look(there, tree.path)) {
        NoteProblems();
        return false;
    }
    if (!there || share_.scope.RootsWithin(tree.path).empty()) {
        batch_.Drop(tree.path);
        return false;
    }
    if (!there->is_dir) {
        batch_.DropBelow(tree.path);
        roots.push_back({0, tree.path, tree.again});
        return false;
    }
    for (const Document& document : share_.index.Find({tree.path})) {
        DropIfStale(document);
    }
    return true;
}

void CatchUp::Work::DropIfStale(const Document& document) {
    const std::string& path = document.path;
    std::optional<Attributes> there;
    batch_.Announce(path);
    if ((!dropped_.empty() && IsBelow(path, dropped_)) || !batch_.Look(there, path)) {
        return;
    }
    if (there && share_.scope.Covers(path, there->is_dir)) {
        return;
    }
    if (!there && document.attributes.is_dir) {
        batch_.Drop(path);
        dropped_ = path;
    } else {
        batch_.DropOne(path);
    }
}

/// A root's own document, which no directory above it sees to.
void CatchUp::Work::TakeRoots(const std::vector<Backlog::Directory>& roots) {
    for (const Backlog::Directory& root : roots) {
        std::optional<Attributes> there;
        if (batch_.Look(there, root.path) && there &&
            share_.scope.Covers(root.path, there->is_dir)) {
            entries_.push_back({root.path, *there, root.again});
        }
    }
    Flush();
}

/// False when no directory is waiting.
bool CatchUp::Work::WalkDirectories() {
    stack_ = backlog_.LastDirectories(kDirectories);
    std::reverse(stack_.begin(), stack_.end());  // the last one is taken first
    // The directory that is open is still in the store, until its last entry is committed.
    if (owner_.reader_) {
        std::erase_if(stack_, [&](const auto& other) { return other.id == owner_.reading_.id; });
    }
    bool was_any = false;
    while (OpenNext()) {
        was_any = true;
        ReadEntries();
        if (Clock::now() >= until_) {
            break;
        }
    }
    Flush();
    stack_.clear();
    return was_any;
}

bool CatchUp::Work::OpenNext() {
    while (!owner_.reader_) {
        if (stack_.empty()) {
            return false;
        }
        owner_.reading_ = std::move(stack_.back());
        stack_.pop_back();
        const std::string& path = owner_.reading_.path;
        try {
            if (share_.scope.Covers(path, true)) {
                owner_.reader_ = share_.tree.Read(path);
                return true;
            }
        } catch (const std::system_error& error) {
            batch_.Skip(path, error.what());
        }
        finished_.push_back(owner_.reading_.id);
    }
    return true;
}

/// Reads on in the open directory, to its end or to the end of the slice.
void CatchUp::Work::ReadEntries() {
    try {
        while (const auto entry = owner_.reader_->Next()) {
            if (share_.scope.Covers(entry->path, entry->attributes.is_dir)) {
                Take(entry->path, entry->attributes, owner_.reading_.again);
            }
            if (entries_.empty() && Clock::now() >= until_) {
                return;  // between two chunks: everything read so far is committed
            }
        }
    } catch (const std::system_error& error) {
        batch_.Skip(owner_.reading_.path, error.what());
    }
    owner_.reader_.reset();
    finished_.push_back(owner_.reading_.id);
}

void CatchUp::Work::Take(const std::string& path, const Attributes& attributes,
                         const ContentClasses& again) {
    if (attributes.is_dir) {
        stack_.push_back({0, path, again});
    }
    entries_.push_back({path, attributes, again});
    if (entries_.size() >= kFindChunk) {
        Flush();
    }
}

/// First what remains to be done is stored, then the index is brought on and committed, then what
/// has been done is forgotten.
void CatchUp::Work::Flush() {
    const std::vector<Entry> entries = std::exchange(entries_, {});
    std::vector<std::string> paths;
    paths.reserve(entries.size());
    for (const Entry& entry : entries) {
        paths.push_back(entry.path);
    }
    std::unordered_map<std::string, Attributes> indexed;
    for (Document& document : share_.index.Find(paths)) {
        indexed.emplace(std::move(document.path), document.attributes);
    }
    for (const Entry& entry : entries) {
        Sort(entry, indexed);
    }
    // A directory that was found and read since the last flush never gets into the store: a chain
    // of a thousand directories costs a few transactions, not a thousand.
    std::vector<Backlog::Directory*> found;
    for (Backlog::Directory& directory : stack_) {
        if (directory.id == 0) {
            found.push_back(&directory);
        }
    }
    if (owner_.reader_ && owner_.reading_.id == 0) {
        found.push_back(&owner_.reading_);
    }
    if (!contents_.empty() || !found.empty()) {
        backlog_.AddFound(contents_, found);
    }
    for (const auto& [path, is_dir] : names_) {
        batch_.Upsert(path, is_dir, true);
    }
    contents_.clear();
    names_.clear();
    batch_.Commit();
    NoteProblems();
    std::erase(finished_, 0);  // directories that were found and read within one chunk
    if (!finished_.empty()) {
        backlog_.RemoveDirectories(std::exchange(finished_, {}));
    }
}

/// What an entry needs: its name now, its content later.
void CatchUp::Work::Sort(const Entry& entry,
                         const std::unordered_map<std::string, Attributes>& indexed) {
    const Attributes& there = entry.attributes;
    const auto found = indexed.find(entry.path);
    const bool is_known = found != indexed.end();
    const bool is_current = is_known && IsCurrent(found->second, there);
    if (there.is_dir) {
        if (!is_current) {
            names_.emplace_back(entry.path, true);
        }
        return;
    }
    const bool again =
        entry.again.Any() && entry.again.Has(quivra::fileindex::GetFileTypeByFullPath(entry.path));
    if (is_current && !again) {
        return;
    }
    const bool needs_content = share_.scope.NeedsMeta(entry.path);
    if (needs_content) {
        contents_.push_back({entry.path, there.size});
    }
    // A changed file keeps its older content until the newer one is there.
    if (!is_known || !needs_content) {
        names_.emplace_back(entry.path, false);
    }
}

/// What could not be looked at, or not be read, is tried again like a file.
void CatchUp::Work::NoteProblems() {
    const std::vector<Problem> problems = batch_.TakeProblems();
    if (!problems.empty()) {
        backlog_.NoteFiles({}, problems, {}, now_);
    }
}

CatchUp::Slice CatchUp::Run(const Share& share, const PassListener& listener,
                            Clock::time_point until, std::int64_t now) {
    try {
        return Work(*this, share, listener, until, now).Run();
    } catch (...) {
        reader_.reset();  // what was read of it may not be in the index
        throw;
    }
}

void CatchUp::Forget(const Backlog::Addition& addition) {
    const auto concerns = [&](const std::string& path) { return IsAtOrBelow(reading_.path, path); };
    const bool is_moved =
        std::any_of(addition.moves.begin(), addition.moves.end(),
                    [&](const auto& move) { return concerns(move.from) || concerns(move.to); });
    if (is_moved || std::any_of(addition.dropped.begin(), addition.dropped.end(), concerns)) {
        reader_.reset();
    }
}

}  // namespace fileindexd
