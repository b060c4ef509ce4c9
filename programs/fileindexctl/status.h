#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

#include "programs/fileindexctl/daemons.h"

namespace quivra::ctl {

/// How a share stands: what the disk shows, and what each daemon says of it. What nobody tells is
/// unknown (-1) or empty.
struct ShareLine {
    std::string name;
    std::string path;
    std::uint64_t queue_lines = 0;    ///< changes that wait in the queue
    std::uint64_t working_lines = 0;  ///< of the pass at work, or interrupted
    std::int64_t documents = -1;      ///< in the index
    bool made_anew = false;           ///< its index was lost, and fills again

    bool has_worker = false;
    std::string state;  ///< of the worker: "processing"
    std::uint64_t done = 0;
    std::uint64_t total = 0;
    std::string current;
    std::int64_t last_pass = 0;
    std::string last_error;
    std::uint64_t waiting = 0;  ///< files of the backlog
    std::uint64_t waiting_bytes = 0;
    std::string phase;         ///< what they wait for: "names", "contents"
    std::int64_t eta = -1;     ///< seconds
    std::uint64_t failed = 0;  ///< files whose content could not be read

    std::int64_t watched = -1;  ///< directories
    std::int64_t unwatched = -1;

    std::vector<std::string> problems;  ///< sentences without their full stop, the worst first
};

struct FolderLine {
    std::string path;
    std::string name;
    bool paused = false;
    /// {"text": ..., "desc": ...} as of Folder::GetStatus, but never "finished" while a change
    /// could go unnoticed or be lost: then "incomplete", with the reason as "desc".
    Json::Value status;
};

/// Everything that the status command tells, at one moment.
struct Status {
    DaemonState indexer;
    DaemonState search;
    DaemonState monitor;
    std::int64_t resume_time = -1;  ///< see StatusMgr::GetPauseInfo
    std::vector<FolderLine> folders;
    std::vector<ShareLine> shares;
    std::vector<std::string> problems;  ///< of the whole system: sentences with their full stop
    /// See ProblemsOfShares: to be shown; they stop no other share.
    std::vector<std::string> share_problems;

    /// Nothing is left to do in any folder, though some may have a problem that stays.
    bool IsFinished() const;
    /// All daemons take requests.
    bool AreDaemonsUp() const { return indexer.IsUp() && search.IsUp() && monitor.IsUp(); }
    /// The "status" of the folder with this share path.
    Json::Value OfFolder(const std::string& path) const;
    /// Something is not as it should be. Where no folder is chosen, nothing needs to run.
    bool HasProblem() const;
};

/// Asks the daemons alone.
Status TakeDaemons();

/// Takes the status: each daemon is asked, see AskDaemon. Daemons that are down are part of it, not
/// a failure. Throws Error 504 or 120 when a configuration file is damaged.
Status TakeStatus();

/// How the share stands, by what the daemons of `status` say. The monitor does not watch a share
/// that is paused.
ShareLine TakeShareLine(const std::string& share, bool is_paused, const Status& status);

Json::Value ToJson(const Status& status);

/// A folder's status for people: "finished", "error: invalid_path".
std::string StatusText(const Json::Value& status);

}  // namespace quivra::ctl
