#pragma once

#include <json/json.h>

#include <map>
#include <optional>
#include <string>

namespace elasticd {

/// What is remembered of an index across restarts.
struct IndexEntry {
    std::string path;
    std::string uuid;  ///< in the marker of its directory, too
    Json::Value mappings;
    bool paused = false;
    /// It was found damaged or missing and made anew: empty, until its client has taken note.
    bool fresh = false;

    // Work that an interruption must not leave half done.
    bool deleting = false;
    struct Move {
        std::string id;
        std::string path;
    };
    std::optional<Move> move;  ///< where it is being moved to
    std::string leftover;      ///< the old directory of a finished move, still to be removed
};

/// The indexes by id, kept in one JSON file that is replaced atomically. Not safe for concurrent
/// use.
class Registry {
  public:
    /// Loads the file; a missing one is an empty registry. Throws Error 504 for one that cannot be
    /// read or understood.
    explicit Registry(std::string path);

    /// Throws Error 505; then the file is as it was before.
    void Save() const;

    std::map<std::string, IndexEntry> entries;

  private:
    const std::string path_;
};

}  // namespace elasticd
