#include "programs/fileindexd/elastic_index.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <iterator>
#include <optional>
#include <utility>

#include "base/frame.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"

namespace fileindexd {

namespace elastic = quivra::fileindex::elastic;
namespace field = quivra::fileindex::elastic::field;
using quivra::Error;

namespace {

constexpr const char* kUnit = "elastic_index";

/// A daemon that does not reply that fast has other trouble.
constexpr std::chrono::seconds kStatePatience{2};
constexpr std::chrono::seconds kAcceptPatience{30};
constexpr std::size_t kMaxStateReply = std::size_t{16} << 20;

constexpr const char* kFields[] = {field::kPath,         field::kIsDir,       field::kFSSize,
                                   field::kInode,        field::kModifiedNs,  field::kChangedNs,
                                   field::kContentError, field::kContentRetry};

/// Tells one run of the search daemon from the next: each binds a socket file of its own.
std::string DaemonIdentity() {
    struct stat info {};
    if (stat(elastic::kSearchDaemonSocketPath, &info) != 0) {
        return "none";
    }
    return std::to_string(info.st_dev) + ":" + std::to_string(info.st_ino) + ":" +
           std::to_string(info.st_ctim.tv_sec) + "." + std::to_string(info.st_ctim.tv_nsec);
}

/// What the platform gave as a number of 64 bits, whichever half of them it lies in; 0 without one.
std::uint64_t ReadBits(const Json::Value& hit, const char* name) {
    const Json::Value& value = hit[name];
    if (value.isUInt64()) {
        return value.asUInt64();
    }
    return value.isInt64() ? static_cast<std::uint64_t>(value.asInt64()) : 0;
}

Document ReadDocument(const Json::Value& hit) {
    Document document;
    quivra::GetJsonValue(document.path, hit, field::kPath, true);
    quivra::GetJsonValue(document.attributes.is_dir, hit, field::kIsDir, false);
    document.attributes.size = static_cast<std::int64_t>(ReadBits(hit, field::kFSSize));
    document.attributes.modified = static_cast<std::int64_t>(ReadBits(hit, field::kModifiedNs));
    document.attributes.changed = static_cast<std::int64_t>(ReadBits(hit, field::kChangedNs));
    document.attributes.inode = ReadBits(hit, field::kInode);
    quivra::GetJsonValue(document.content_error, hit, field::kContentError, false);
    quivra::GetJsonValue(document.error_can_pass, hit, field::kContentRetry, false);
    return document;
}

class NoSuchDocument : public DocumentError {
    using DocumentError::DocumentError;
};

/// One request of those that the library's client does not know. None without a reply in time.
std::optional<Json::Value> Ask(const Json::Value& request, std::chrono::seconds patience) {
    const quivra::base::Deadline deadline = std::chrono::steady_clock::now() + patience;
    const quivra::base::UniqueFd socket =
        quivra::base::ConnectUnix(elastic::kSearchDaemonSocketPath);
    std::string text;
    Json::Value reply;
    if (!socket.IsValid() ||
        !quivra::base::SendFrame(socket.Get(), quivra::toString(request), deadline) ||
        !quivra::base::ReceiveFrame(socket.Get(), text, kMaxStateReply, deadline) ||
        !quivra::fromString(reply, text) || !reply.isObject()) {
        errno = 0;
        return std::nullopt;
    }
    return reply;
}

bool IsFresh(const Json::Value& index, const std::string& id) {
    std::string found;
    bool fresh = false;
    quivra::GetJsonValue(found, index, "id", false);
    quivra::GetJsonValue(fresh, index, "fresh", false);
    return found == id && fresh;
}

/// Runs a command about one document and turns a refusal of that document into DocumentError.
template <typename Command>
void ForDocument(const Command& command) {
    try {
        command();
    } catch (const Error& error) {
        switch (static_cast<int>(error.code)) {
            case elastic::kNoSuchDocument:
                throw NoSuchDocument(error.what(), false);
            case Error::kParseFailed:
                throw DocumentError(error.what(), true);
            case elastic::kBadDocument:
                throw DocumentError(error.what(), false);
            default:
                throw;
        }
    }
}

}  // namespace

bool ElasticIndex::IsMadeAnew() const {
    Json::Value request;
    request["command"] = elastic::command::kState;
    const auto reply = Ask(request, kStatePatience);
    if (!reply) {
        return false;
    }
    try {
        Json::Value indexes;
        quivra::GetJsonValue(indexes, (*reply)["data"], "indexes", false);
        const std::string id = elastic::GetFileIndexID(share_);
        return indexes.isArray() &&
               std::any_of(indexes.begin(), indexes.end(),
                           [&](const auto& index) { return IsFresh(index, id); });
    } catch (const Error&) {
        return false;  // a daemon that does not know the question
    }
}

void ElasticIndex::Accept() {
    Json::Value request;
    request["command"] = elastic::command::kIndexAccept;
    request["data"]["id"] = elastic::GetFileIndexID(share_);
    const auto reply = Ask(request, kAcceptPatience);
    if (!reply || !(*reply)["success"].isBool() || !(*reply)["success"].asBool()) {
        const std::string text = reply ? quivra::toString(*reply) : "no reply";
        quivra::Fail(
            {kUnit, __LINE__}, "!reply || !reply[\"success\"]",
            Error(Error::kChannelFailed, "The search daemon does not take the new index of share " +
                                             share_ + " into service: " + text));
    }
}

void ElasticIndex::NoteChange() {
    const std::lock_guard lock(daemon_mutex_);
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
    std::string daemon;
    {
        const std::lock_guard lock(daemon_mutex_);
        daemon.swap(daemon_);
    }
    elastic::IndexCommit(share_);
    if (!daemon.empty() && daemon != DaemonIdentity()) {
        quivra::Fail({kUnit, __LINE__}, "daemon != DaemonIdentity()",
                     Error(Error::kChannelFailed,
                           "The search daemon was restarted and has lost uncommitted changes"));
    }
}

std::vector<Document> ElasticIndex::ListBelow(const std::string& directory,
                                              const std::string& after, std::size_t limit) {
    const std::size_t begin = after.empty() ? 0 : PositionBehind(directory, after);
    std::vector<Document> page = PageBelow(directory, begin, limit);
    // Where the next page begins, unless something changes before it.
    if (!page.empty()) {
        last_page_ = {directory, page.back().path, begin + page.size()};
    }
    return page;
}

/// The daemon knows positions, which every change moves: the one where the last page ended is right
/// unless something came or went before it, else it is looked for.
std::size_t ElasticIndex::PositionBehind(const std::string& directory, const std::string& after) {
    const auto path_at = [&](std::size_t position) {
        const std::vector<Document> one = PageBelow(directory, position, 1);
        return one.empty() ? std::nullopt : std::optional(one.front().path);
    };
    if (last_page_.directory == directory && last_page_.last == after &&
        path_at(last_page_.end - 1) == after) {
        return last_page_.end;
    }
    std::size_t low = 0;  // everything before it is at or before `after`
    std::size_t high = 1;
    for (auto path = path_at(high - 1); path && *path <= after; path = path_at(high - 1)) {
        low = high;
        high *= 2;
    }
    while (low < high - 1) {
        const std::size_t middle = low + (high - 1 - low) / 2;
        const auto path = path_at(middle);
        if (path && *path <= after) {
            low = middle + 1;
        } else {
            high = middle + 1;
        }
    }
    return low;
}

std::vector<Document> ElasticIndex::PageBelow(const std::string& directory, std::size_t offset,
                                              std::size_t limit) {
    Json::Value qsl;
    qsl["prefix"][field::kPath] = directory + "/";
    return Query(qsl, offset, limit);
}

std::vector<Document> ElasticIndex::Find(const std::vector<std::string>& paths) {
    if (paths.empty()) {
        return {};
    }
    Json::Value qsl;
    Json::Value& any = qsl["any"] = Json::Value(Json::arrayValue);
    for (const std::string& path : paths) {
        any.append(Json::Value(Json::objectValue))["term"][field::kPath] = path;
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
