#include <utility>

#include <kesto/content_extract.h>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"
#include "fileindex/elastic/request.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"

namespace quivra::fileindex::elastic {
namespace {

Json::Value DocumentRequest(const char* name, const std::string& share) {
    Json::Value request;
    request["command"] = name;
    request["data"]["id"] = GetFileIndexID(share);
    return request;
}

Json::Value BelowQuery(const std::string& directory) {
    Json::Value query;
    query["qsl"]["prefix"][field::kPath] = directory + "/";
    return query;
}

Json::Value ExtractDocument(const std::string& full_path, bool need_meta) {
    Json::Value cfg;
    cfg["need_meta"] = need_meta;
    Json::Value file_data;
    if (!KESTO::CONTENT_EXTRACT::ParseFile(full_path, cfg, file_data) || !file_data.isObject()) {
        Fail(unit::kDocuments.Here(), "!ParseFile(full_path, cfg, file_data)",
             Error(Error::kParseFailed, "Parse failed, path=" + full_path));
    }
    // The name twice: once as it is, once for the n-grams that find its parts.
    file_data[field::kSearchFileName] = Json::Value(std::as_const(file_data)[field::kFSName]);
    return file_data;
}

void SendDocument(const char* name, const std::string& share, const std::string& full_path,
                  bool need_meta) {
    Json::Value request = DocumentRequest(name, share);
    request["data"]["doc_id"] = full_path;
    request["data"]["data"] = ExtractDocument(full_path, need_meta);
    SendRequestNoResult(request);
}

/// The fields that tell where a document's file is.
Json::Value LocationFields(const std::string& path) {
    const std::string name = Basename(path);
    const std::string extension = GetFileExtension(path, true);
    Json::Value fields;
    fields[field::kPath] = path;
    fields[field::kParent] = Dirname(path);
    fields[field::kFSName] = name;
    fields[field::kSearchFileName] = name;
    fields[field::kDisplayName] = name;
    fields[field::kKind] = extension;
    fields[field::kExtension] = extension;
    return fields;
}

/// Turns `request` into the one that moves a document found below `old_path` along.
void SetDescendantMove(Json::Value& request, const Json::Value& hit, const std::string& new_path,
                       const std::string& old_path) {
    std::string name;
    std::string parent;
    GetJsonValue<std::string>(name, hit, field::kFSName, true);
    GetJsonValue<std::string>(parent, hit, field::kParent, true);
    parent.replace(0, old_path.size(), new_path);
    Json::Value fields;
    fields[field::kParent] = parent;
    fields[field::kPath] = parent + "/" + name;
    fields[field::kSearchFileName] = name;
    request["command"] = command::kDocumentSetById;
    request["data"]["doc_id"] = hit[field::kPath];
    request["data"]["data"] = std::move(fields);
}

}  // namespace

void IndexDel(const std::string& share, const std::string& full_path) {
    Json::Value request = DocumentRequest(command::kDocumentDelById, share);
    request["data"]["doc_id"] = full_path;
    SendRequestNoResult(request);
}

void IndexDelDir(const std::string& share, const std::string& dir_path) {
    Json::Value request = DocumentRequest(command::kDocumentDelByQuery, share);
    request["data"]["query"] = BelowQuery(dir_path);
    SendRequestNoResult(request);
}

void IndexUpsert(const std::string& share, const std::string& full_path, bool need_meta) {
    SendDocument(command::kDocumentUpsertById, share, full_path, need_meta);
}

void IndexAttr(const std::string& share, const std::string& full_path) {
    SendDocument(command::kDocumentSetById, share, full_path, false);
}

void IndexRename(const std::string& share, const std::string& new_path,
                 const std::string& old_path) {
    // One request object serves all: the later ones still carry the members of those before, which
    // the daemon ignores where a command does not use them.
    Json::Value request = DocumentRequest(command::kDocumentSetById, share);
    request["data"]["doc_id"] = old_path;
    request["data"]["data"] = LocationFields(new_path);
    SendRequestNoResult(request);

    request["command"] = command::kDocumentGetByQuery;
    request["data"]["query"] = BelowQuery(old_path);
    Json::Value reply;
    SendRequestWithRetry(reply, request);
    const Json::Value* hits = FindJsonMember(reply, "data", false);
    if (hits == nullptr || !hits->isArray()) {
        Fail(unit::kDocuments.Here(), "!res.isMember(\"data\") || !res[\"data\"].isArray()",
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
    // A full volume makes the daemon fail in many ways. Asked afterwards, because asking before
    // each commit would cost more and prove nothing.
    try {
        SendRequestNoResult(DocumentRequest(command::kCommit, share));
        return;
    } catch (const Error&) {
        const sdk::SDKShare sdk_share(share);
        if (sdk_share.IsSpaceEnough()) {
            throw;
        }
    }
    StatusMgr().SetShareStatus(share, kShareNeedReindex);
    Fail(unit::kDocuments.Here(), "!sdk_share.IsSpaceEnough()",
         Error(Error::kSpaceNotEnough, "Share (" + share + ") space not enough"));
}

void IndexQuery(Json::Value& reply, const std::string& share, const Json::Value& query) {
    Json::Value request = DocumentRequest(command::kDocumentGetByQuery, share);
    request["data"]["query"] = query;
    SendRequest(reply, request);
}

}  // namespace quivra::fileindex::elastic
