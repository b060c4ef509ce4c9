#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "programs/kestotifyd/change.h"
#include "programs/kestotifyd/registration.h"

namespace kestotifyd {

/// Turns changes into the lines of one queue: filters them by folder, ignored name and mask, splits
/// a rename that leaves or enters, and holds modifications back until the file is closed. Pure: no
/// I/O, and the time is handed in. Feed changes in the order in which they happened.
class QueueTranslator {
  public:
    using NameTest = std::function<bool(const std::string&)>;

    /// A file that stays open is reported when this time has passed since its first unreported
    /// modification, so that a log file is found and a copy in progress does not flood the queue.
    static constexpr std::chrono::seconds kOpenFileInterval{5};

    /// `is_hidden` tells the names that no queue ever sees.
    QueueTranslator(Registration registration, NameTest is_hidden);

    const Registration& GetRegistration() const { return registration_; }

    /// Whether changes of the path are of interest: inside a folder, with no ignored or hidden
    /// component below it. Muting does not count.
    bool Covers(const std::string& path) const { return Matches(path, true); }

    void Apply(const Change& change, Time now);

    /// A muted folder's changes are dropped: whoever mutes it owes a kReindex of it, applied after
    /// the unmuting.
    void Mute(const std::string& folder) { muted_.insert(folder); }
    void Unmute(const std::string& folder) { muted_.erase(folder); }

    /// When the next held modification is due; none when none is held.
    std::optional<Time> NextDue() const;

    /// Turns the modifications that are due into lines; with Time::max() all of them.
    void Flush(Time now);

    /// The lines taken so far have been written; to a new, empty file if `is_new_file`.
    void OnWritten(bool is_new_file);

    std::size_t LineCount() const { return lines_.size(); }

    /// The lines made since the last call, each with its "\n", in order.
    std::vector<std::string> TakeLines() { return std::exchange(lines_, {}); }

  private:
    bool Matches(const std::string& path, bool muted_too) const;
    bool Wants(const std::string& path) const { return Matches(path, false); }
    bool IsIgnoredBelow(const std::string& path, const std::string& folder) const;
    void Hold(const std::string& path, Time due);
    void ReleaseBelow(const std::string& path, bool emit);
    void ApplyRename(const Change& change);
    void EmitCreate(bool is_dir, const std::string& path);
    void EmitDelete(bool is_dir, const std::string& path);
    void Emit(std::uint32_t event, bool is_dir, const std::string& path,
              const std::string& path_old = std::string());

    Registration registration_;
    NameTest is_hidden_;
    std::set<std::string> muted_;
    std::map<std::string, Time> held_;  ///< by path: when its modification is due
    std::vector<std::string> lines_;

    std::set<std::string> deleted_;      ///< files, by lines in the present queue file
    std::set<std::string> deleted_now_;  ///< files, by lines that are not written yet
    bool are_deletes_unknown_ = false;   ///< there were too many to remember
};

}  // namespace kestotifyd
