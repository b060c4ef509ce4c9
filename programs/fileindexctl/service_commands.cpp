#include <array>
#include <ctime>
#include <limits>
#include <memory>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/output.h"
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
        std::array<char, 64> text{};
        const std::time_t time = static_cast<std::time_t>(resume_time);
        std::tm local{};
        localtime_r(&time, &local);
        std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", &local);
        session.out << "Indexing is paused until " << text.data() << ".\n";
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
    session.doing = Untold(doing);
    try {
        WaitFor(session, Needs::kIndexer, [change] {
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

int Prepare(Session& session) {
    session.doing = "prepare the services";
    {
        const Silence silence;
        fileindex::PrepareServices();
    }
    if (session.json) {
        session.out << "{\"done\":\"prepare\"}\n";
    } else {
        session.out << "Told the services; what failed is in the system log.\n";
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
                                    "  fileindexctl services prepare");
    CLI::App& prepare = line.AddCommand(
        group, "prepare", "Start the services when a folder is indexed, else stop them",
        "  fileindexctl services prepare");
    line.OnCommand(prepare, Prepare);
}

}  // namespace quivra::ctl
