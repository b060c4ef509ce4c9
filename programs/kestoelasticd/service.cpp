#include "programs/kestoelasticd/service.h"

#include <malloc.h>
#include <sodium.h>

#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <new>
#include <system_error>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/daemon/instance_lock.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/json_values.h"

namespace elasticd {
namespace {

namespace command = quivra::fileindex::elastic::command;
using quivra::Error;

constexpr std::chrono::milliseconds kMemoryCheckInterval{250};

constexpr char kSuccess[] = "{\"success\":true}";
constexpr char kSuccessWithData[] = "{\"success\":true,\"data\":";
constexpr std::chrono::seconds kMaintenanceInterval{2};
/// Bytes of request and reply from which on memory is given back afterwards.
constexpr std::size_t kLargeExchange = 1 << 20;

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
        return action();
    } catch (const Error& error) {
        return ErrorReply(error.code, error.reason);
    } catch (const std::bad_alloc&) {
        return ErrorReply(kOutOfMemory, "Out of memory");
    } catch (const std::exception& error) {
        return ErrorReply(kEngineFailed, error.what());
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
      catalog_(options.state_directory + "/indexes.json", options.min_free_space),
      maintenance_([this](const std::stop_token& stop) { MaintainIndexes(stop); }) {}

std::string Service::Handle(const std::string& request_text) {
    std::string reply = Reply([&] {
        CheckMemory();
        Json::Value request;
        if (!quivra::fromString(request, request_text) || !request.isObject()) {
            throw Error(kBadRequest, "The request is not a JSON object");
        }
        return request.isMember("compound") ? Compound(request["compound"])
                                            : RunCommand(request, false);
    });
    if (request_text.size() + reply.size() > kLargeExchange) {
        had_large_exchange_ = true;
    }
    return reply;
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
    if (command == command::kState && !in_compound) {
        return std::string(kSuccessWithData) + quivra::toString(catalog_.GetStates()) + "}";
    }
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

/// An index that turns out to be damaged or missing is made anew. Then a change is refused, because
/// it is fresh, and a query finds nothing.
void Service::UseIndex(const std::string& id, const std::function<void(Index&)>& use) {
    const std::shared_ptr<Index> index = catalog_.Find(id);
    const std::uint64_t generation = index->Generation();
    try {
        return use(*index);
    } catch (const engine::Damaged& damage) {
        catalog_.MakeAnew(id, damage.reason, generation);
    }
    use(*catalog_.Find(id));
}

std::string Service::RunDocumentCommand(const std::string& command, const std::string& id,
                                        const Json::Value& data) {
    if (command == command::kDocumentGetByQuery) {
        std::string reply;
        const Json::Value& query = ObjectMember(data, "query");
        UseIndex(id, [&](Index& index) { reply = std::move(index.Query(query).reply); });
        return reply;
    }
    if (command == command::kDocumentUpsertById || command == command::kDocumentSetById) {
        const bool whole = command == command::kDocumentUpsertById;
        const std::string document = TextMember(data, "doc_id");
        const Json::Value& fields = ObjectMember(data, "data");
        UseIndex(id, [&](Index& index) {
            whole ? index.Upsert(document, fields) : index.Set(document, fields);
        });
    } else if (command == command::kDocumentDelById) {
        const std::string document = TextMember(data, "doc_id");
        UseIndex(id, [&](Index& index) { index.Delete(document); });
    } else if (command == command::kDocumentDelByQuery) {
        const Json::Value& qsl = Member(ObjectMember(data, "query"), "qsl");
        UseIndex(id, [&](Index& index) { index.DeleteByQuery(qsl); });
    } else {
        throw Error(kUnknownCommand, "Unknown command: " + command);
    }
    return kSuccess;
}

void Service::RunIndexCommand(const std::string& command, const std::string& id,
                              const Json::Value& data) {
    if (command == command::kCommit) {
        UseIndex(id, [](Index& index) { index.Commit(); });
    } else if (command == command::kIndexCreate) {
        catalog_.Create(id, TextMember(data, "path"), ObjectMember(data, "mappings"));
    } else if (command == command::kIndexDelete) {
        catalog_.Delete(id);
    } else if (command == command::kIndexPause || command == command::kIndexResume) {
        catalog_.SetPaused(id, command == command::kIndexPause);
    } else if (command == command::kIndexAccept) {
        catalog_.Accept(id);
    } else if (command == command::kIndexConfigSet) {
        const Json::Value& changes = ObjectMember(data, "data");
        catalog_.Configure(id, OptionalText(changes, "id"), OptionalText(changes, "path"));
    } else {
        throw Error(kUnknownCommand, "Unknown command: " + command);
    }
}

/// Gives space back and shortens logs while nothing else happens.
void Service::MaintainIndexes(const std::stop_token& stop) {
    std::mutex mutex;
    std::condition_variable_any wake;
    std::unique_lock lock(mutex);
    while (!stop.stop_requested()) {
        wake.wait_for(lock, stop, kMaintenanceInterval, [] { return false; });
        if (!stop.stop_requested()) {
            catalog_.Maintain();
            // The allocator keeps what one large request took, in each thread that helped.
            if (had_large_exchange_.exchange(false)) {
                malloc_trim(0);
            }
        }
    }
}

}  // namespace elasticd
