#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"
#include "fileindex/elastic/request.h"
#include "sdk/share.h"

namespace quivra::fileindex::elastic {
namespace {

void SendIndexCommand(const char* name, const std::string& share) {
    Json::Value request;
    request["command"] = name;
    request["data"]["id"] = GetFileIndexID(share);
    SendRequestNoResult(request);
}

/// Changes the settings that `changes` holds and keeps the others.
void SetIndexConfig(const std::string& share, const Json::Value& changes) {
    Json::Value request;
    request["command"] = command::kIndexConfigSet;
    request["data"]["id"] = GetFileIndexID(share);
    request["data"]["data"] = changes;
    SendRequestNoResult(request);
}

}  // namespace

std::string GetFileIndexID(const std::string& share) {
    return "fileindex_" + share;
}

void ShareIndexCreate(const std::string& share) {
    const sdk::SDKShare sdk_share(share);
    Json::Value request;
    request["command"] = command::kIndexCreate;
    Json::Value& data = request["data"];
    data["id"] = GetFileIndexID(share);
    data["path"] = sdk_share.GetDBPath();
    data["settings"] = Json::Value(Json::objectValue);
    data["mappings"] = GetFileIndexMappings();
    SendRequestNoResult(request);
}

void ShareIndexDelete(const std::string& share) {
    SendIndexCommand(command::kIndexDelete, share);
}

void ShareIndexPause(const std::string& share) {
    SendIndexCommand(command::kIndexPause, share);
}

void ShareIndexResume(const std::string& share) {
    SendIndexCommand(command::kIndexResume, share);
}

void ShareIndexRename(const std::string& share_from, const std::string& share_to,
                      const std::string& db_path) {
    Json::Value changes;
    changes["id"] = GetFileIndexID(share_to);
    changes["path"] = db_path;
    SetIndexConfig(share_from, changes);
}

void ShareIndexMigrate(const std::string& share, const std::string& db_path) {
    Json::Value changes;
    changes["path"] = db_path;
    SetIndexConfig(share, changes);
}

}  // namespace quivra::fileindex::elastic
