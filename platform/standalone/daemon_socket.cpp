#include <kesto/daemon_socket.h>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>

namespace kestodaemon {
namespace {

constexpr std::uint32_t kMaxMessageSize = 1U << 30;
/// A reply grows as it arrives, so that a length that is only announced costs no memory.
constexpr std::size_t kReceiveChunk = 1U << 20;

bool SendBytes(int fd, const char* data, std::size_t size) {
    while (size > 0) {
        const ssize_t sent = send(fd, data, size, MSG_NOSIGNAL);
        if (sent < 0) {
            if (errno == EINTR) {
                continue;
            }
            return false;
        }
        data += sent;
        size -= static_cast<std::size_t>(sent);
    }
    return true;
}

bool ReceiveBytes(int fd, char* data, std::size_t size) {
    while (size > 0) {
        const ssize_t received = recv(fd, data, size, 0);
        if (received < 0 && errno == EINTR) {
            continue;
        }
        if (received <= 0) {
            if (received == 0) {
                errno = ECONNRESET;
            }
            return false;
        }
        data += received;
        size -= static_cast<std::size_t>(received);
    }
    return true;
}

}  // namespace

SockConnection::~SockConnection() {
    if (fd_ >= 0) {
        close(fd_);
    }
}

bool SockConnection::Send(const std::string& message) {
    if (message.size() > kMaxMessageSize) {
        errno = EMSGSIZE;
        return false;
    }
    const auto size = static_cast<std::uint32_t>(message.size());
    char prefix[sizeof(size)];
    std::memcpy(prefix, &size, sizeof(size));
    return SendBytes(fd_, prefix, sizeof(prefix)) && SendBytes(fd_, message.data(), message.size());
}

bool SockConnection::Recv(std::string& message) {
    std::uint32_t size = 0;
    char prefix[sizeof(size)];
    if (!ReceiveBytes(fd_, prefix, sizeof(prefix))) {
        return false;
    }
    std::memcpy(&size, prefix, sizeof(size));
    if (size > kMaxMessageSize) {
        errno = EMSGSIZE;
        return false;
    }
    message.clear();
    while (message.size() < size) {
        const std::size_t received = message.size();
        message.resize(received + std::min(kReceiveChunk, size - received));
        if (!ReceiveBytes(fd_, message.data() + received, message.size() - received)) {
            return false;
        }
    }
    return true;
}

DomainSockConnection::DomainSockConnection(const std::string& path) : path_(path) {}

bool DomainSockConnection::Connect() {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path_.size() >= sizeof(address.sun_path)) {
        errno = ENAMETOOLONG;
        return false;
    }
    std::memcpy(address.sun_path, path_.data(), path_.size());
    if (fd_ >= 0) {
        close(fd_);
    }
    fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd_ < 0) {
        return false;
    }
    int result = 0;
    do {  // a signal may come while the server's backlog is full
        result = connect(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
    } while (result != 0 && errno == EINTR);
    return result == 0;
}

}  // namespace kestodaemon
