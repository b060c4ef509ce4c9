#include "programs/fileindexd/resident.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <deque>
#include <future>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

#include "base/path.h"
#include "base/private_directory.h"
#include "base/unique_fd.h"
#include "common/error.h"
#include "common/log.h"
#include "programs/daemon/frame_server.h"
#include "programs/daemon/program.h"
#include "programs/daemon/service_manager.h"
#include "programs/daemon/signals.h"
#include "programs/fileindexd/backlog.h"
#include "programs/fileindexd/controller.h"
#include "programs/fileindexd/state_file.h"
#include "sdk/share.h"

namespace fileindexd {

using quivra::Error;
using Clock = Controller::Clock;

namespace {

constexpr const char* kUnit = "fileindexd";

/// No command is long.
constexpr std::size_t kMaxRequest = 1024 * 1024;

/// So many are read by nobody.
constexpr std::size_t kMaxFailures = 10000;

/// Hands commands from the server's threads over to the one that supervises.
class CommandQueue {
  public:
    CommandQueue() : event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

    struct Entry {
        Command command;
        std::promise<std::string> reply;
    };

    /// Readable while there are entries.
    int Fd() const { return event_.Get(); }

    /// Waits for the reply, which is an error once the queue was closed.
    std::string Run(const Command& command) {
        std::future<std::string> reply;
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            if (closed_) {
                return ErrorReply(Error::kSystemCallFailed, "The daemon is stopping");
            }
            entries_.push_back({command, {}});
            reply = entries_.back().reply.get_future();
        }
        eventfd_write(event_.Get(), 1);
        return reply.get();
    }

    std::deque<Entry> Take() {
        eventfd_t count = 0;
        eventfd_read(event_.Get(), &count);
        const std::lock_guard<std::mutex> lock(mutex_);
        return std::exchange(entries_, {});
    }

    void Close() {
        const std::lock_guard<std::mutex> lock(mutex_);
        closed_ = true;
    }

  private:
    quivra::base::UniqueFd event_;
    std::mutex mutex_;
    std::deque<Entry> entries_;
    bool closed_ = false;
};

/// Read from the share's disk, which may be slow: not by the thread that supervises.
std::string ListFailures(const std::string& share) {
    const std::string queue = quivra::sdk::SDKShare(share).GetQueuePath();
    const auto directory =
        quivra::base::PrivateDirectory::Open(std::string(quivra::base::Directory(queue)));
    if (!directory.IsValid()) {
        return ErrorReply(Error::kSystemCallFailed, directory.Problem().empty()
                                                        ? "Cannot open " + directory.Path() + ": " +
                                                              quivra::SystemErrorText(errno)
                                                        : directory.Problem());
    }
    Json::Value list(Json::arrayValue);
    for (const Backlog::Failure& failure : Backlog::ReadFailures(directory, kMaxFailures)) {
        Json::Value entry;
        entry["path"] = failure.path;
        entry["reason"] = failure.reason;
        entry["since"] = Json::Int64(failure.since);
        entry["next_try"] = Json::Int64(failure.next_try);
        list.append(entry);
    }
    return DataReply(list);
}

/// Every request gets a reply: its client may hold a lock.
std::string Answer(CommandQueue& queue, const std::string& request) {
    try {
        const Command command = ParseCommand(request);
        return command.type == Command::Type::kFailed ? ListFailures(command.share)
                                                      : queue.Run(command);
    } catch (const Error& error) {
        return ErrorReply(error.code, error.reason);
    } catch (const std::exception& error) {
        return ErrorReply(Error::kSystemCallFailed, error.what());
    }
}

class Resident {
  public:
    explicit Resident(const std::vector<std::string>& worker_command)
        : signals_({SIGCHLD}),
          server_({.path = kDaemonSocketPath, .max_request = kMaxRequest},
                  [this](const std::string& request) { return Answer(commands_, request); }),
          supervisor_([worker_command](const std::string& share) {
              std::vector<std::string> command = worker_command;
              command.push_back(share);
              return command;
          }),
          controller_(supervisor_) {}

    void Run() {
        std::thread serving([this] { server_.Run(); });
        service_manager_.Ready();
        while (!stopping_ || !controller_.IsStopped()) {
            service_manager_.Turn(Clock::now());
            Wait();
            ReadSignals();
            for (CommandQueue::Entry& entry : commands_.Take()) {
                Execute(entry);
            }
            controller_.Update(Clock::now());
        }
        commands_.Close();
        for (CommandQueue::Entry& entry : commands_.Take()) {
            entry.reply.set_value(ErrorReply(Error::kSystemCallFailed, "The daemon is stopping"));
        }
        server_.Stop();
        serving.join();
    }

  private:
    void Wait() const {
        const Clock::time_point now = Clock::now();
        const Clock::time_point due = controller_.Due(now).value_or(Clock::time_point::max());
        pollfd descriptors[] = {{signals_.Fd(), POLLIN, 0}, {commands_.Fd(), POLLIN, 0}};
        poll(descriptors, 2, service_manager_.PollTimeout(due, now));
    }

    void ReadSignals() {
        const quivra::daemon::Signals::News news = signals_.Read();
        if (news.stop && !stopping_) {
            stopping_ = true;
            service_manager_.Stopping();
            // The workers notice the end of this process.
            quivra::daemon::EndAtLatest(quivra::daemon::kStopGrace);
            controller_.ShutDown(Clock::now());
        } else if (news.reload) {
            Reload();
        }
    }

    void Reload() {
        try {
            controller_.Reload(Clock::now());
        } catch (const std::exception& error) {
            quivra::LogError({kUnit, __LINE__}, "The settings cannot be read again: %s",
                             error.what());
        }
    }

    void Execute(CommandQueue::Entry& entry) {
        auto reply = std::make_shared<std::promise<std::string>>(std::move(entry.reply));
        try {
            controller_.Execute(
                entry.command, [reply](const std::string& text) { reply->set_value(text); },
                Clock::now());
        } catch (const Error& error) {
            quivra::LogError({kUnit, __LINE__}, "A command failed: %s", error.what());
            reply->set_value(ErrorReply(error.code, error.reason));
        } catch (const std::exception& error) {
            quivra::LogError({kUnit, __LINE__}, "A command failed: %s", error.what());
            reply->set_value(ErrorReply(Error::kSystemCallFailed, error.what()));
        }
    }

    const quivra::daemon::Signals signals_;
    quivra::daemon::ServiceManager service_manager_;
    CommandQueue commands_;
    quivra::daemon::FrameServer server_;
    Supervisor supervisor_;
    Controller controller_;
    bool stopping_ = false;
};

}  // namespace

void RunResident(const std::vector<std::string>& worker_command) {
    MakeRunDirectory();
    Resident(worker_command).Run();
}

}  // namespace fileindexd
