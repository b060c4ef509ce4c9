#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "programs/fileindexd/index.h"
#include "programs/fileindexd/scope.h"
#include "programs/fileindexd/share_tree.h"

namespace fileindexd {

/// What a pass did.
struct Counts {
    std::uint64_t indexed = 0;    ///< documents added or replaced, with what they hold
    std::uint64_t refreshed = 0;  ///< documents whose attributes were set
    std::uint64_t renamed = 0;    ///< renames carried out on the index
    std::uint64_t removed = 0;    ///< paths whose documents were dropped
    std::uint64_t skipped = 0;    ///< objects that could not be read or were refused (logged)

    Counts& operator+=(const Counts& other);
};

/// How far a pass has come: objects handled and known so far, and the present one.
struct PassState {
    std::uint64_t done = 0;
    std::uint64_t total = 0;
    std::string current;
};

/// Thrown by a PassState listener to end the pass between two operations; it is repeated later.
class Stopped : public std::runtime_error {
  public:
    Stopped() : std::runtime_error("stopped") {}
};

using PassListener = std::function<void(const PassState&)>;

/// The changes of one pass on their way into the index: counts them, deals with documents that
/// are refused, reports progress, and commits from time to time so that an interruption costs
/// little. Everything is announced to the listener before it is done.
class Batch {
  public:
    Batch(Index& index, const ShareTree& tree, const Scope& scope, PassListener listener);

    /// Tells the listener what comes next, also where the index is only compared.
    void Announce(const std::string& path);

    /// A file that is gone meanwhile is dropped. One that is refused is tried without its content,
    /// then skipped; both are failures. With `name_only` the content is not read.
    void Upsert(const std::string& path, bool is_dir, bool name_only = false);
    /// Sets the attributes of a document, which is added when there is none.
    void Refresh(const std::string& path, bool is_dir);
    /// Removes the documents at and below the path; only one of both.
    void Drop(const std::string& path);
    void DropOne(const std::string& path);
    void DropBelow(const std::string& path);
    bool Rename(const std::string& to, const std::string& from);

    /// What stands at the path; an object that cannot be examined is logged and skipped: false.
    bool Look(std::optional<Attributes>& there, const std::string& path);
    /// Counts, logs and notes as a failure an object that is left as it is.
    void Skip(const std::string& path, const std::string& reason);
    /// Notes that an object lacks what was to be read of it.
    void Fail(const std::string& path, const std::string& reason, bool can_pass);
    /// Counts what somebody else has done to the index.
    void NoteIndexed();

    /// Commits what there is to commit. Throws Error 502 instead when the share's volume is no
    /// longer the one that the pass began with.
    void Commit();
    /// Whether so much has gathered, or for so long, that a commit is due.
    bool IsCommitDue() const;

    /// More objects are known to come; one has been dealt with.
    void Expect(std::uint64_t objects) { state_.total += objects; }
    void Finish() { ++state_.done; }

    const Counts& GetCounts() const { return counts_; }
    /// What could not be read so far, to be tried again.
    std::vector<Problem> TakeProblems() { return std::exchange(problems_, {}); }
    /// The files that were sent with their content.
    const std::vector<std::string>& Extracted() const { return extracted_; }

  private:
    void UpsertAs(const std::string& path, bool need_meta);
    bool UpsertWithoutContent(const std::string& path);
    void Changed();

    Index& index_;
    const ShareTree& tree_;
    const Scope& scope_;
    PassListener listener_;
    PassState state_;
    Counts counts_;
    std::vector<Problem> problems_;
    std::vector<std::string> extracted_;
    std::uint64_t uncommitted_ = 0;
    std::chrono::steady_clock::time_point first_uncommitted_{};
};

}  // namespace fileindexd
