#include <utility>

#include <kesto/content_extract.h>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/request.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"

namespace quivra::fileindex::elastic {
namespace {

constexpr const char* kPath = "KESTOMDPath";
constexpr const char* kParent = "KESTOMDParent";
constexpr const char* kFSName = "KESTOMDFSName";
constexpr const char* kSearchFileName = "KESTOMDSearchFileName";
constexpr const char* kDisplayName = "KESTOMDDisplayName";
constexpr const char* kKind = "KESTOMDKind";
constexpr const char* kExtension = "KESTOMDExtension";

Json::Value DocumentRequest(const char* command, const std::string& share) {
    Json::Value request;
    request["command"] = command;
    request["data"]["id"] = GetFileIndexID(share);
    return request;
}

Json::Value BelowQuery(const std::string& directory) {
    Json::Value query;
    query["qsl"]["prefix"][kPath] = directory + "/";
    return query;
}

Json::Value ExtractDocument(const std::string& full_path, bool need_meta) {
    Json::Value cfg;
    cfg["need_meta"] = need_meta;
    Json::Value file_data;
    if (!KESTO::CONTENT_EXTRACT::ParseFile(full_path, cfg, file_data) || !file_data.isObject()) {
        Fail({"elastic_control", __LINE__}, "!ParseFile(full_path, cfg, file_data)",
             Error(Error::kParseFailed, "Parse failed, path=" + full_path));
    }
    file_data[kSearchFileName] = Json::Value(std::as_const(file_data)[kFSName]);
    return file_data;
}

void SendDocument(const char* command, const std::string& share, const std::string& full_path,
                  bool need_meta) {
    Json::Value request = DocumentRequest(command, share);
    request["data"]["doc_id"] = full_path;
    request["data"]["data"] = ExtractDocument(full_path, need_meta);
    SendRequestNoResult(request);
}

/// The fields that tell where a document's file is.
Json::Value LocationFields(const std::string& path) {
    const std::string name = Basename(path);
    const std::string extension = GetFileExtension(path, true);
    Json::Value fields;
    fields[kPath] = path;
    fields[kParent] = Dirname(path);
    fields[kFSName] = name;
    fields[kSearchFileName] = name;
    fields[kDisplayName] = name;
    fields[kKind] = extension;
    fields[kExtension] = extension;
    return fields;
}

/// Turns `request` into the one that moves a document found below `old_path` along.
void SetDescendantMove(Json::Value& request, const Json::Value& hit, const std::string& new_path,
                       const std::string& old_path) {
    std::string name;
    std::string parent;
    GetJsonValue<std::string>(name, hit, kFSName, true);
    GetJsonValue<std::string>(parent, hit, kParent, true);
    parent.replace(0, old_path.size(), new_path);
    Json::Value fields;
    fields[kParent] = parent;
    fields[kPath] = parent + "/" + name;
    fields[kSearchFileName] = name;
    request["command"] = "document_set_by_id";
    request["data"]["doc_id"] = hit[kPath];
    request["data"]["data"] = std::move(fields);
}

}  // namespace

void IndexDel(const std::string& share, const std::string& full_path) {
    Json::Value request = DocumentRequest("document_del_by_id", share);
    request["data"]["doc_id"] = full_path;
    SendRequestNoResult(request);
}

void IndexDelDir(const std::string& share, const std::string& dir_path) {
    Json::Value request = DocumentRequest("document_del_by_query", share);
    request["data"]["query"] = BelowQuery(dir_path);
    SendRequestNoResult(request);
}

void IndexUpsert(const std::string& share, const std::string& full_path, bool need_meta) {
    SendDocument("document_upsert_by_id", share, full_path, need_meta);
}

void IndexAttr(const std::string& share, const std::string& full_path) {
    SendDocument("document_set_by_id", share, full_path, false);
}

void IndexRename(const std::string& share, const std::string& new_path,
                 const std::string& old_path) {
    // One request object serves all: the later ones still carry the members of those before, which
    // the daemon ignores where a command does not use them.
    Json::Value request = DocumentRequest("document_set_by_id", share);
    request["data"]["doc_id"] = old_path;
    request["data"]["data"] = LocationFields(new_path);
    SendRequestNoResult(request);

    request["command"] = "document_get_by_query";
    request["data"]["query"] = BelowQuery(old_path);
    Json::Value reply;
    SendRequestWithRetry(reply, request);
    const Json::Value* hits = FindJsonMember(reply, "data", false);
    if (hits == nullptr || !hits->isArray()) {
        Fail({"elastic_control", __LINE__}, "!res.isMember(\"data\") || !res[\"data\"].isArray()",
             Error(Error::kQueryWithoutData, toString(reply)));
    }

    Json::Value compound;
    Json::Value& elements = compound["compound"] = Json::Value(Json::arrayValue);
    for (const Json::Value& hit : *hits) {
        SetDescendantMove(request, hit, new_path, old_path);
        elements.append(request);
    }
    SendRequestNoResult(compound);
}

void IndexCommit(const std::string& share) {
    try {
        SendRequestNoResult(DocumentRequest("commit", share));
        return;
    } catch (const Error&) {
        const sdk::SDKShare sdk_share(share);
        if (sdk_share.IsSpaceEnough()) {
            throw;
        }
    }
    StatusMgr().SetShareStatus(share, kShareNeedReindex);
    Fail({"elastic_control", __LINE__}, "!sdk_share.IsSpaceEnough()",
         Error(Error::kSpaceNotEnough, "Share (" + share + ") space not enough"));
}

void IndexQuery(Json::Value& reply, const std::string& share, const Json::Value& query) {
    Json::Value request = DocumentRequest("document_get_by_query", share);
    request["data"]["query"] = query;
    SendRequest(reply, request);
}

}  // namespace quivra::fileindex::elastic
