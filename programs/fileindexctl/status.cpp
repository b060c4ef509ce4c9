#include "programs/fileindexctl/status.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <map>
#include <utility>

#include "base/queue_file.h"
#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/shares.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

/// 0 for a file that is not there, and for what is not a file.
std::uint64_t CountLines(const std::string& path) {
    // Users may have put anything there: opening a FIFO must not wait for its other end.
    const base::UniqueFd fd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC));
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

/// Members of a daemon's reply that are missing or of the wrong type count as not told.
std::int64_t Number(const Json::Value& object, const char* member, std::int64_t otherwise) {
    const Json::Value& value = object[member];
    return value.isInt64() ? value.asInt64() : otherwise;
}

std::uint64_t Count(const Json::Value& object, const char* member) {
    return static_cast<std::uint64_t>(std::max<std::int64_t>(Number(object, member, 0), 0));
}

std::string Text(const Json::Value& object, const char* member) {
    const Json::Value& value = object[member];
    return value.isString() ? value.asString() : "";
}

/// The element of the list whose member has that value; null when there is none.
Json::Value Find(const Json::Value& list, const char* member, const std::string& value) {
    for (const Json::Value& element : list.isArray() ? list : Json::Value(Json::arrayValue)) {
        if (element.isObject() && element[member] == value) {
            return element;
        }
    }
    return Json::Value();
}

/// What the library says of the folder. A failure to tell is told as an error, so that one bad
/// folder does not hide the others.
Json::Value FolderStatus(const fileindex::Folder& folder) {
    Json::Value status(Json::objectValue);
    try {
        folder.GetStatus(status);
        if (status["text"] == "error" && RootOf(folder.GetShare()).empty()) {
            status["desc"] = "its share is gone";
        }
    } catch (const Error& error) {
        status["text"] = "error";
        status["desc"] = DescribeCause(error);
    }
    return status;
}

void AddProblem(ShareLine& share, const std::string& problem) {
    if (!problem.empty()) {
        share.problems.push_back(problem.ends_with('.') ? problem.substr(0, problem.size() - 1)
                                                        : problem);
    }
}

constexpr const char* kRegisterAgain =
    "'fileindexctl folder set' with one of its folders registers it again";

void TakeFromIndexer(ShareLine& share, bool is_paused, const DaemonState& indexer) {
    const Json::Value told = Find(indexer.data["shares"], "share", share.name);
    share.has_worker = told.isObject();
    share.state = Text(told, "state");
    share.done = Count(told, "done");
    share.total = Count(told, "total");
    share.current = Text(told, "current");
    share.last_pass = Number(told, "last_pass", 0);
    share.last_error = Reworded(Text(told, "last_error"));
    share.waiting = Count(told, "waiting");
    share.waiting_bytes = Count(told, "waiting_bytes");
    share.phase = Text(told, "phase");
    share.eta = Number(told, "eta", -1);
    share.failed = Count(told, "failed");
    AddProblem(share, Reworded(Text(told, "problem")));
    if (indexer.reach == DaemonState::Reach::kReplied && !share.has_worker && !is_paused) {
        AddProblem(share, std::string("fileindexd does not work on it; ") + kRegisterAgain);
    }
}

void TakeFromSearch(ShareLine& share, const DaemonState& search) {
    const Json::Value told = Find(search.data["indexes"], "id", "fileindex_" + share.name);
    share.made_anew = told["fresh"] == true;
    share.documents = Number(told, "documents", -1);
    AddProblem(share, Reworded(Text(told, "problem")));
}

std::string UnwatchedText(const ShareLine& share) {
    return std::to_string(share.unwatched) + " of " +
           std::to_string(share.watched + share.unwatched) +
           " directories are not watched; changes in them are not noticed";
}

