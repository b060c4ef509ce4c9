#include "programs/daemon/frame_server.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <exception>
#include <thread>
#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "programs/daemon/instance_lock.h"
#include "programs/daemon/program.h"

namespace quivra::daemon {
namespace {

using base::UniqueFd;

constexpr std::chrono::milliseconds kAcceptPause{100};

[[noreturn]] void FailCall(int line, const char* condition, const std::string& what) {
    const Error error(Error::kSystemCallFailed, what + ": " + SystemErrorText(errno));
    Fail({"frame_server", line}, condition, error);
}

UniqueFd MakeSocket() {
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!fd.IsValid()) {
        FailCall(__LINE__, "!fd.IsValid()", "socket failed");
    }
    return fd;
}

sockaddr_un MakeAddress(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof(address.sun_path)) {
        errno = ENAMETOOLONG;
        FailCall(__LINE__, "path.size() >= sizeof(address.sun_path)", path);
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

/// Clears the way for bind: removes what a dead server left at the path.
void RemoveStaleSocket(const sockaddr_un& address) {
    const std::string path = address.sun_path;
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0) {
        return;
    }
    if (!S_ISSOCK(status.st_mode)) {
        errno = EEXIST;
        FailCall(__LINE__, "!S_ISSOCK(status.st_mode)", path + " is not a socket");
    }
    const UniqueFd probe = MakeSocket();
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    if (connect(probe.Get(), generic, sizeof(address)) == 0 || errno == EAGAIN) {
        Fail({"frame_server", __LINE__}, "connect(probe, address) == 0",
             Error(Error::kLockFailed, "another server listens on " + path));
    }
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        FailCall(__LINE__, "unlink(path) != 0", "cannot remove " + path);
    }
}

bool IsPeerTrusted(int fd) {
    ucred peer{};
    socklen_t size = sizeof(peer);
    return getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0 &&
           (peer.uid == 0 || peer.uid == geteuid());
}

}  // namespace

FrameServer::FrameServer(FrameServerOptions options, Handler handler)
    : options_(std::move(options)),
      handler_(std::move(handler)),
      lock_(TakeInstanceLock(options_.path + ".lock")),
      epoll_(epoll_create1(EPOLL_CLOEXEC)),
      wake_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    if (!epoll_.IsValid() || !wake_.IsValid()) {
        FailCall(__LINE__, "!epoll_.IsValid() || !wake_.IsValid()", "no descriptor");
    }
    Watch(EPOLL_CTL_ADD, wake_.Get(), EPOLLIN);
    Listen();
}

FrameServer::~FrameServer() {
    unlink(options_.path.c_str());
}

