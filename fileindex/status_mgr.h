#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

#include "common/export.h"

namespace quivra::fileindex {

inline constexpr const char* kFileIndexStatusCfgPath = "/var/packages/Quivra/etc/fileindex.status";
inline constexpr const char* kFileIndexStatusLockPath = "/tmp/quivra_cfg_fi_status.lock";

/// Flags of a share, ORed together. The values are on disk: do not renumber.
enum ShareStatus : unsigned int {
    kShareNeedReindex = 1,  ///< the share's index misses changes and must be rebuilt
};

/// What GetPauseInfo answers, beside a time in seconds since the epoch.
inline constexpr std::int64_t kNotPaused = -1;
inline constexpr std::int64_t kPausedWithoutEnd = 0;

/// The global pause and the flags of each share, kept in one file:
/// {"resume_time": SECONDS, "share": {NAME: FLAGS}}. An object holds the file as it was when the
/// object was made, and every change writes it back at once, so build one for each use and do not
/// keep it: a kept one may overwrite what others wrote. Not for use from several threads.
///
/// Members of unexpected types count as absent, and a change replaces them (a file that holds no
/// object at all included). The changing calls hold the status lock file throughout and throw
/// Error 506 when it cannot be had, 503 when root's identity cannot be taken, 505 when the file
/// cannot be written (it is then unchanged, this object is not) and 502 when its mode cannot be
/// set.
class QUIVRA_EXPORT StatusMgr {
  public:
    /// Reads the file. A missing one stands for: not paused, no flags. Throws Error 504 when it is
    /// no JSON.
    StatusMgr();

    /// Writes the file as user root, mode 0644. Does not take the lock. Its directory must exist.
    void Save() const;

    /// Pauses all indexing for that many hours, or without end when 0, and tells the indexing
    /// daemon. Throws Error 120 for a negative number, with nothing changed, and Error 502 when the
    /// daemon cannot be told; the pause is recorded by then. The end is computed in 32 bits and
    /// wraps to a negative time for very long pauses.
    void Pause(int hours);

    /// Ends the pause and tells the indexing daemon. Throws as Pause does.
    void Resume();

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
    Json::Value& MutableShares();
    void SetResumeTime(std::int64_t resume_time);

    Json::Value data_;
};

}  // namespace quivra::fileindex
