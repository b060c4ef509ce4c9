#include "base/frame.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace quivra::base {
namespace {

constexpr std::size_t kReceiveChunk = std::size_t{1} << 20;

/// Waits until the socket is ready. False at the deadline, and when polling fails.
bool WaitFor(int socket, short events, Deadline deadline) {
    while (true) {
        int timeout = -1;
        if (deadline != kNoDeadline) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(
                deadline - std::chrono::steady_clock::now());
            timeout = static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, 3'600'000));
        }
        pollfd entry{socket, events, 0};
        const int ready = poll(&entry, 1, timeout);
        if (ready > 0) {
            return true;
        }
        if (ready < 0 && errno != EINTR) {
            return false;
        }
        if (deadline != kNoDeadline && std::chrono::steady_clock::now() >= deadline) {
            errno = ETIMEDOUT;
            return false;
        }
    }
}

/// Whether the failed call is worth another try, after a wait where it would have blocked.
bool CanGoOn(int socket, short events, Deadline deadline) {
    if (errno == EINTR) {
        return true;
    }
    return (errno == EAGAIN || errno == EWOULDBLOCK) && WaitFor(socket, events, deadline);
}

bool ReceiveBytes(int socket, char* data, std::size_t size, Deadline deadline) {
    // With a deadline no call may block; without one, a blocking receive spares the poll.
    const int flags = deadline == kNoDeadline ? 0 : MSG_DONTWAIT;
    while (size > 0) {
        const ssize_t received = recv(socket, data, size, flags);
        if (received == 0) {
            errno = ECONNRESET;
            return false;
        }
        if (received < 0) {
            if (!CanGoOn(socket, POLLIN, deadline)) {
                return false;
            }
            continue;
        }
        data += received;
        size -= static_cast<std::size_t>(received);
    }
    return true;
}

/// The wait for a place in a Unix server's backlog is bounded by the socket's time for sending.
bool LimitSending(int socket, Deadline deadline) {
    if (deadline == kNoDeadline) {
        return true;
    }
    const auto left =
        std::chrono::ceil<std::chrono::microseconds>(deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) {
        errno = ETIMEDOUT;
        return false;
    }
    const timeval time{left.count() / 1'000'000, left.count() % 1'000'000};
    return setsockopt(socket, SOL_SOCKET, SO_SNDTIMEO, &time, sizeof(time)) == 0;
}

}  // namespace

FramePrefix MakeFramePrefix(std::size_t size) {
    const auto length = static_cast<std::uint32_t>(size);
    FramePrefix prefix;
    std::memcpy(prefix.data(), &length, sizeof(length));
    return prefix;
}

std::size_t FrameSize(const FramePrefix& prefix) {
    std::uint32_t length = 0;
    std::memcpy(&length, prefix.data(), sizeof(length));
    return length;
}

bool SendFrame(int socket, std::string_view message, Deadline deadline) {
    if (message.size() > kMaxFrameSize) {
        errno = EMSGSIZE;
        return false;
    }
    FramePrefix prefix = MakeFramePrefix(message.size());
    const int flags = MSG_NOSIGNAL | (deadline == kNoDeadline ? 0 : MSG_DONTWAIT);
    const std::size_t total = prefix.size() + message.size();
    for (std::size_t done = 0; done < total;) {
        const std::size_t of_prefix = std::min(done, prefix.size());
        const std::size_t of_text = done - of_prefix;
        iovec parts[2] = {{prefix.data() + of_prefix, prefix.size() - of_prefix},
                          {const_cast<char*>(message.data()) + of_text, message.size() - of_text}};
        msghdr header{};
        header.msg_iov = parts;
        header.msg_iovlen = 2;
        const ssize_t sent = sendmsg(socket, &header, flags);
        if (sent < 0 && !CanGoOn(socket, POLLOUT, deadline)) {
            return false;
        }
        done += static_cast<std::size_t>(std::max<ssize_t>(sent, 0));
    }
    return true;
}

bool ReceiveFrame(int socket, std::string& message, std::size_t limit, Deadline deadline) {
    FramePrefix prefix;
    if (!ReceiveBytes(socket, prefix.data(), prefix.size(), deadline)) {
        return false;
    }
    const std::size_t size = FrameSize(prefix);
    if (size > std::min(limit, kMaxFrameSize)) {
        errno = EMSGSIZE;
        return false;
    }
    message.clear();
    while (message.size() < size) {
        const std::size_t have = message.size();
        message.resize(have + std::min(kReceiveChunk, size - have));
        if (!ReceiveBytes(socket, message.data() + have, message.size() - have, deadline)) {
            return false;
        }
    }
    return true;
}

UniqueFd ConnectUnix(const std::string& path, Deadline deadline) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof(address.sun_path)) {
        errno = ENAMETOOLONG;
        return UniqueFd();
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    while (fd.IsValid() &&
           (!LimitSending(fd.Get(), deadline) ||
            connect(fd.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0)) {
        if (errno != EINTR) {  // a signal may come while the server's backlog is full
            const int saved_errno = errno == EAGAIN ? ETIMEDOUT : errno;
            fd.Reset();
            errno = saved_errno;
        }
    }
    return fd;
}

}  // namespace quivra::base
