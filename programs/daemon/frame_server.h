#pragma once

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <stop_token>
#include <string>
#include <unordered_map>

#include "base/unique_fd.h"
#include "programs/daemon/frame_connection.h"
#include "programs/daemon/service_manager.h"
#include "programs/daemon/signals.h"

namespace quivra::daemon {

struct FrameServerOptions {
    std::string path;                                 ///< of the Unix socket; its directory exists
    mode_t mode = 0600;                               ///< of the socket file
    std::size_t max_request = base::kMaxFrameSize;    ///< bytes; longer frames are refused
    std::size_t max_reply = base::kMaxFrameSize;      ///< bytes; a longer reply is not sent
    std::size_t max_buffered = std::size_t{3} << 29;  ///< bytes of all requests being received
    std::size_t max_connections = 256;  ///< further clients wait in the kernel's backlog
    unsigned int workers = 4;           ///< requests handled at the same time
    std::chrono::milliseconds read_timeout{30000};   ///< from the connection to the whole request
    std::chrono::milliseconds write_timeout{30000};  ///< from the reply to its last byte
};

/// A server of one request frame and one reply frame (base/frame.h) per connection on a Unix stream
/// socket. One thread does all the waiting for
/// clients, so that a slow or silent one holds up nobody; a fixed pool of workers runs the handler.
/// Only clients of the same user, or of root, are served.
class FrameServer {
  public:
    /// Turns a request's text into the reply's. Called from several workers at once. When it
    /// throws, the client's connection is closed without a reply.
    using Handler = std::function<std::string(const std::string& request)>;

    /// Binds the socket and listens: clients may connect from now on. A socket file that a dead
    /// server left is replaced. Throws Error 506 when another server is alive there, 502 when the
    /// socket cannot be made (a file of another kind at the path is never removed).
    FrameServer(FrameServerOptions options, Handler handler);

    /// Removes the socket file. Run must have returned.
    ~FrameServer();
    FrameServer(const FrameServer&) = delete;
    FrameServer& operator=(const FrameServer&) = delete;

    /// Serves until Stop. Requests that are being handled then are finished, and their replies sent
    /// as far as their clients take them within kStopGrace; all others are dropped.
    void Run();

    /// The same as a daemon's main loop: tells the service manager that it serves and that it
    /// turns, and stops at a stop signal. The process ends with status 0 when requests that are
    /// being handled take longer than kStopGrace then. SIGHUP is ignored.
    void RunMain(const Signals& signals, ServiceManager& manager);

    /// Makes Run return; before Run, it makes that return at once. Safe from any thread and from a
    /// signal handler.
    void Stop() noexcept;

  private:
    using Clock = FrameConnection::Clock;
    /// Counts a connection out, wherever it ends.
    struct EndConnection {
        FrameServer* server;
        void operator()(FrameConnection* connection) const;
    };
    using ConnectionPtr = std::unique_ptr<FrameConnection, EndConnection>;

    void Listen();
    void Watch(int operation, int fd, unsigned int events) const;
    void WaitAndDispatch();
    void ReadSignals();
    int PollTimeout() const;
    void BeginStop();
    void Wake() noexcept;

    void Accept();
    bool AcceptOne();
    void SetAccepting(bool accepting);
    void Advance(int fd);
    void MoveOn(ConnectionPtr connection);
    FrameConnection::Progress ReadRequest(FrameConnection& connection) const;
    ConnectionPtr Unwatch(int fd);
    void DropOverdue();
    void TakeUnsent();

    void Work(const std::stop_token& stop);
    void Handle(ConnectionPtr connection);

    const FrameServerOptions options_;
    const Handler handler_;
    base::UniqueFd lock_;
    base::UniqueFd listener_;
    base::UniqueFd epoll_;
    base::UniqueFd wake_;
    std::atomic<bool> stop_ = false;

    // Only the thread of Run uses these.
    std::unordered_map<int, ConnectionPtr> watched_;  ///< waiting for their clients, by descriptor
    std::size_t buffered_ = 0;                        ///< bytes of the requests in watched_
    const Signals* signals_ = nullptr;                ///< of RunMain
    ServiceManager* manager_ = nullptr;               ///< of RunMain
    bool accepting_ = false;
    bool stopping_ = false;
    Clock::time_point accept_again_{};

    // Shared with the workers.
    std::atomic<std::size_t> connections_ = 0;
    std::atomic<bool> want_wake_ = false;  ///< Run waits for a connection to end
    std::mutex mutex_;
    std::condition_variable_any work_ready_;
    std::deque<ConnectionPtr> work_;    ///< whole requests
    std::deque<ConnectionPtr> unsent_;  ///< replies that their clients did not take at once
};

}  // namespace quivra::daemon
