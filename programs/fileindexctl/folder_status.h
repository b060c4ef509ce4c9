#pragma once

#include <json/json.h>

#include <string>

#include "fileindex/folder.h"

namespace quivra::ctl {

/// What Folder::GetStatus says: {"text": ..., "desc": ...}. A failure to tell is itself an answer,
/// "error" with the reason as "desc", so that one bad folder does not hide the others.
Json::Value FolderStatus(const fileindex::Folder& folder);

/// The status for people: "finished", "error: invalid_path".
std::string StatusText(const Json::Value& status);

}  // namespace quivra::ctl
