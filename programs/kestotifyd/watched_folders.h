#pragma once

#include <map>
#include <string>

namespace kestotifyd {

/// Remembers, across runs, which folders have ever been watched for which queue, and which mount
/// held them. From this the monitor knows a folder that returns (its changes were missed meanwhile)
/// from a new one, and a folder that is empty because its volume is not mounted. One JSON file:
/// {QUEUE PATH: {FOLDER PATH: MOUNT POINT}}.
class WatchedFolders {
  public:
    /// Reads the file; one that is missing or damaged counts as empty.
    explicit WatchedFolders(std::string path);

    bool Has(const std::string& queue, const std::string& folder) const;

    /// The mount point that held the folder when it was last watched; empty when not known.
    std::string MountPoint(const std::string& folder) const;

    void Add(const std::string& queue, const std::string& folder);
    void SetMountPoint(const std::string& folder, const std::string& mount_point);

    /// Writes the file when something has changed. A failure is logged; the next call tries again.
    void Save();

  private:
    std::string path_;
    std::map<std::string, std::map<std::string, std::string>> queues_;
    bool is_changed_ = false;
};

}  // namespace kestotifyd
