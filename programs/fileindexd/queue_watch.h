#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "base/private_directory.h"
#include "base/unique_fd.h"
#include "programs/fileindexd/schedule.h"

namespace fileindexd {

/// Tells when a share's queue or the status file changes, and what the queue's new lines are about.
class QueueWatch {
  public:
    struct News {
        bool queue = false;   ///< lines were added
        bool status = false;  ///< the status file was replaced
        bool gone = false;    ///< the directory, or what we keep there, was removed
    };

    /// `directory`, in which the queue of that name lies, must outlive the object. Throws Error 502
    /// when it cannot be watched.
    QueueWatch(const quivra::base::PrivateDirectory& directory, std::string queue);

    /// Readable when there is news.
    int Fd() const { return inotify_.Get(); }
    /// What has happened since the last call.
    News Read();

    /// Reports the lines that were added since the last call to the schedule: those that are only
    /// about files that change all the time may wait.
    void ReadNewLines(Schedule& schedule, const ChangeRates& rates, Clock::time_point now);
    /// The queue file is about to be taken away; the next one counts from its beginning.
    void Forget() { inode_ = 0; }

  private:
    void HandleEvent(News& news, int watch, unsigned int mask, const char* name) const;

    const quivra::base::PrivateDirectory& directory_;
    const std::string queue_;
    quivra::base::UniqueFd inotify_;
    int queue_watch_ = -1;
    int status_watch_ = -1;
    ino_t inode_ = 0;   ///< of the queue file that was read last
    off_t offset_ = 0;  ///< how far
};

}  // namespace fileindexd
