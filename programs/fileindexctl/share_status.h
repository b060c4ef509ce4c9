#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace quivra::ctl {

/// What the share's worker last told about itself; its state file is described in
/// docs/fileindexd.md.
struct WorkerStatus {
    bool running = false;  ///< the process is there; else the other members are stale or empty
    std::string state;
    std::uint64_t done = 0;
    std::uint64_t total = 0;
    std::string current;
    std::string last_error;
    std::int64_t last_pass = 0;
};

struct ShareLine {
    std::string name;
    std::string path;
    std::uint64_t queue_lines = 0;    ///< waiting in the queue
    std::uint64_t working_lines = 0;  ///< of the pass at work, or interrupted
    std::int64_t documents = -1;      ///< in the index; -1: it cannot be asked
    WorkerStatus worker;
    std::string error;  ///< why something could not be told; empty: all was
};

struct FolderLine {
    std::string path;
    std::string name;
    bool paused = false;
    Json::Value status;  ///< see FolderStatus
};

/// Everything that the status command tells, at one moment.
struct Status {
    bool elastic_answers = false;
    bool indexer_answers = false;
    std::int64_t resume_time = -1;  ///< see StatusMgr::GetPauseInfo
    std::vector<FolderLine> folders;
    std::vector<ShareLine> shares;

    /// Nothing is left to do in any folder. Folders with an error never finish.
    bool IsFinished() const;
    /// Some folder cannot be indexed at all.
    bool HasError() const;
};

/// Takes the status. Daemons that are down are part of it, not a failure. Throws Error 504 or 120
/// when a configuration file is damaged.
Status TakeStatus();

Json::Value ToJson(const Status& status);

}  // namespace quivra::ctl
