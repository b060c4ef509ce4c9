#pragma once

#include <memory>
#include <string>
#include <vector>

#include "fileindex/file_types.h"

namespace fileindexd {

/// Which classes of content an UPDATE_CFG names, or a walk extracts again.
struct ContentClasses {
    bool document = false;
    bool audio = false;
    bool video = false;
    bool photo = false;

    bool Has(quivra::fileindex::FileType type) const;
    bool Any() const { return document || audio || video || photo; }
    bool Includes(const ContentClasses& other) const;
    void Add(const ContentClasses& other);
    bool operator==(const ContentClasses&) const = default;
};

/// What of a share is to be indexed, and how. Paths are full paths of things that exist; that they
/// can be indexed at all is ShareTree's question. May throw quivra::Error.
class Scope {
  public:
    virtual ~Scope() = default;

    /// Whether the object is to be indexed.
    virtual bool Covers(const std::string& path, bool is_dir) const = 0;

    /// Whether a file's content and metadata are to be indexed.
    virtual bool NeedsMeta(const std::string& path) const = 0;

    /// The topmost places at or below the path that are to be indexed.
    virtual std::vector<std::string> RootsWithin(const std::string& path) const = 0;

    /// Whether the same rules hold at both places and everywhere below them.
    virtual bool HaveSameRules(const std::string& one, const std::string& other) const = 0;

    /// The rules for a share with that root as a text: as long as it is the same, so are they.
    virtual std::string Describe(const std::string& root) const = 0;
};

/// The scope by the configured folders as they are now; a share with all its content where no
/// folder set was ever saved.
std::unique_ptr<Scope> LoadScope();

/// The whole share, with the content of every class.
std::unique_ptr<Scope> WholeShare();

}  // namespace fileindexd
