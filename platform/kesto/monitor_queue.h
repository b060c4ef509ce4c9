#pragma once

#include <json/json.h>

#include <string>

/// Where registrations are kept, for the monitor that carries them out: one file each, "*.json",
/// replaced atomically, holding {"app": NAME, "type": MonitorQueueType, "queue": PATH,
/// "config": {...}}. Other names in it are files being written.
#define KESTO_MONITOR_DIRECTORY "/var/lib/kesto/monitor"

/// What kind of consumer a monitor registration belongs to.
enum MonitorQueueType {
    MONITOR_QUEUE_TYPE_APPLICATION = 1,
};

namespace KESTO {
namespace KESTOTIFYD {

/// A registration with the file monitor: which folders' changes go to which queue file. The
/// description is {"queue": PATH, "config": {"path": [FULL PATH...], "mask": 65478,
/// "ignore": ["@eaDir"]}}.
class MonitorQueue {
  public:
    /// Takes any value; Upsert says whether it is a description.
    explicit MonitorQueue(const Json::Value& description);
    /// The description as it was given.
    const Json::Value& Description() const;

    /// Adds the registration or replaces the one of the same queue and application. It is on
    /// disk then. False on failure, with errno telling why: EINVAL for a description without
    /// "queue" or "config".
    static bool Upsert(const MonitorQueue& queue, const std::string& app, MonitorQueueType type);

    /// Removes a registration; one that does not exist is removed successfully. False on failure,
    /// with errno telling why.
    static bool Delete(const std::string& queue_path, const std::string& app,
                       MonitorQueueType type);

  private:
    Json::Value description_;
};

}  // namespace KESTOTIFYD
}  // namespace KESTO
