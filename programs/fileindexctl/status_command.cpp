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
#include "programs/fileindexctl/folder_status.h"
#include "programs/fileindexctl/share_status.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

constexpr std::chrono::seconds kInterval(1);
constexpr unsigned int kBarWidth = 24;

struct Options {
    bool watch = false;
    bool until_finished = false;
};

std::string Number(std::uint64_t value, const char* one, const char* many) {
    return std::to_string(value) + " " + (value == 1 ? one : many);
}

/// The bar is for eyes; a program finds the two numbers.
std::string Progress(const WorkerStatus& worker, const Session& session) {
    const std::string counts = std::to_string(worker.done) + " of " + std::to_string(worker.total);
    if (!session.out_is_terminal || worker.total == 0) {
        return counts;
    }
    const double share = static_cast<double>(worker.done) / static_cast<double>(worker.total);
    return ProgressBar(share, kBarWidth) + " " + counts;
}

void PrintShare(const ShareLine& share, Session& session) {
    const std::uint64_t pending = share.queue_lines + share.working_lines;
    session.out << "  " << Shown(share.name) << ": "
                << (share.documents < 0 ? "documents unknown"
                                        : Number(static_cast<std::uint64_t>(share.documents),
                                                 "document", "documents"))
                << ", " << Number(pending, "change", "changes") << " waiting";
    if (share.worker.running) {
        session.out << ", " << Shown(share.worker.state);
    } else {
        session.out << ", no worker";
    }
    session.out << "\n";
    if (share.worker.running && share.worker.state == "processing") {
        session.out << "    " << Progress(share.worker, session) << "  "
                    << Shown(share.worker.current) << "\n";
    }
    for (const std::string& error : {share.worker.last_error, share.error}) {
        if (!error.empty()) {
            session.out << "    last error: " << Shown(error) << "\n";
        }
    }
}

void PrintFolders(const Status& status, Session& session) {
    std::vector<std::vector<std::string>> rows = {{"FOLDER", "NAME", "STATUS"}};
    for (const FolderLine& folder : status.folders) {
        rows.push_back({folder.path, folder.name,
                        StatusText(folder.status) + (folder.paused ? " (share paused)" : "")});
    }
    PrintTable(session, rows);
}

/// What stops the whole system comes first.
void PrintDaemons(const Status& status, Session& session) {
    if (!status.elastic_answers) {
        session.out << "kestoelasticd does not answer: nothing can be found until it runs.\n";
    }
    if (!status.indexer_answers) {
        session.out << "fileindexd does not answer: changes wait in the queues until it runs.\n";
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
    PrintDaemons(status, session);
    if (status.folders.empty()) {
        session.out << "Nothing is indexed; choose a folder with 'fileindexctl folder add PATH'.\n";
        return;
    }
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

int StatusCommand(const Options& options, Session& session) {
    session.doing = "tell the status";
    const bool watch = options.watch || options.until_finished;
    Screen screen(session);
    while (true) {
        const Status status = TakeStatus();
        const std::string text = Rendered(status, session);
        if (!watch) {
            session.out << text;
            return kSuccess;
        }
        screen.Draw(text);
        if (options.until_finished && status.IsFinished()) {
            return status.HasError() ? kFailure : kSuccess;
        }
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
        "  fileindexctl status --watch --until-finished    for scripts: 1 when a folder has an "
        "error\n"
        "  fileindexctl status --json | jq '.share[].documents'");
    auto options = std::make_shared<Options>();
    command.add_flag("--watch", options->watch, "Show it again every second");
    command.add_flag("--until-finished", options->until_finished,
                     "Watch until nothing is left to do");
    line.OnCommand(command,
                   [options](Session& session) { return StatusCommand(*options, session); });
}

}  // namespace quivra::ctl