void TakeFromMonitor(ShareLine& share, const std::string& queue, const DaemonState& monitor) {
    if (monitor.reach != DaemonState::Reach::kReplied) {
        return;
    }
    const Json::Value told = Find(monitor.data["folders"], "queue", queue);
    if (!told.isObject()) {
        AddProblem(share, std::string("kestotifyd does not watch it; ") + kRegisterAgain);
        return;
    }
    share.watched = Number(told, "watched", -1);
    share.unwatched = Number(told, "unwatched", -1);
    const std::string problem = Text(told, "problem");
    AddProblem(share, problem.empty() && share.unwatched > 0 ? UnwatchedText(share) : problem);
}

/// The share's own problem comes before those of daemons: while it stands, nothing else helps.
std::string FirstProblem(const ShareLine& share, const Status& status) {
    if (!share.problems.empty()) {
        return share.problems.front();
    }
    return status.problems.empty() ? "" : status.problems.front();
}

/// The library sees the queue alone: an empty one is "finished" to it, whoever should fill it.
void Correct(FolderLine& folder, const ShareLine& share, const Status& status) {
    const std::string text = folder.status["text"].asString();
    // Nothing is to be done there, and nothing will be: neither "processing" nor "finished".
    if (folder.paused && text != "error") {
        folder.status["text"] = "paused";
        folder.status["desc"] = "with its share";
    }
    if (folder.paused || text != "finished") {
        return;
    }
    const std::string problem = FirstProblem(share, status);
    if (share.made_anew) {
        folder.status["text"] = "processing";
        folder.status["desc"] = "its index was damaged or missing and is made anew";
    } else if (!problem.empty()) {
        folder.status["text"] = "incomplete";
        folder.status["desc"] = problem;
    } else if (share.waiting > 0 || !share.phase.empty()) {
        folder.status["text"] = "processing";
    }
}

void TakeProblems(Status& status) {
    const std::array<std::pair<const Daemon*, const DaemonState*>, 3> daemons = {
        {{&kSearchDaemon, &status.search},
         {&kIndexer, &status.indexer},
         {&kMonitor, &status.monitor}}};
    for (const auto& [daemon, state] : daemons) {
        std::string problem = DescribeProblem(*daemon, *state);
        if (problem.empty()) {
            problem = Text(state->data, "problem");
        }
        if (!problem.empty()) {
            status.problems.push_back(problem);
        }
    }
}

Json::Value ListOf(const std::vector<std::string>& texts) {
    Json::Value list(Json::arrayValue);
    for (const std::string& text : texts) {
        list.append(text);
    }
    return list;
}

Json::Value ToJson(const ShareLine& share) {
    Json::Value json(Json::objectValue);
    json["name"] = share.name;
    json["path"] = share.path;
    json["queue"] = Json::UInt64{share.queue_lines};
    json["queue_working"] = Json::UInt64{share.working_lines};
    json["documents"] =
        share.documents < 0 ? Json::Value() : Json::Value(Json::Int64{share.documents});
    json["made_anew"] = share.made_anew;
    json["waiting"] = Json::UInt64{share.waiting};
    json["waiting_bytes"] = Json::UInt64{share.waiting_bytes};
    json["phase"] = share.phase;
    json["eta"] = share.eta < 0 ? Json::Value() : Json::Value(Json::Int64{share.eta});
    json["failed"] = Json::UInt64{share.failed};
    json["watched"] = share.watched < 0 ? Json::Value() : Json::Value(Json::Int64{share.watched});
    json["unwatched"] =
        share.unwatched < 0 ? Json::Value() : Json::Value(Json::Int64{share.unwatched});
    json["problems"] = ListOf(share.problems);
    Json::Value& worker = json["worker"];
    worker["running"] = share.has_worker;
    worker["state"] = share.state;
    worker["done"] = Json::UInt64{share.done};
    worker["total"] = Json::UInt64{share.total};
    worker["current"] = share.current;
    worker["last_error"] = share.last_error;
    worker["last_pass"] = Json::Int64{share.last_pass};
    return json;
}

}  // namespace

