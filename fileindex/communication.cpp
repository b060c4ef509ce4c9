#include "fileindex/communication.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>

#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"

namespace quivra::fileindex {
namespace {

constexpr unsigned int kMaxChunk = 1024;
constexpr int kMaxInterruptions = 10;
constexpr int kConnectAttempts = 5;
constexpr std::uint32_t kMaxMessageSize = 1U << 30;
constexpr useconds_t kEmptyReadPauseMicroseconds = 10000;

[[noreturn]] void FailChannel(LogSite site, const char* condition, const char* what) {
    const std::string reason = std::string(what) + " failed, reason=" + SystemErrorText(errno);
    Fail(site, condition, Error(Error::kSystemCallFailed, reason));
}

/// A daemon that is being started has no socket yet. Every other failure to connect shows at the
/// first write.
void ConnectPatiently(int fd) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, kFileIndexDaemonSocketPath, sizeof(address.sun_path) - 1);
    for (int attempt = 1; attempt <= kConnectAttempts; ++attempt) {
        if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0 ||
            errno != ENOENT || attempt == kConnectAttempts) {
            return;
        }
        sleep(1);
    }
}

void SetSendTimeout(int fd_socket) {
    const timeval timeout{.tv_sec = 1, .tv_usec = 0};
    if (setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)) < 0) {
        FailChannel({"communication", __LINE__},
                    "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, "
                    "sizeof(timeout))",
                    "setsockopt");
    }
}

void SendMessage(int fd, const std::string& text) {
    if (text.size() > kMaxMessageSize) {
        errno = EMSGSIZE;
        FailChannel({"communication", __LINE__}, "text.size() > kMaxMessageSize", "write");
    }
    const auto size = static_cast<std::uint32_t>(text.size());
    std::array<unsigned char, sizeof(size)> prefix{};
    std::memcpy(prefix.data(), &size, sizeof(size));
    BufferWrite(fd, sizeof(size), prefix.data());
    BufferWrite(fd, size, reinterpret_cast<const unsigned char*>(text.data()));
}

/// Reads the reply through a buffer of fixed size, so that no announced length costs memory.
void DiscardReply(int fd) {
    std::uint32_t size = 0;
    std::array<unsigned char, 65536> buffer{};
    BufferRead(fd, sizeof(size), buffer.data());
    std::memcpy(&size, buffer.data(), sizeof(size));
    if (size > kMaxMessageSize) {
        errno = EMSGSIZE;
        FailChannel({"communication", __LINE__}, "size > kMaxMessageSize", "read");
    }
    while (size > 0) {
        const std::uint32_t piece = std::min<std::uint32_t>(size, buffer.size());
        BufferRead(fd, piece, buffer.data());
        size -= piece;
    }
}

}  // namespace

void BufferRead(int fd, unsigned int size, unsigned char* buf) {
    int interruptions = 0;
    while (size > 0) {
        const ssize_t received = read(fd, buf, std::min(size, kMaxChunk));
        if (received < 0) {
            if (errno == EINTR && interruptions < kMaxInterruptions) {
                ++interruptions;
                continue;
            }
            FailChannel({"communication", __LINE__}, "0 > read(fd, buf, size)", "read");
        }
        if (received == 0) {
            usleep(kEmptyReadPauseMicroseconds);
        }
        buf += received;
        size -= static_cast<unsigned int>(received);
    }
}

void BufferWrite(int fd, unsigned int size, const unsigned char* buf) {
    int interruptions = 0;
    while (size > 0) {
        const ssize_t written = write(fd, buf, std::min(size, kMaxChunk));
        if (written <= 0) {
            if (written < 0 && errno == EINTR && interruptions < kMaxInterruptions) {
                ++interruptions;
                continue;
            }
            FailChannel({"communication", __LINE__}, "0 >= write(fd, buf, size)", "write");
        }
        buf += written;
        size -= static_cast<unsigned int>(written);
    }
}

void SendCommandToDaemon(const std::string& type, const Json::Value& data) {
    signal(SIGPIPE, SIG_IGN);
    const base::UniqueFd fd_socket(socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!fd_socket.IsValid()) {
        FailChannel({"communication", __LINE__},
                    "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))", "socket");
    }
    ConnectPatiently(fd_socket.Get());
    SetSendTimeout(fd_socket.Get());
    Json::Value request;
    request["type"] = type;
    request["data"] = data;
    SendMessage(fd_socket.Get(), toString(request));
    DiscardReply(fd_socket.Get());
}

}  // namespace quivra::fileindex
