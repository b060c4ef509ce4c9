#pragma once

#include <json/json.h>

#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "fileindex/folder.h"
#include "fileindex/pending.h"
#include "fileindex/status_mgr.h"

namespace quivra::fileindex {

/// Tells the states of several folders. The status file is read once, and each share's queue once,
/// when the first of its folders needs it: reading it for each folder took 16 s for a thousand.
class FolderStatus {
  public:
    /// The folders must live as long as the object. Nothing is read before it is needed.
    explicit FolderStatus(std::vector<const Folder*> folders) : folders_(std::move(folders)) {}

    /// Folder::GetStatus of one of them.
    void Write(Json::Value& out, const Folder& folder);

    /// Folder::GetDataWithAdditional of one of them.
    Json::Value DataWithAdditional(const Folder& folder, const Json::Value& additionals);

  private:
    bool IsIndexing(const Folder& folder);
    const StatusMgr& Status();

    std::vector<const Folder*> folders_;
    std::optional<StatusMgr> status_;
    std::map<std::string, TouchedPaths> touched_;  // by share
};

}  // namespace quivra::fileindex
