#include <algorithm>
#include <chrono>
#include <ctime>
#include <memory>
#include <ostream>
#include <sstream>
#include <thread>

#include "common/json.h"
#include "fileindex/status_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/status.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

constexpr std::chrono::milliseconds kInterval(500);
constexpr unsigned int kBarWidth = 24;

struct Options {
    bool watch = false;
    bool until_finished = false;
};

/// The bar is for eyes; a program finds the two numbers.
std::string Progress(const ShareLine& share, const Session& session) {
    const std::string counts = std::to_string(share.done) + " of " + std::to_string(share.total);
    if (!session.out_is_terminal || share.total == 0) {
        return counts;
    }
    const double part = static_cast<double>(share.done) / static_cast<double>(share.total);
    return ProgressBar(part, kBarWidth) + " " + counts;
}

/// "120 files of 3.2 MB waiting (contents), about 2 minutes left"; empty when nothing waits.
std::string Backlog(const ShareLine& share) {
    if (share.waiting == 0) {
        return share.phase.empty() ? "" : "working through " + Shown(share.phase);
    }
    std::string text = Number(share.waiting, "file", "files");
    text += share.waiting_bytes == 0 ? "" : " of " + Bytes(share.waiting_bytes);
    text += " waiting";
    text += share.phase.empty() ? "" : " (" + Shown(share.phase) + ")";
    return share.eta < 0 ? text : text + ", about " + Duration(share.eta) + " left";
}

void PrintShare(const ShareLine& share, Session& session) {
    session.out << "  " << Shown(share.name) << ": "
                << (share.documents < 0 ? "documents unknown"
                                        : Number(static_cast<std::uint64_t>(share.documents),
                                                 "document", "documents"))
                << ", " << Number(share.queue_lines + share.working_lines, "change", "changes")
                << " waiting, " << (share.has_worker ? Shown(share.state) : "no worker") << "\n";
    if (share.has_worker && share.state == "processing") {
        session.out << "    " << Progress(share, session) << "  " << Shown(share.current) << "\n";
    }
    const std::string backlog = Backlog(share);
    if (!backlog.empty()) {
        session.out << "    " << backlog << "\n";
    }
    if (share.failed > 0) {
        session.out << "    " << Number(share.failed, "file", "files")
                    << " without content, see 'fileindexctl failed " << Shown(share.name) << "'\n";
    }
    for (const std::string& problem : share.problems) {
        session.out << "    problem: " << Shown(problem) << "\n";
    }
    if (!share.last_error.empty()) {
        session.out << "    last error: " << Shown(share.last_error) << "\n";
    }
}

void PrintFolders(const Status& status, Session& session) {
    std::vector<std::vector<std::string>> rows = {{"FOLDER", "NAME", "STATUS"}};
    for (const FolderLine& folder : status.folders) {
        rows.push_back({folder.path, folder.name, StatusText(folder.status)});
    }
    PrintTable(session, rows);
}

/// What stops the whole system comes first.
void PrintDaemons(const Status& status, Session& session) {
    for (const std::string& problem : status.problems) {
        session.out << Shown(problem) << "\n";
    }
    if (status.resume_time == fileindex::kPausedWithoutEnd) {
        session.out << "All indexing is paused until 'fileindexctl resume'.\n";
    } else if (std::time(nullptr) < status.resume_time) {
        session.out << "All indexing is paused for "
                    << Number(static_cast<std::uint64_t>(
                                  (status.resume_time - std::time(nullptr) + 59) / 60),
                              "more minute", "more minutes")
                    << "; 'fileindexctl resume' ends that.\n";
    }
}

void PrintStatus(const Status& status, Session& session) {
    for (const std::string& problem : status.share_problems) {
        session.out << Shown(problem) << "\n";
    }
    if (status.folders.empty()) {
        session.out << "Nothing is indexed; choose a folder with 'fileindexctl folder add PATH'.\n";
        return;
    }
    PrintDaemons(status, session);
    PrintFolders(status, session);
    session.out << "Shares:\n";
    for (const ShareLine& share : status.shares) {
        PrintShare(share, session);
    }
}

/// The frame as text, so that the screen knows its lines before it draws.
std::string Rendered(const Status& status, const Session& session) {
    std::ostringstream text;
    if (session.json) {
        text << toString(ToJson(status)) << "\n";
        return text.str();
    }
    Session inner{.out = text, .err = session.err};
    inner.out_is_terminal = session.out_is_terminal;
    PrintStatus(status, inner);
    return text.str();
}

