#pragma once

#include <cstdint>
#include <string>
#include <unordered_set>
#include <vector>

#include "programs/fileindexd/batch.h"
#include "programs/fileindexd/scope.h"

namespace fileindexd {

/// Makes the index equal to the disk below a path, whatever both hold: what is gone or not to be
/// indexed is dropped, what is missing or has changed is indexed. It works on committed documents,
/// so commit first what should be taken into account. Memory does not grow with the number of
/// files, only with the directories that are still to be read.
class Settler {
  public:
    /// A file that changed at or after `fresh_since` (seconds since the epoch) is indexed again
    /// even though its document looks right: it may have changed twice within the one second that
    /// times are kept to.
    Settler(Batch& batch, Index& index, const ShareTree& tree, const Scope& scope,
            std::int64_t fresh_since);

    /// Settles a path and everything below it. Files of the given classes are indexed again in any
    /// case, because their settings changed.
    void Settle(const std::string& path, const ContentClasses& again = {});

    /// The same for a path whose documents were just moved there: a file of the same size and
    /// modification time, which has not changed lately, only gets its new attributes.
    void SettleMoved(const std::string& path);

    /// The file has been indexed in this pass: once is enough.
    void NoteIndexed(const std::string& path) { indexed_.insert(std::hash<std::string>{}(path)); }

  private:
    struct Entry {
        std::string path;
        Attributes attributes;
    };

    bool IsSameContent(const Attributes& moved, const Attributes& there) const;
    void SettleThere(const std::string& path, const Attributes& there);
    void DropStale(const std::string& path);
    void DropIfStale(const Document& document);
    void Walk(const std::string& root);
    void ReadDirectory(const std::string& directory);
    void Take(const std::string& path, const Attributes& attributes);
    void Flush();
    bool IsCurrent(const Entry& entry, const Attributes& indexed) const;

    Batch& batch_;
    Index& index_;
    const ShareTree& tree_;
    const Scope& scope_;
    const std::int64_t fresh_since_;
    /// Hashes of paths. A wrong match is harmless: it only spares a file that looks unchanged.
    std::unordered_set<std::size_t> indexed_;

    // Of the settle at work.
    ContentClasses again_;
    std::string dropped_;  ///< the last directory that was dropped with all below it
    std::vector<std::string> directories_;
    std::vector<Entry> entries_;
};

}  // namespace fileindexd
