#include "programs/kestoelasticd/registry.h"

#include <unistd.h>

#include <cerrno>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"

namespace elasticd {
namespace {

using quivra::Error;
using quivra::GetJsonValue;

IndexEntry ReadEntry(const Json::Value& json) {
    IndexEntry entry;
    GetJsonValue(entry.path, json, "path", true);
    GetJsonValue(entry.uuid, json, "uuid", true);
    GetJsonValue(entry.mappings, json, "mappings", true);
    GetJsonValue(entry.paused, json, "paused", false);
    GetJsonValue(entry.fresh, json, "fresh", false);
    GetJsonValue(entry.deleting, json, "deleting", false);
    GetJsonValue(entry.leftover, json, "leftover", false);
    if (json.isMember("move")) {
        entry.move.emplace();
        GetJsonValue(entry.move->id, json["move"], "id", true);
        GetJsonValue(entry.move->path, json["move"], "path", true);
    }
    return entry;
}

Json::Value WriteEntry(const IndexEntry& entry) {
    Json::Value json;
    json["path"] = entry.path;
    json["uuid"] = entry.uuid;
    json["mappings"] = entry.mappings;
    json["paused"] = entry.paused;
    if (entry.fresh) {
        json["fresh"] = true;
    }
    if (entry.deleting) {
        json["deleting"] = true;
    }
    if (!entry.leftover.empty()) {
        json["leftover"] = entry.leftover;
    }
    if (entry.move) {
        json["move"]["id"] = entry.move->id;
        json["move"]["path"] = entry.move->path;
    }
    return json;
}

}  // namespace

Registry::Registry(std::string path) : path_(std::move(path)) {
    if (access(path_.c_str(), F_OK) != 0 && errno == ENOENT) {
        return;
    }
    Json::Value indexes;
    if (!quivra::fromFile(indexes, path_) || !indexes.isObject()) {
        quivra::Fail({"registry", __LINE__}, "!fromFile(indexes, path_)",
                     Error(Error::kLoadFailed, "cannot read the list of indexes, " + path_));
    }
    for (auto it = indexes.begin(); it != indexes.end(); ++it) {
        try {
            entries.emplace(it.name(), ReadEntry(*it));
        } catch (const Error& error) {
            quivra::Fail({"registry", __LINE__}, "ReadEntry(index)",
                         Error(Error::kLoadFailed, path_ + ": " + error.reason));
        }
    }
}

void Registry::Save() const {
    Json::Value indexes(Json::objectValue);
    for (const auto& [id, entry] : entries) {
        indexes[id] = WriteEntry(entry);
    }
    if (!quivra::toFile(indexes, path_)) {
        const std::string reason = "cannot write " + path_ + ": " + quivra::SystemErrorText(errno);
        quivra::Fail({"registry", __LINE__}, "!toFile(indexes, path_)",
                     Error(Error::kSaveFailed, reason));
    }
}

}  // namespace elasticd