// Every part is tried on its own account: a daemon or a share that is away hides no other line.
ShareLine TakeShareLine(const std::string& name, bool is_paused, const Status& status) {
    ShareLine share;
    share.name = name;
    share.path = RootOf(name);
    AddProblem(share, share.path.empty()
                          ? "the share is gone; bring it back, or forget it with 'fileindexctl "
                            "share clear " +
                                name + " PATH'"
                          : ProblemOfPlace(name));
    TakeFromIndexer(share, is_paused, status.indexer);
    TakeFromSearch(share, status.search);
    try {
        const std::string queue = sdk::SDKShare(name).GetQueuePath();
        share.queue_lines = CountLines(queue);
        share.working_lines = CountLines(base::WorkingCopy(queue));
        if (!is_paused) {
            TakeFromMonitor(share, queue, status.monitor);
        }
    } catch (const Error& error) {
        // What was found above is the cause, and says it better.
        if (share.problems.empty()) {
            AddProblem(share, DescribeCause(error));
        }
    }
    return share;
}

bool Status::IsFinished() const {
    return std::all_of(folders.begin(), folders.end(), [](const FolderLine& folder) {
        const std::string text = folder.status["text"].asString();
        return folder.paused || text == "finished" || text == "error" || text == "incomplete";
    });
}

bool Status::HasProblem() const {
    const bool in_folder =
        std::any_of(folders.begin(), folders.end(), [](const FolderLine& folder) {
            return folder.status["text"] == "error" || folder.status["text"] == "incomplete";
        });
    const bool in_share = std::any_of(shares.begin(), shares.end(), [](const ShareLine& share) {
        return !share.problems.empty();
    });
    return in_folder || in_share || (!folders.empty() && !problems.empty());
}

Status TakeDaemons() {
    Status status;
    // One after the other: only a daemon that hangs takes time, and then its two seconds.
    status.search = AskState(kSearchDaemon);
    status.indexer = AskState(kIndexer);
    status.monitor = AskState(kMonitor);
    TakeProblems(status);
    return status;
}

Status TakeStatus() {
    const fileindex::FolderMgr folders;
    Status status = TakeDaemons();
    status.resume_time = fileindex::StatusMgr().GetPauseInfo();
    status.share_problems = ProblemsOfShares();
    std::map<std::string, bool> paused;  // a share is when all of its folders are
    for (const auto& folder : folders.GetFolders()) {
        const auto entry = paused.emplace(folder->GetShare(), true).first;
        entry->second = entry->second && folder->GetPaused();
    }
    // The index, not the address: the vector grows.
    std::map<std::string, std::size_t> lines;
    for (const auto& [share, is_paused] : paused) {
        lines[share] = status.shares.size();
        status.shares.push_back(TakeShareLine(share, is_paused, status));
    }
    for (const auto& folder : folders.GetFolders()) {
        FolderLine& line = status.folders.emplace_back();
        line = {folder->GetPath(), folder->GetName(), folder->GetPaused(), FolderStatus(*folder)};
        Correct(line, status.shares[lines[folder->GetShare()]], status);
    }
    return status;
}

std::string StatusText(const Json::Value& status) {
    const std::string description = status["desc"].asString();
    return status["text"].asString() + (description.empty() ? "" : ": " + description);
}

Json::Value Status::OfFolder(const std::string& path) const {
    const auto found = std::find_if(folders.begin(), folders.end(),
                                    [&path](const FolderLine& line) { return line.path == path; });
    return found == folders.end() ? Json::Value(Json::objectValue) : found->status;
}

Json::Value ToJson(const Status& status) {
    Json::Value json(Json::objectValue);
    json["daemons"][kSearchDaemon.name] = status.search.IsUp();
    json["daemons"][kIndexer.name] = status.indexer.IsUp();
    json["daemons"][kMonitor.name] = status.monitor.IsUp();
    json["problems"] = ListOf(status.problems);
    json["share_problems"] = ListOf(status.share_problems);
    json["resume_time"] = Json::Int64{status.resume_time};
    json["finished"] = status.IsFinished() && !status.HasProblem();
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
