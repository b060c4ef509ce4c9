#include "programs/kestotifyd/watched_folders.h"

#include <utility>

#include "common/json.h"
#include "common/log.h"

namespace kestotifyd {

WatchedFolders::WatchedFolders(std::string path) : path_(std::move(path)) {
    // Without the file every folder counts as new, and gets no reindex when it returns; that is
    // made up for by the one that every start brings.
    Json::Value stored;
    if (!quivra::fromFile(stored, path_) || !stored.isObject()) {
        return;
    }
    for (const std::string& queue : stored.getMemberNames()) {
        const Json::Value& folders = stored[queue];
        for (const std::string& folder :
             folders.isObject() ? folders.getMemberNames() : Json::Value::Members()) {
            const Json::Value& mount_point = folders[folder];
            queues_[queue][folder] = mount_point.isString() ? mount_point.asString() : "";
        }
    }
}

bool WatchedFolders::Has(const std::string& queue, const std::string& folder) const {
    const auto folders = queues_.find(queue);
    return folders != queues_.end() && folders->second.contains(folder);
}

/// The same for all queues of a folder, and not yet known for one that was added since.
std::string WatchedFolders::MountPoint(const std::string& folder) const {
    for (const auto& [queue, folders] : queues_) {
        const auto it = folders.find(folder);
        if (it != folders.end() && !it->second.empty()) {
            return it->second;
        }
    }
    return std::string();
}

void WatchedFolders::Add(const std::string& queue, const std::string& folder) {
    is_changed_ |= queues_[queue].emplace(folder, "").second;
}

void WatchedFolders::SetMountPoint(const std::string& folder, const std::string& mount_point) {
    for (auto& [queue, folders] : queues_) {
        const auto it = folders.find(folder);
        if (it != folders.end() && it->second != mount_point) {
            it->second = mount_point;
            is_changed_ = true;
        }
    }
}

void WatchedFolders::Save() {
    if (!is_changed_) {
        return;
    }
    Json::Value stored(Json::objectValue);
    for (const auto& [queue, folders] : queues_) {
        for (const auto& [folder, mount_point] : folders) {
            stored[queue][folder] = mount_point;
        }
    }
    // Written at once, not when the daemon stops: a killed one must not take an absent volume for
    // an empty one at its next start.
    if (quivra::toFile(stored, path_)) {
        is_changed_ = false;
    } else {
        quivra::LogError({"watched_folders", __LINE__}, "Cannot write %s", path_.c_str());
    }
}

}  // namespace kestotifyd
