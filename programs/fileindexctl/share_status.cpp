#include "programs/fileindexctl/share_status.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>

#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/folder_status.h"
#include "programs/fileindexctl/search.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

constexpr const char* kElasticSocketPath = "/var/run/kestoelasticd.sock";
constexpr const char* kStateDirectory = "/var/run/fileindexd/";

/// Whether somebody accepts connections there. Never waits.
bool Listens(const char* socket_path) {
    const base::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, socket_path, sizeof(address.sun_path) - 1);
    return fd.IsValid() &&
           (connect(fd.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0 ||
            errno == EAGAIN);
}

/// 0 for a file that is not there.
std::uint64_t CountLines(const std::string& path) {
    const base::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    std::array<char, 65536> buffer{};
    std::uint64_t lines = 0;
    char last = '\n';
    for (ssize_t size = 0; fd.IsValid();) {
        size = read(fd.Get(), buffer.data(), buffer.size());
        if (size <= 0) {
            break;
        }
        lines += static_cast<std::uint64_t>(std::count(buffer.data(), buffer.data() + size, '\n'));
        last = buffer[static_cast<std::size_t>(size) - 1];
    }
    return lines + (last == '\n' ? 0 : 1);
}

std::uint64_t Count(const Json::Value& value) {
    return value.isUInt64() ? value.asUInt64() : 0;
}

/// The state file is replaced atomically but outlives a worker that was killed: only while its
/// process exists does it count. Members of the wrong type count as missing.
WorkerStatus ReadWorkerStatus(const std::string& share) {
    WorkerStatus worker;
    Json::Value state;
    if (!fromFile(state, kStateDirectory + share + ".json") || !state.isObject()) {
        return worker;
    }
    long long pid = 0;
    GetJsonValue(pid, state, "pid", false);
    worker.running = pid > 0 && (kill(static_cast<pid_t>(pid), 0) == 0 || errno == EPERM);
    GetJsonValue(worker.state, state, "state", false);
    GetJsonValue(worker.current, state, "current", false);
    GetJsonValue(worker.last_error, state, "last_error", false);
    worker.done = Count(state["done"]);
    worker.total = Count(state["total"]);
    long long last_pass = 0;
    GetJsonValue(last_pass, state, "last_pass", false);
    worker.last_pass = last_pass;
    return worker;
}

/// Every part is tried on its own account: a daemon or a share that is away hides no other line.
ShareLine TakeShareLine(const std::string& name, bool elastic_answers) {
    ShareLine status;
    status.name = name;
    status.worker = ReadWorkerStatus(name);
    try {
        const sdk::SDKShare share(name);
        status.path = share.GetPath();
        const std::string queue = share.GetQueuePath();
        status.queue_lines = CountLines(queue);
        status.working_lines = CountLines(queue + ".tmp");
        if (elastic_answers) {
            status.documents = static_cast<std::int64_t>(CountDocuments(name, status.path));
        }
    } catch (const Error& error) {
        status.error = DescribeCause(error);
    }
    return status;
}

Json::Value ToJson(const ShareLine& share) {
    Json::Value json(Json::objectValue);
    json["name"] = share.name;
    json["path"] = share.path;
    json["queue"] = Json::UInt64{share.queue_lines};
    json["queue_working"] = Json::UInt64{share.working_lines};
    json["documents"] =
        share.documents < 0 ? Json::Value() : Json::Value(Json::Int64{share.documents});
    json["error"] = share.error;
    Json::Value& worker = json["worker"];
    worker["running"] = share.worker.running;
    worker["state"] = share.worker.state;
    worker["done"] = Json::UInt64{share.worker.done};
    worker["total"] = Json::UInt64{share.worker.total};
    worker["current"] = share.worker.current;
    worker["last_error"] = share.worker.last_error;
    worker["last_pass"] = Json::Int64{share.worker.last_pass};
    return json;
}

}  // namespace

bool Status::IsFinished() const {
    return std::all_of(folders.begin(), folders.end(), [](const FolderLine& folder) {
        const std::string text = folder.status["text"].asString();
        return text == "finished" || text == "error";
    });
}

bool Status::HasError() const {
    return std::any_of(folders.begin(), folders.end(),
                       [](const FolderLine& folder) { return folder.status["text"] == "error"; });
}

Status TakeStatus() {
    Status status;
    const fileindex::FolderMgr folders;
    status.elastic_answers = Listens(kElasticSocketPath);
    status.indexer_answers = Listens(fileindex::kFileIndexDaemonSocketPath);
    status.resume_time = fileindex::StatusMgr().GetPauseInfo();
    for (const auto& folder : folders.GetFolders()) {
        status.folders.push_back(
            {folder->GetPath(), folder->GetName(), folder->GetPaused(), FolderStatus(*folder)});
    }
    for (const std::string& share : folders.GetIndexedShares()) {
        status.shares.push_back(TakeShareLine(share, status.elastic_answers));
    }
    return status;
}

Json::Value ToJson(const Status& status) {
    Json::Value json(Json::objectValue);
    json["daemons"]["kestoelasticd"] = status.elastic_answers;
    json["daemons"]["fileindexd"] = status.indexer_answers;
    json["resume_time"] = Json::Int64{status.resume_time};
    json["finished"] = status.IsFinished();
    json["folder"] = Json::Value(Json::arrayValue);
    for (const FolderLine& folder : status.folders) {
        Json::Value& line = json["folder"].append(Json::Value(Json::objectValue));
        line["path"] = folder.path;
        line["name"] = folder.name;
        line["paused"] = folder.paused;
        line["status"] = folder.status;
    }
    json["share"] = Json::Value(Json::arrayValue);
    for (const ShareLine& share : status.shares) {
        json["share"].append(ToJson(share));
    }
    return json;
}

}  // namespace quivra::ctl
