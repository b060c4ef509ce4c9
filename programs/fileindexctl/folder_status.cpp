#include "programs/fileindexctl/folder_status.h"

#include "common/error.h"
#include "programs/fileindexctl/error_text.h"

namespace quivra::ctl {

Json::Value FolderStatus(const fileindex::Folder& folder) {
    Json::Value status(Json::objectValue);
    try {
        folder.GetStatus(status);
    } catch (const Error& error) {
        status["text"] = "error";
        status["desc"] = DescribeCause(error);
    }
    return status;
}

std::string StatusText(const Json::Value& status) {
    const std::string description = status["desc"].asString();
    return status["text"].asString() + (description.empty() ? "" : ": " + description);
}

}  // namespace quivra::ctl
