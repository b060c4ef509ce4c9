#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

#include "common/export.h"

namespace quivra::fileindex {

/// The status file, and the LockFile that changes of it hold.
inline constexpr const char* kFileIndexStatusCfgPath = "/var/packages/Quivra/etc/fileindex.status";
inline constexpr const char* kFileIndexStatusLockPath = "/tmp/quivra_cfg_fi_status.lock";

/// Flags of a share, ORed together. The values are on disk: do not renumber.
enum ShareStatus : unsigned int {
    kShareNeedReindex = 1,  ///< the share's index misses changes and must be rebuilt
};

/// What GetPauseInfo returns, beside a time in seconds since the epoch.
inline constexpr std::int64_t kNotPaused = -1;
inline constexpr std::int64_t kPausedWithoutEnd = 0;

/// The global pause and the flags of each share, kept in one file:
/// {"resume_time": SECONDS, "share": {NAME: FLAGS}}. The questions look at the file as it was when
/// the object was made or changed something, so build one for each use. Every change reads the file
/// again under the lock and writes it back at once, so no concurrent change is lost. Not for use
/// from several threads.
///
/// Members of unexpected types count as absent, and a change replaces them (a file that holds no
/// object at all included). The changing calls hold the status lock file throughout and throw
/// Error 506 when it cannot be had, 504 when the file is not JSON by then, 503 when root's identity
/// cannot be taken, 505 when the file cannot be written (it is then unchanged, this object is not)
/// and 502 when its mode cannot be set.
///
/// MIND: a change takes root's identity and the process KEEPS it, see sdk/credentials.h. A program
/// that serves users makes changes from a process of its own.
class QUIVRA_EXPORT StatusMgr {
  public:
    /// Reads the file. A missing one stands for: not paused, no flags. Throws Error 504 when it is
    /// not JSON.
    StatusMgr();

    /// Writes what this object holds as user root, mode 0644. Neither takes the lock nor reads the
    /// file again: for a caller that holds the lock. The file's directory must exist.
    void Save() const;

    /// Pauses all indexing for that many hours, or without end when 0, and tells the indexing
    /// daemon. Throws Error 120 for a negative number, with nothing changed, and Error 502 when the
    /// daemon cannot be told; the pause is recorded by then. The end is computed in 32 bits and
    /// wraps to a negative time for very long pauses.
    void Pause(int hours);

    /// Ends the pause and tells the indexing daemon. Throws as Pause does.
    void Resume();

    /// Set and end one flag of a share; its other flags stay.
    void SetShareStatus(const std::string& share, ShareStatus flag);
    /// A share without flags left stays in the file, with 0.
    void UnsetShareStatus(const std::string& share, ShareStatus flag);
    /// Forgets the share.
    void ClearShareStatus(const std::string& share);

    /// When the pause ends: kNotPaused, kPausedWithoutEnd, or seconds since the epoch.
    std::int64_t GetPauseInfo() const;

    /// The share's flags, 0 when it has none.
    unsigned int GetShareStatus(const std::string& share) const;

  private:
    void Load();
    Json::Value& MutableShares();
    void SetResumeTime(std::int64_t resume_time);

    Json::Value data_;
};

}  // namespace quivra::fileindex
