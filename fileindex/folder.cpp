#include "fileindex/folder.h"

#include "common/json.h"
#include "fileindex/folder_status.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace quivra::fileindex {
Folder::Folder(const std::string& path, const std::string& name, bool document, bool audio,
               bool video, bool photo, bool paused)
    : path_(path),
      name_(name),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      paused_(paused) {}

Folder::Folder(const Json::Value& data) {
    GetJsonValue<std::string>(path_, data, "path", true);
    GetJsonValue<std::string>(name_, data, "name", true);
    GetJsonValue<bool>(document_, data, "document", true);
    GetJsonValue<bool>(audio_, data, "audio", true);
    GetJsonValue<bool>(video_, data, "video", true);
    GetJsonValue<bool>(photo_, data, "photo", true);
    GetJsonValue<bool>(paused_, data, "paused", false);
    GetJsonValue<std::string>(volume_to_be_clean_, data, "volume_to_be_clean", false);
}

const std::string& Folder::GetShare() const {
    if (share_.empty()) {
        GetShareNameByPath(share_, path_);
    }
    return share_;
}

void Folder::SetShare(const std::string& share) {
    // The full path stays what it was: who moves a share still needs to know where it came from.
    path_ = ReplacePathShare(path_, share, GetShare());
    share_ = share;
}

const std::string& Folder::GetFullPath() const {
    if (full_path_.empty()) {
        fileindex::GetFullPath(full_path_, path_);
    }
    return full_path_;
}

// On disk, so every member is written, those that hold their defaults included.
Json::Value Folder::GetData() const {
    Json::Value data;
    data["path"] = path_;
    data["name"] = name_;
    data["document"] = document_;
    data["audio"] = audio_;
    data["video"] = video_;
    data["photo"] = photo_;
    data["paused"] = paused_;
    data["volume_to_be_clean"] = volume_to_be_clean_;
    return data;
}

Json::Value Folder::GetIndexCfg() const {
    Json::Value cfg;
    cfg["document"] = document_;
    cfg["audio"] = audio_;
    cfg["video"] = video_;
    cfg["photo"] = photo_;
    return cfg;
}

bool Folder::IsIndexing() const {
    const sdk::SDKShare share(GetShare());
    return QueueMgr(share.GetQueuePath()).IsFullPathProcessing(GetFullPath());
}

void Folder::GetStatus(Json::Value& out) const {
    FolderStatus({this}).Write(out, *this);
}

Json::Value Folder::GetDataWithAdditional(const Json::Value& additionals) const {
    return FolderStatus({this}).DataWithAdditional(*this, additionals);
}

}  // namespace quivra::fileindex