void FrameServer::Listen() {
    const sockaddr_un address = MakeAddress(options_.path);
    RemoveStaleSocket(address);
    UniqueFd fd = MakeSocket();
    // Nobody can connect before listen, so the mode is right from a client's first attempt on.
    if (bind(fd.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        chmod(options_.path.c_str(), options_.mode) != 0 || listen(fd.Get(), SOMAXCONN) != 0) {
        FailCall(__LINE__, "bind(...) != 0 || chmod(...) != 0 || listen(...) != 0", options_.path);
    }
    listener_ = std::move(fd);
}

void FrameServer::Watch(int operation, int fd, unsigned int events) const {
    epoll_event event{};
    event.events = events;
    event.data.fd = fd;
    if (epoll_ctl(epoll_.Get(), operation, fd, &event) != 0) {
        FailCall(__LINE__, "epoll_ctl(...) != 0", "epoll_ctl failed");
    }
}

void FrameServer::Stop() noexcept {
    stop_ = true;
    Wake();
}

void FrameServer::Wake() noexcept {
    const int saved_errno = errno;
    const std::uint64_t one = 1;
    // The only failure, a full counter, wakes as well.
    [[maybe_unused]] const ssize_t written = write(wake_.Get(), &one, sizeof(one));
    errno = saved_errno;
}

void FrameServer::Run() {
    std::vector<std::jthread> workers;
    for (unsigned int i = 0; i < std::max(options_.workers, 1U); ++i) {
        workers.emplace_back([this](const std::stop_token& stop) { Work(stop); });
    }
    while (!stopping_ || connections_ > 0) {
        WaitAndDispatch();
    }
}

void FrameServer::RunMain(const Signals& signals, ServiceManager& manager) {
    // One loop for clients, signals and the service manager: what it tells is true of all.
    signals_ = &signals;
    manager_ = &manager;
    Watch(EPOLL_CTL_ADD, signals.Fd(), EPOLLIN);
    manager.Ready();
    Run();
    Watch(EPOLL_CTL_DEL, signals.Fd(), 0);
}

void FrameServer::ReadSignals() {
    if (signals_->Read().stop && !stop_) {
        manager_->Stopping();
        EndAtLatest(kStopGrace);
        stop_ = true;
    }
}

void FrameServer::WaitAndDispatch() {
    if (manager_ != nullptr) {
        manager_->Turn(Clock::now());
    }
    if (!stopping_ && !accepting_ && connections_ < options_.max_connections &&
        Clock::now() >= accept_again_) {
        want_wake_ = false;
        SetAccepting(true);
    }
    epoll_event events[64];
    const int ready = epoll_wait(epoll_.Get(), events, 64, PollTimeout());
    for (int i = 0; i < ready; ++i) {
        const int fd = events[i].data.fd;
        if (fd == wake_.Get()) {
            std::uint64_t count = 0;
            [[maybe_unused]] const ssize_t got = read(fd, &count, sizeof(count));
        } else if (signals_ != nullptr && fd == signals_->Fd()) {
            ReadSignals();
        } else if (fd == listener_.Get()) {
            Accept();
        } else {
            Advance(fd);
        }
    }
    TakeUnsent();
    if (stop_ && !stopping_) {
        BeginStop();
    }
    DropOverdue();
}

int FrameServer::PollTimeout() const {
    auto next = manager_ == nullptr ? Clock::time_point::max() : manager_->NextTurn();
    for (const auto& [fd, connection] : watched_) {
        next = std::min(next, connection->Deadline());
    }
    const Clock::time_point now = Clock::now();
    if (!accepting_ && accept_again_ > now) {
        next = std::min(next, accept_again_);
    }
    if (next == Clock::time_point::max()) {
        return -1;
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(next - now).count();
    return static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
}

void FrameServer::BeginStop() {
    stopping_ = true;
    SetAccepting(false);
    listener_.Reset();
    want_wake_ = true;  // the loop ends with the last connection
    const Clock::time_point now = Clock::now();
    const Clock::time_point latest = now + kStopGrace;
    for (const auto& [fd, connection] : watched_) {
        connection->LimitDeadline(connection->HasReply() ? latest : now);
    }
    std::deque<ConnectionPtr> not_started;
    const std::lock_guard lock(mutex_);
    not_started.swap(work_);
}

void FrameServer::SetAccepting(bool accepting) {
    if (accepting != accepting_) {
        Watch(accepting ? EPOLL_CTL_ADD : EPOLL_CTL_DEL, listener_.Get(), EPOLLIN);
        accepting_ = accepting;
    }
}

void FrameServer::Accept() {
    while (connections_ < options_.max_connections) {
        if (!AcceptOne()) {
            return;
        }
    }
    want_wake_ = true;
    if (connections_ >= options_.max_connections) {  // none ended before it knew to wake us
        SetAccepting(false);
    }
}

/// False when nobody waits, or nobody can be taken in for now.
bool FrameServer::AcceptOne() {
    UniqueFd fd(accept4(listener_.Get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!fd.IsValid()) {
        if (errno == EINTR || errno == ECONNABORTED) {
            return true;
        }
        if (errno != EAGAIN && errno != EWOULDBLOCK) {
            LogError({"frame_server", __LINE__}, "accept on %s", options_.path.c_str());
            SetAccepting(false);  // out of descriptors: the pending client would wake us for ever
            accept_again_ = Clock::now() + kAcceptPause;
        }
        return false;
    }
    if (!IsPeerTrusted(fd.Get())) {
        return true;
    }
    ++connections_;
    MoveOn(ConnectionPtr(new FrameConnection(std::move(fd), Clock::now() + options_.read_timeout),
                         {this}));
    return true;
}

void FrameServer::Advance(int fd) {
    if (ConnectionPtr connection = Unwatch(fd)) {
        MoveOn(std::move(connection));
    }
}

FrameServer::ConnectionPtr FrameServer::Unwatch(int fd) {
    const auto found = watched_.find(fd);
    if (found == watched_.end()) {
        return {nullptr, {this}};
    }
    ConnectionPtr connection = std::move(found->second);
    watched_.erase(found);
    buffered_ -= connection->HasReply() ? 0 : connection->Text().size();
    Watch(EPOLL_CTL_DEL, fd, 0);
    return connection;
}

/// Takes the connection as far as it goes without waiting: to the workers, to its end, or among
/// those whose clients are to act next.
void FrameServer::MoveOn(ConnectionPtr connection) {
    using Progress = FrameConnection::Progress;
    try {
        const bool replying = connection->HasReply();
        const Progress progress = replying ? connection->Write() : ReadRequest(*connection);
        if (progress == Progress::kPending) {
            const int fd = connection->Fd();
            Watch(EPOLL_CTL_ADD, fd, replying ? EPOLLOUT : EPOLLIN);
            buffered_ += replying ? 0 : connection->Text().size();
            watched_.emplace(fd, std::move(connection));
        } else if (progress == Progress::kDone && !replying) {
            const std::lock_guard lock(mutex_);
            work_.push_back(std::move(connection));
            work_ready_.notify_one();
        }
    } catch (const std::exception& error) {
        LogError({"frame_server", __LINE__}, "connection dropped: %s", error.what());
    }
}

FrameConnection::Progress FrameServer::ReadRequest(FrameConnection& connection) const {
    const FrameConnection::Progress progress = connection.Read(options_.max_request);
    const bool fits = buffered_ + connection.Text().size() <= options_.max_buffered;
    return fits ? progress : FrameConnection::Progress::kFailed;
}

void FrameServer::DropOverdue() {
    const Clock::time_point now = Clock::now();
    for (auto next = watched_.begin(); next != watched_.end();) {
        const auto& [fd, connection] = *next++;
        if (connection->Deadline() <= now) {
            Unwatch(fd);
        }
    }
}

void FrameServer::TakeUnsent() {
    std::deque<ConnectionPtr> unsent;
    {
        const std::lock_guard lock(mutex_);
        unsent.swap(unsent_);
    }
    for (ConnectionPtr& connection : unsent) {
        MoveOn(std::move(connection));
    }
}

void FrameServer::Work(const std::stop_token& stop) {
    while (true) {
        std::unique_lock lock(mutex_);
        if (!work_ready_.wait(lock, stop, [this] { return !work_.empty(); })) {
            return;
        }
        ConnectionPtr connection = std::move(work_.front());
        work_.pop_front();
        lock.unlock();
        try {
            Handle(std::move(connection));
        } catch (const std::exception& error) {
            LogError({"frame_server", __LINE__}, "no reply: %s", error.what());
        }
    }
}

void FrameServer::Handle(ConnectionPtr connection) {
    std::string reply = handler_(connection->Text());
    if (reply.size() > options_.max_reply) {
        throw Error(Error::kSystemCallFailed, "the reply is too long");
    }
    const std::chrono::milliseconds patience =
        stop_ ? std::min<std::chrono::milliseconds>(options_.write_timeout, kStopGrace)
              : options_.write_timeout;
    connection->SetReply(std::move(reply), Clock::now() + patience);
    // Most replies fit into the socket's buffer: no detour through the waiting thread.
    if (connection->Write() == FrameConnection::Progress::kPending) {
        {
            const std::lock_guard lock(mutex_);
            unsent_.push_back(std::move(connection));
        }
        Wake();
    }
}

void FrameServer::EndConnection::operator()(FrameConnection* connection) const {
    delete connection;
    --server->connections_;
    if (server->want_wake_) {
        server->Wake();
    }
}

}  // namespace quivra::daemon
