#include "programs/fileindexctl/waiting.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <exception>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <string_view>
#include <thread>
#include <utility>

#include "base/frame.h"
#include "programs/fileindexctl/daemons.h"

namespace quivra::ctl {
namespace {

using Clock = std::chrono::steady_clock;
constexpr std::chrono::milliseconds kLook(200);
/// Between the last byte of a reply and the closing of its connection, and while a daemon is
/// restarted, things look for a moment as if it had gone.
constexpr std::chrono::seconds kGoneFor(1);
constexpr std::chrono::seconds kTellAfter(10);
/// Where the library's own connections are: descriptors are given out from the lowest on.
constexpr int kMaxDescriptor = 256;

/// The thread's side outlives the command that gave it up.
struct Call {
    std::mutex mutex;
    std::condition_variable ended;
    bool has_ended = false;
    std::exception_ptr failure;
};

void Make(const std::shared_ptr<Call>& call, const std::function<void()>& body) {
    std::exception_ptr failure;
    try {
        body();
    } catch (...) {
        failure = std::current_exception();
    }
    const std::lock_guard lock(call->mutex);
    call->failure = failure;
    call->has_ended = true;
    call->ended.notify_all();
}

/// The descriptor of this process's connection to the daemon, -1 for none.
int ConnectionTo(const Daemon& daemon) {
    for (int fd = 0; fd < kMaxDescriptor; ++fd) {
        sockaddr_un peer{};
        socklen_t size = sizeof(peer);
        if (getpeername(fd, reinterpret_cast<sockaddr*>(&peer), &size) == 0 &&
            peer.sun_family == AF_UNIX && size > offsetof(sockaddr_un, sun_path) &&
            std::string_view(peer.sun_path) == daemon.socket) {
            return fd;
        }
    }
    return -1;
}

/// Whether the other side has closed the connection and left nothing to be read. It is only looked
/// at: should the number belong to another socket meanwhile, nothing is taken from that.
bool IsAtItsEnd(int fd) {
    char byte = 0;
    const ssize_t size = recv(fd, &byte, 1, MSG_PEEK | MSG_DONTWAIT);
    return size == 0 || (size < 0 && errno == ECONNRESET);
}

bool HasClosed(const Daemon& daemon) {
    const int fd = ConnectionTo(daemon);
    return fd >= 0 && IsAtItsEnd(fd);
}

/// Asked of the socket, because between two attempts the library holds no connection.
bool IsAway(const Daemon& daemon) {
    return !base::ConnectUnix(daemon.socket, Clock::now() + kLook).IsValid() &&
           (errno == ENOENT || errno == ECONNREFUSED);
}

/// Something that must have been so for a while before it counts.
class Lasting {
  public:
    bool Holds(bool now) {
        if (!now) {
            since_ = Clock::time_point::max();
        } else if (since_ == Clock::time_point::max()) {
            since_ = Clock::now();
        }
        return now && Clock::now() - since_ >= kGoneFor;
    }

  private:
    Clock::time_point since_ = Clock::time_point::max();
};

void TellWaiting(const Session& session) {
    const char* what = ConnectionTo(kIndexer) >= 0 ? "still waiting for fileindexd"
                       : ConnectionTo(kSearchDaemon) >= 0
                           ? "still waiting for kestoelasticd"
                           : "still waiting: another command holds a lock, or "
                             "kestoelasticd is busy and asked again in a quarter "
                             "of an hour";
    session.err << "fileindexctl: " << what << "; Ctrl-C gives up\n" << std::flush;
}

[[noreturn]] void GiveUp(Session& session, const Daemon& daemon) {
    session.given_up = true;
    throw GivenUp(std::string(daemon.name) +
                  " has gone while the command waited for it; start it with 'service " +
                  daemon.service + " start'");
}

}  // namespace

void WaitFor(Session& session, Needs needs, std::function<void()> body) {
    const auto call = std::make_shared<Call>();
    // A child process would be easier to end; but its changes of what this process knows (the
    // services' state, a test's fakes) would be lost with it.
    std::thread thread([call, body = std::move(body)] { Make(call, body); });
    const Clock::time_point begin = Clock::now();
    bool told = false;
    Lasting indexer_closed;
    Lasting search_away;
    bool search_was_there = false;  // else the library finds out by itself
    std::unique_lock lock(call->mutex);
    // Nearly all calls end within the first look: they pay for a thread, some tens of microseconds.
    while (!call->ended.wait_for(lock, kLook, [&] { return call->has_ended; })) {
        lock.unlock();
        const bool indexer_gone = indexer_closed.Holds(HasClosed(kIndexer));
        const bool is_away = needs == Needs::kBothDaemons && IsAway(kSearchDaemon);
        search_was_there = search_was_there || !is_away;
        const bool search_gone = search_was_there && search_away.Holds(is_away);
        if (indexer_gone || search_gone) {
            thread.detach();
            GiveUp(session, indexer_gone ? kIndexer : kSearchDaemon);
        }
        if (!told && Clock::now() - begin >= kTellAfter) {
            told = true;
            TellWaiting(session);
        }
        lock.lock();
    }
    lock.unlock();
    thread.join();
    if (call->failure != nullptr) {
        std::rethrow_exception(call->failure);
    }
}

}  // namespace quivra::ctl
