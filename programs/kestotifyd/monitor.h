#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include <json/json.h>

#include "base/unique_fd.h"
#include "programs/daemon/service_manager.h"
#include "programs/daemon/signals.h"
#include "programs/kestotifyd/backend.h"
#include "programs/kestotifyd/mount_table.h"
#include "programs/kestotifyd/options.h"
#include "programs/kestotifyd/queue_set.h"
#include "programs/kestotifyd/state_server.h"
#include "programs/kestotifyd/watched_folders.h"

namespace kestotifyd {

/// The file monitor: follows the registrations, keeps each registered folder watched by the best
/// back end that its file system offers, hands what happens to the queues, and tells how it is. One
/// thread, one epoll loop.
class Monitor : private BackendSink {
  public:
    /// Takes the lock that only one monitor holds. Throws Error 506 when another one runs, 502 when
    /// a directory or descriptor that it needs cannot be had.
    explicit Monitor(const Options& options);
    ~Monitor() override;

    /// Runs until SIGTERM or SIGINT; then takes and writes what is there, and returns.
    void Run();

  private:
    /// What is missing, or could not be read, is noticed this late at most when it is there.
    static constexpr std::chrono::seconds kCheckInterval{3};

    /// A directory tree to be watched: a registered folder that lies in no other one, or a file
    /// system mounted below one.
    struct Root {
        Backend* backend = nullptr;  ///< null while the folder is not there
        bool is_complete = false;
        std::uint64_t device = 0;
        std::uint64_t inode = 0;
        std::string mount_point{};
        std::string problem{};              ///< why it is not watched, in one sentence
        std::set<std::string> uncovered{};  ///< directories that no mount hides any more; a reindex
                                            ///< of each is due when the root is complete
    };

    using Roots = std::map<std::string, Root>;

    void OnChange(const Change& change) override;
    void OnRootComplete(const std::string& root) override;
    void OnGaps(const std::string& root) override;
    void OnRootLost(const std::string& root) override;
    void OnOverflow(const std::string& root) override;
    bool ShouldWatch(const std::string& directory) const override;

    void WatchDescriptor(int fd, std::uint32_t events);
    void LoadRegistrations(bool is_start);
    void HandleMountChange();
    void UpdateRoots();
    void CheckRoots();
    std::string WhyAbsent(const std::string& path) const;
    void StartRoot(const std::string& path, Root& root);
    Backend* AddToBackend(const std::string& path);
    void DropObsoleteRoots();
    Roots::iterator InnermostRoot(const std::string& path);
    bool HoldsRoot(const std::string& path) const;
    Json::Value State() const;
    Json::Value StateOf(const QueueSet::State& queue) const;
    void WorkBackends(bool is_last);
    int WaitMilliseconds(Time now) const;
    void Stop();

    const Options options_;
    quivra::base::UniqueFd instance_lock_;
    quivra::base::UniqueFd epoll_;
    quivra::daemon::Signals signals_;
    quivra::daemon::ServiceManager service_manager_;
    quivra::base::UniqueFd registration_events_;
    MountTable mounts_;
    WatchedFolders watched_;
    QueueSet queues_;
    std::unique_ptr<StateServer> state_server_;  ///< null when its socket could not be made
    std::unique_ptr<Backend> inotify_;
    std::unique_ptr<Backend> fanotify_;
    Roots roots_;
    std::set<std::string> wanted_roots_;  ///< roots_ holds others until they are replaced
    std::string registration_problem_;
    bool are_registrations_due_ = false;  ///< some could not be read
    bool are_mounts_due_ = false;         ///< the table could not be read
    std::optional<Time> last_event_;
    Time next_check_{};
    bool are_roots_stale_ = false;  ///< CheckRoots has something to do before next_check_
};

}  // namespace kestotifyd
