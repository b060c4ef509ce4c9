#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <vector>

#include "programs/fileindexd/backlog.h"
#include "programs/fileindexd/batch.h"

namespace fileindexd {

/// Works on a share's backlog, a slice at a time, so that a fresh change never waits long:
///   1. trees: documents whose object is gone or not to be indexed any more are dropped;
///   2. directories: what is missing in the index is added by name and attributes, so that
///      everything is soon found by name;
///   3. files: their content is extracted, by several threads.
/// What is to be done is durable before the index is changed, and forgotten only after the index
/// was committed. Killed anywhere, a slice is repeated, and the index ends the same.
class CatchUp {
  public:
    using Clock = std::chrono::steady_clock;

    /// `backlog` must outlive the object.
    explicit CatchUp(Backlog& backlog) : backlog_(backlog) {}

    struct Share {
        Index& index;
        const ShareTree& tree;
        const Scope& scope;
    };
    /// What a slice did.
    struct Slice {
        bool has_worked = false;  ///< there was something to do
        Counts counts;
        std::uint64_t files = 0;  ///< whose content was extracted
        std::uint64_t bytes = 0;  ///< their sizes
    };

    /// Works until then, or until nothing is due at `now` (seconds since the epoch); at least one
    /// step is done. Throws what Pass::Run does, and sqlite::Error; the slice is repeated then.
    Slice Run(const Share& share, const PassListener& listener, Clock::time_point until,
              std::int64_t now);

    /// A pass has moved or dropped what stood at or below these paths.
    void Forget(const Backlog::Addition& addition);
    /// The backlog has been replaced.
    void ForgetAll() { reader_.reset(); }

  private:
    struct Entry {
        std::string path;
        Attributes attributes;
        ContentClasses again;
    };
    class Work;

    Backlog& backlog_;
    /// A directory may be too large for a slice: it stays open between two of them.
    std::optional<DirectoryReader> reader_;
    Backlog::Directory reading_;
};

}  // namespace fileindexd
