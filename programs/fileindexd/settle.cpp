#include "programs/fileindexd/settle.h"

#include <optional>
#include <vector>

#include "fileindex/util.h"

namespace fileindexd {

bool IsCurrent(const Attributes& indexed, const Attributes& there) {
    // The size of a directory is the file system's own affair.
    return indexed.inode != 0 && indexed.inode == there.inode && indexed.is_dir == there.is_dir &&
           (there.is_dir || indexed.size == there.size) && indexed.modified == there.modified &&
           indexed.changed == there.changed;
}

Settler::Found Settler::Look(const std::string& path, Attributes& there) {
    std::optional<Attributes> found;
    if (!batch_.Look(found, path)) {
        return Found::kUnknown;
    }
    if (found && found->is_dir && !scope_.RootsWithin(path).empty()) {
        return Found::kDirectory;
    }
    if (!found || !scope_.Covers(path, found->is_dir)) {
        batch_.Drop(path);
        return Found::kNothing;
    }
    there = *found;
    return Found::kFile;
}

Settler::Found Settler::Settle(const std::string& path, const ContentClasses& again) {
    Attributes there;
    const Found found = Look(path, there);
    if (found == Found::kFile) {
        const std::vector<Document> documents = index_.Find({path});
        batch_.DropBelow(path);
        const bool is_current = !documents.empty() &&
                                IsCurrent(documents.front().attributes, there) &&
                                !again.Has(quivra::fileindex::GetFileTypeByFullPath(path));
        if (!is_current) {
            batch_.Upsert(path, false);
        }
    }
    return found;
}

Settler::Found Settler::SettleMoved(const std::string& path) {
    Attributes there;
    const Found found = Look(path, there);
    if (found != Found::kFile) {
        return found;
    }
    const std::vector<Document> documents = index_.Find({path});
    batch_.DropBelow(path);
    // A rename changes the file's own times of change, and nothing else of it.
    Attributes moved = documents.empty() ? Attributes() : documents.front().attributes;
    moved.changed = there.changed;
    if (IsCurrent(moved, there)) {
        batch_.Refresh(path, false);
    } else {
        batch_.Upsert(path, false);
    }
    return found;
}

}  // namespace fileindexd
