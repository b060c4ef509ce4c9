#include "programs/kestoelasticd/service.h"

#include <sodium.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <new>
#include <system_error>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/daemon/instance_lock.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine_error.h"
#include "programs/kestoelasticd/record.h"

namespace elasticd {
namespace {

using quivra::Error;

constexpr std::chrono::milliseconds kMemoryCheckInterval{250};
/// Changes after which the engine writes its buffers out; memory grows with it.
constexpr char kFlushThreshold[] = "2000";

constexpr char kSuccess[] = "{\"success\":true}";

std::string ErrorReply(int code, const std::string& message) {
    std::string reply =
        "{\"success\":false,\"error\":{\"code\":" + std::to_string(code) + ",\"msg\":";
    AppendJsonText(reply, message);
    return reply + "}}";
}

/// Runs what makes a reply; failures become replies of their own.
template <typename Action>
std::string Reply(const Action& action) {
    try {
        return TranslateEngineErrors(action);
    } catch (const Error& error) {
        return ErrorReply(error.code, error.reason);
    }
}

const Json::Value& Member(const Json::Value& object, const char* name) {
    if (!object.isObject() || !object.isMember(name)) {
        throw Error(kBadRequest, std::string("The request lacks \"") + name + "\"");
    }
    return object[name];
}

std::string TextMember(const Json::Value& object, const char* name) {
    const Json::Value& value = Member(object, name);
    if (!value.isString() || value.asString().empty()) {
        throw Error(kBadRequest, std::string("\"") + name + "\" must be a text");
    }
    return value.asString();
}

const Json::Value& ObjectMember(const Json::Value& object, const char* name) {
    const Json::Value& value = Member(object, name);
    if (!value.isObject()) {
        throw Error(kBadRequest, std::string("\"") + name + "\" must be an object");
    }
    return value;
}

std::string OptionalText(const Json::Value& object, const char* name) {
    return object.isMember(name) ? TextMember(object, name) : std::string();
}

/// Bytes that the kernel can give without swapping; a very large number when it does not tell.
std::uint64_t AvailableMemory() {
    std::ifstream info("/proc/meminfo");
    std::string name;
    std::uint64_t kilobytes = 0;
    while (info >> name >> kilobytes) {
        if (name == "MemAvailable:") {
            return kilobytes * 1024;
        }
        std::getline(info, name);
    }
    return UINT64_MAX;
}

quivra::base::UniqueFd PrepareState(const ServiceOptions& options) {
    if (sodium_init() < 0) {
        throw Error(Error::kSystemCallFailed, "libsodium cannot be used");
    }
    // The engine reads it whenever it opens a database for writing.
    setenv("XAPIAN_FLUSH_THRESHOLD", kFlushThreshold, 1);
    std::error_code error;
    std::filesystem::create_directories(options.state_directory, error);
    if (error) {
        throw Error(Error::kSystemCallFailed,
                    "cannot make " + options.state_directory + ": " + error.message());
    }
    return quivra::daemon::TakeInstanceLock(options.state_directory + "/lock");
}

}  // namespace

Service::Service(const ServiceOptions& options)
    : options_(options),
      lock_(PrepareState(options)),
      catalog_(options.state_directory + "/indexes.json", options.min_free_space) {}

std::string Service::Handle(const std::string& request_text) {
    return Reply([&] {
        CheckMemory();
        Json::Value request;
        if (!quivra::fromString(request, request_text) || !request.isObject()) {
            throw Error(kBadRequest, "The request is no JSON object");
        }
        return request.isMember("compound") ? Compound(request["compound"])
                                            : RunCommand(request, false);
    });
}

void Service::CheckMemory() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    const std::chrono::steady_clock::duration checked(memory_checked_);
    if (now - checked < kMemoryCheckInterval) {
        return;
    }
    if (AvailableMemory() < options_.min_memory) {
        throw Error(kOutOfMemory, "Memory is short");
    }
    memory_checked_ = now.count();
}

std::string Service::Compound(const Json::Value& elements) {
    if (!elements.isArray()) {
        throw Error(kBadRequest, "\"compound\" must be an array");
    }
    std::string replies;
    bool has_fail = false;
    for (const Json::Value& element : elements) {
        const std::string reply = Reply([&] { return RunCommand(element, true); });
        has_fail |= reply.starts_with("{\"success\":false");
        replies += replies.empty() ? "" : ",";
        replies += reply;
    }
    return std::string("{\"success\":true,\"has_fail\":") + (has_fail ? "true" : "false") +
           ",\"data\":[" + replies + "]}";
}

std::string Service::RunCommand(const Json::Value& request, bool in_compound) {
    const std::string command = TextMember(request, "command");
    const Json::Value& data = ObjectMember(request, "data");
    const std::string id = TextMember(data, "id");
    if (command.starts_with("document_")) {
        return RunDocumentCommand(command, id, data);
    }
    if (in_compound) {
        throw Error(kUnknownCommand, "Not allowed in a compound request: " + command);
    }
    RunIndexCommand(command, id, data);
    return kSuccess;
}

std::string Service::RunDocumentCommand(const std::string& command, const std::string& id,
                                        const Json::Value& data) {
    if (command == "document_get_by_query") {
        const SearchResult found = catalog_.Find(id)->Query(ObjectMember(data, "query"));
        std::string reply = "{\"success\":true,\"total\":" + std::to_string(found.total);
        return reply.append(",\"data\":").append(found.data).append("}");
    }
    if (command == "document_upsert_by_id" || command == "document_set_by_id") {
        const bool whole = command == "document_upsert_by_id";
        const std::string document = TextMember(data, "doc_id");
        const Json::Value& fields = ObjectMember(data, "data");
        catalog_.Find(id)->Write([&](IndexWriter& writer) {
            whole ? writer.Upsert(document, fields) : writer.Set(document, fields);
        });
    } else if (command == "document_del_by_id") {
        const std::string document = TextMember(data, "doc_id");
        catalog_.Find(id)->Reduce([&](IndexWriter& writer) { writer.Delete(document); });
    } else if (command == "document_del_by_query") {
        const Json::Value& qsl = Member(ObjectMember(data, "query"), "qsl");
        catalog_.Find(id)->Reduce([&](IndexWriter& writer) { writer.DeleteByQuery(qsl); });
    } else {
        throw Error(kUnknownCommand, "Unknown command: " + command);
    }
    return kSuccess;
}

void Service::RunIndexCommand(const std::string& command, const std::string& id,
                              const Json::Value& data) {
    if (command == "commit") {
        catalog_.Find(id)->Reduce([](IndexWriter& writer) { writer.Commit(); });
    } else if (command == "index_create") {
        catalog_.Create(id, TextMember(data, "path"), ObjectMember(data, "mappings"));
    } else if (command == "index_delete") {
        catalog_.Delete(id);
    } else if (command == "index_pause" || command == "index_resume") {
        catalog_.SetPaused(id, command == "index_pause");
    } else if (command == "index_config_set") {
        const Json::Value& changes = ObjectMember(data, "data");
        catalog_.Configure(id, OptionalText(changes, "id"), OptionalText(changes, "path"));
    } else {
        throw Error(kUnknownCommand, "Unknown command: " + command);
    }
}

}  // namespace elasticd