/// At most `cells` characters; the frame is counted in lines, so none may wrap.
std::string CutLine(const std::string& line, std::size_t cells) {
    std::size_t end = 0;
    for (std::size_t seen = 0; end < line.size(); ++end) {
        const bool begins = (static_cast<unsigned char>(line[end]) & 0xC0U) != 0x80U;
        if (begins && ++seen > cells) {
            break;
        }
    }
    return line.substr(0, end);
}

/// Replaces what it drew before on a terminal; elsewhere prints what differs from the last time.
class Screen {
  public:
    explicit Screen(Session& session) : session_(session) {}

    void Draw(const std::string& text) {
        if (!session_.out_is_terminal || session_.json) {
            session_.out << (text == last_ ? "" : text) << std::flush;
            last_ = text;
            return;
        }
        if (lines_ > 0) {
            session_.out << "\x1b[" << lines_ << "A";
        }
        session_.out << "\r\x1b[J";
        lines_ = 0;
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            if (lines_ + 2 >= session_.rows) {
                session_.out << "...\n";
                ++lines_;
                break;
            }
            session_.out << CutLine(line, session_.columns) << "\n";
            ++lines_;
        }
        session_.out << std::flush;
    }

  private:
    Session& session_;
    std::string last_;
    unsigned int lines_ = 0;
};

/// Ends a wait that cannot come to its end. A daemon that is being started gets some time; one
/// that was there and has gone is noticed within two seconds.
class Patience {
  public:
    /// To be asked at each look, kInterval apart.
    bool IsOver(const Status& status) {
        // Where nothing is indexed, nothing has to run.
        if (status.folders.empty()) {
            return false;
        }
        const bool daemons_up = status.AreDaemonsUp();
        were_up_ = were_up_ || daemons_up;
        const bool is_stuck = !daemons_up || (status.IsFinished() && status.HasProblem());
        looks_ = is_stuck ? looks_ + 1 : 0;
        // Three looks are a second and more: a problem that a daemon is about to mend, such as a
        // folder that it has just been told of, has passed by then.
        return looks_ > (were_up_ ? 2 : 10);
    }

  private:
    bool were_up_ = false;
    int looks_ = 0;
};

/// The reason why "until finished" ends without that.
std::string WhyUnfinished(const Status& status) {
    if (!status.problems.empty()) {
        return status.problems.front();
    }
    for (const FolderLine& folder : status.folders) {
        const std::string text = folder.status["text"].asString();
        if (text == "error" || text == "incomplete") {
            return folder.path + " is not finished: " + StatusText(folder.status);
        }
    }
    return "a share has a problem";
}

int StatusCommand(const Options& options, Session& session) {
    session.doing = "tell the status";
    Screen screen(session);
    Patience patience;
    while (true) {
        const Status status = TakeStatus();
        const std::string text = Rendered(status, session);
        if (!options.watch && !options.until_finished) {
            session.out << text;
            return status.HasProblem() ? kFailure : kSuccess;
        }
        screen.Draw(text);
        if (options.until_finished && status.IsFinished() && !status.HasProblem()) {
            return kSuccess;
        }
        if (options.until_finished && patience.IsOver(status)) {
            throw Failure(WhyUnfinished(status));
        }
        // Only after the checks: a reader that has gone must not hide how it ended.
        if (!session.out) {
            return kSuccess;  // the reader has gone
        }
        std::this_thread::sleep_for(kInterval);
    }
}

}  // namespace

void AddStatusCommand(CommandLine& line) {
    CLI::App& command = line.AddCommand(
        line.Root(), "status", "Show what is indexed and what is still to do",
        "  fileindexctl status\n"
        "  fileindexctl status --watch                     until Ctrl-C\n"
        "  fileindexctl status --watch --until-finished    for scripts: 1 when that cannot be\n"
        "  fileindexctl status --json | jq '.share[].documents'");
    auto options = std::make_shared<Options>();
    command.add_flag("--watch", options->watch, "Show it again and again");
    command.add_flag(
        "--until-finished", options->until_finished,
        "Watch until nothing is left to do; fail when a daemon has gone or a folder has an "
        "error");
    line.OnCommand(command,
                   [options](Session& session) { return StatusCommand(*options, session); });
}

}  // namespace quivra::ctl
