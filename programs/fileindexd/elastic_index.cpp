#include "programs/fileindexd/elastic_index.h"

#include <sys/stat.h>

#include <algorithm>
#include <iterator>
#include <utility>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"

namespace fileindexd {

namespace elastic = quivra::fileindex::elastic;
using quivra::Error;

namespace {

constexpr const char* kUnit = "elastic_index";
constexpr const char* kSocketPath = "/var/run/kestoelasticd.sock";

constexpr const char* kFields[] = {"KESTOMDPath", "KESTOMDIsDir", "KESTOMDFSSize",
                                   "KESTOMDFSContentChangeDate", "KESTOMDAttributeChangeDate"};

/// Tells one run of the search daemon from the next: each binds a socket file of its own.
std::string DaemonIdentity() {
    struct stat info {};
    if (stat(kSocketPath, &info) != 0) {
        return "none";
    }
    return std::to_string(info.st_dev) + ":" + std::to_string(info.st_ino) + ":" +
           std::to_string(info.st_ctim.tv_sec) + "." + std::to_string(info.st_ctim.tv_nsec);
}

std::int64_t ReadNumber(const Json::Value& hit, const char* field) {
    long long number = 0;
    quivra::GetJsonValue(number, hit, field, false);
    return number;
}

Document ReadDocument(const Json::Value& hit) {
    Document document;
    quivra::GetJsonValue(document.path, hit, "KESTOMDPath", true);
    quivra::GetJsonValue(document.attributes.is_dir, hit, "KESTOMDIsDir", false);
    document.attributes.size = ReadNumber(hit, "KESTOMDFSSize");
    document.attributes.modified = ReadNumber(hit, "KESTOMDFSContentChangeDate");
    document.attributes.changed = ReadNumber(hit, "KESTOMDAttributeChangeDate");
    return document;
}

/// The search daemon's codes that concern the document of a request, not the index: see its
/// documentation.
constexpr int kNoSuchDocument = 1408;
constexpr int kDocumentRefused = 1409;

class NoSuchDocument : public DocumentError {
    using DocumentError::DocumentError;
};

/// Runs a command about one document and turns a refusal of that document into DocumentError.
template <typename Command>
void ForDocument(const Command& command) {
    try {
        command();
    } catch (const Error& error) {
        switch (static_cast<int>(error.code)) {
            case kNoSuchDocument:
                throw NoSuchDocument(error.what());
            case Error::kParseFailed:
            case kDocumentRefused:
                throw DocumentError(error.what());
            default:
                throw;
        }
    }
}

}  // namespace

void ElasticIndex::NoteChange() {
    if (daemon_.empty()) {
        daemon_ = DaemonIdentity();
    }
}

void ElasticIndex::Upsert(const std::string& path, bool need_meta) {
    NoteChange();
    ForDocument([&] { elastic::IndexUpsert(share_, path, need_meta); });
}

bool ElasticIndex::SetAttributes(const std::string& path) {
    NoteChange();
    try {
        ForDocument([&] { elastic::IndexAttr(share_, path); });
        return true;
    } catch (const NoSuchDocument&) {
        return false;
    }
}

bool ElasticIndex::Rename(const std::string& to, const std::string& from) {
    NoteChange();
    try {
        ForDocument([&] { elastic::IndexRename(share_, to, from); });
        return true;
    } catch (const NoSuchDocument&) {
        return false;
    }
}

void ElasticIndex::Delete(const std::string& path) {
    NoteChange();
    elastic::IndexDel(share_, path);
}

void ElasticIndex::DeleteBelow(const std::string& directory) {
    NoteChange();
    elastic::IndexDelDir(share_, directory);
}

void ElasticIndex::Commit() {
    const std::string daemon = std::exchange(daemon_, "");
    elastic::IndexCommit(share_);
    if (!daemon.empty() && daemon != DaemonIdentity()) {
        quivra::Fail({kUnit, __LINE__}, "daemon != DaemonIdentity()",
                     Error(Error::kChannelFailed,
                           "The search daemon was restarted and has lost uncommitted changes"));
    }
}

std::vector<Document> ElasticIndex::ListBelow(const std::string& directory, std::size_t offset,
                                              std::size_t limit) {
    Json::Value qsl;
    qsl["prefix"]["KESTOMDPath"] = directory + "/";
    return Query(qsl, offset, limit);
}

std::vector<Document> ElasticIndex::Find(const std::vector<std::string>& paths) {
    if (paths.empty()) {
        return {};
    }
    Json::Value qsl;
    Json::Value& any = qsl["any"] = Json::Value(Json::arrayValue);
    for (const std::string& path : paths) {
        any.append(Json::Value(Json::objectValue))["term"]["KESTOMDPath"] = path;
    }
    return Query(qsl, 0, paths.size());
}

std::vector<Document> ElasticIndex::Query(const Json::Value& qsl, std::size_t offset,
                                          std::size_t limit) {
    Json::Value query;
    query["qsl"] = qsl;
    query["offset"] = Json::UInt64(offset);
    query["limit"] = Json::UInt64(limit);
    query["fields"] = Json::Value(Json::arrayValue);
    for (const char* field : kFields) {
        query["fields"].append(field);
    }
    Json::Value reply;
    elastic::IndexQuery(reply, share_, query);
    if (!reply.isMember("data") || !reply["data"].isArray()) {
        quivra::Fail({kUnit, __LINE__}, "!reply[\"data\"].isArray()",
                     Error(Error::kQueryWithoutData, quivra::toString(reply)));
    }
    std::vector<Document> documents;
    documents.reserve(reply["data"].size());
    std::transform(reply["data"].begin(), reply["data"].end(), std::back_inserter(documents),
                   ReadDocument);
    return documents;
}

}  // namespace fileindexd
