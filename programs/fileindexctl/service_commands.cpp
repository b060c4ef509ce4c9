#include <chrono>
#include <ctime>
#include <limits>
#include <memory>
#include <ostream>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/daemons.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/output.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"
#include "programs/fileindexctl/waiting.h"

namespace quivra::ctl {
namespace {

constexpr int kSecondsPerHour = 3600;

/// The status file counts in 32 bits: a longer pause would wrap into the past.
int LongestPause() {
    const std::int64_t left = std::numeric_limits<std::int32_t>::max() - std::time(nullptr);
    return static_cast<int>(left / kSecondsPerHour);
}

/// Tells the state that was reached, in local time.
void PrintPause(Session& session, std::int64_t resume_time) {
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["resume_time"] = resume_time;
        session.out << toString(result) << "\n";
    } else if (resume_time == fileindex::kNotPaused) {
        session.out << "Indexing goes on.\n";
    } else if (resume_time == fileindex::kPausedWithoutEnd) {
        session.out << "Indexing is paused until 'fileindexctl resume'.\n";
    } else {
        session.out << "Indexing is paused until " << LocalTime(resume_time) << ".\n";
    }
}

/// What is recorded holds even if the daemon could not be told.
std::string Untold(const std::string& doing) {
    return "tell fileindexd to " + doing +
           " (it is recorded, and holds from the daemon's next start on)";
}

/// The daemon is told after the change has been saved, so only a failure to tell it leaves the
/// change recorded.
template <typename Change>
int ChangePause(Session& session, Change change) {
    const std::string doing = session.doing;
    // In advance, for a daemon that goes in the middle of the exchange: the save comes before it.
    session.doing = Untold(doing);
    try {
        WaitFor(session, Needs::kIndexingDaemon, [change] {
            fileindex::StatusMgr status;
            change(status);
        });
    } catch (const Error& error) {
        session.doing = IsIndexerAway(error) ? Untold(doing) : doing;
        throw;
    }
    PrintPause(session, fileindex::StatusMgr().GetPauseInfo());
    return kSuccess;
}

int Pause(int hours, Session& session) {
    if (hours < 0 || hours > LongestPause()) {
        throw WrongCall("a pause has 1 to " + std::to_string(LongestPause()) +
                        " hours; without HOURS it has no end");
    }
    session.doing = "pause indexing";
    return ChangePause(session, [hours](fileindex::StatusMgr& status) { status.Pause(hours); });
}

int Resume(Session& session) {
    session.doing = "resume indexing";
    return ChangePause(session, [](fileindex::StatusMgr& status) { status.Resume(); });
}

/// What the daemon tells beyond that it runs.
std::string Detail(const Daemon& daemon, const DaemonState& state) {
    const std::string problem = DescribeProblem(daemon, state);
    if (!problem.empty()) {
        return problem;
    }
    const Json::Value& data = state.data;
    if (data["problem"].isString() && !data["problem"].asString().empty()) {
        return data["problem"].asString();
    }
    if (data["backend"].isString()) {
        const Json::Value& last = data["last_event"];
        return data["backend"].asString() + ", " +
               Number(data["folders"].size(), "share", "shares") + ", " +
               (data["overflows"].isUInt64()
                    ? Number(data["overflows"].asUInt64(), "overflow", "overflows")
                    : "overflows unknown") +
               (last.isInt64() && last.asInt64() >= 0
                    ? ", last event " + Duration(last.asInt64()) + " ago"
                    : ", no event yet");
    }
    return data["indexes"].isArray() ? Number(data["indexes"].size(), "index", "indexes")
                                     : Number(data["shares"].size(), "share", "shares");
}

Json::Value ToJson(const Daemon& daemon, const DaemonState& state) {
    Json::Value json(Json::objectValue);
    json["name"] = daemon.name;
    json["service"] = daemon.service;
    json["up"] = state.IsUp();
    json["detail"] = Detail(daemon, state);
    json["state"] = state.data;
    return json;
}

int ListServices(Session& session) {
    session.doing = "list the services";
    const bool needed = !fileindex::FolderMgr().GetFolders().empty();
    bool all_up = true;
    Json::Value list(Json::arrayValue);
    std::vector<std::vector<std::string>> rows = {{"DAEMON", "STATE", "DETAIL"}};
    for (const Daemon* daemon : {&kSearchDaemon, &kIndexer, &kMonitor}) {
        const DaemonState state = AskState(*daemon);
        all_up = all_up && state.IsUp();
        list.append(ToJson(*daemon, state));
        rows.push_back({daemon->name,
                        state.IsUp()                                     ? "running"
                        : state.reach == DaemonState::Reach::kNotRunning ? "not running"
                                                                         : "does not reply",
                        Detail(*daemon, state)});
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["services"] = list;
        session.out << toString(result) << "\n";
    } else {
        PrintTable(session, rows);
    }
    return all_up || !needed ? kSuccess : kFailure;
}

/// A service manager may take a moment; the library only logs what it could not start or stop.
bool BecomesUp(bool wanted) {
    constexpr int kLooks = 10;
    for (int look = 0; look < kLooks; ++look) {
        if (AskState(kIndexer).IsUp() == wanted) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(500));
    }
    return false;
}

int Prepare(Session& session) {
    session.doing = "prepare the services";
    const bool needed = !fileindex::FolderMgr().GetFolders().empty();
    {
        const Silence silence;
        fileindex::PrepareServices();
    }
    if (!BecomesUp(needed)) {
        throw Failure(needed ? "fileindexd could not be started: is there a service manager, and "
                               "the service pkg-Quivra-fileindexd? The system log tells more"
                             : "fileindexd still runs: it was not started as the service "
                               "pkg-Quivra-fileindexd, or that cannot be stopped");
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["done"] = "prepare";
        result["running"] = needed;
        session.out << toString(result) << "\n";
    } else {
        session.out << (needed ? "The services run.\n"
                               : "The services are stopped: no folder is indexed.\n");
    }
    return kSuccess;
}

}  // namespace

void AddServiceCommands(CommandLine& line) {
    CLI::App& pause = line.AddCommand(line.Root(), "pause", "Pause all indexing for a time",
                                      "  fileindexctl pause      until 'fileindexctl resume'\n"
                                      "  fileindexctl pause 8    for eight hours");
    auto hours = std::make_shared<int>(0);
    pause.add_option("HOURS", *hours, "Number of hours; without end when left out");
    line.OnCommand(pause, [hours](Session& session) { return Pause(*hours, session); });
    CLI::App& resume = line.AddCommand(line.Root(), "resume", "End a pause of all indexing",
                                       "  fileindexctl resume");
    line.OnCommand(resume, Resume);

    CLI::App& group = line.AddGroup("services", "Handle the services that indexing needs",
                                    "  fileindexctl services list\n"
                                    "  fileindexctl services prepare");
    CLI::App& list = line.AddCommand(group, "list", "Show the daemons and what each says of itself",
                                     "  fileindexctl services list\n"
                                     "  fileindexctl services list --json | jq '.services[].up'");
    line.OnCommand(list, ListServices);
    CLI::App& prepare = line.AddCommand(
        group, "prepare", "Start the services when a folder is indexed, else stop them",
        "  fileindexctl services prepare");
    line.OnCommand(prepare, Prepare);
}

}  // namespace quivra::ctl
