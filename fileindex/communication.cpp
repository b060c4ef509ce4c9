#include "fileindex/communication.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

#include "base/frame.h"
#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"

namespace quivra::fileindex {
namespace {

constexpr LogUnit kLog{"communication", 0};

constexpr unsigned int kMaxChunk = 1024;
constexpr int kMaxInterruptions = 10;
constexpr int kConnectAttempts = 5;
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
        FailChannel(kLog.Here(),
                    "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, "
                    "sizeof(timeout))",
                    "setsockopt");
    }
}

void SendMessage(int fd, const std::string& text) {
    if (text.size() > base::kMaxFrameSize) {
        errno = EMSGSIZE;
        FailChannel(kLog.Here(), "text.size() > base::kMaxFrameSize", "write");
    }
    const base::FramePrefix prefix = base::MakeFramePrefix(text.size());
    BufferWrite(fd, prefix.size(), reinterpret_cast<const unsigned char*>(prefix.data()));
    BufferWrite(fd, static_cast<unsigned int>(text.size()),
                reinterpret_cast<const unsigned char*>(text.data()));
}

/// Reads the reply through a buffer of fixed size, so that no announced length costs memory.
void DiscardReply(int fd) {
    base::FramePrefix prefix{};
    BufferRead(fd, prefix.size(), reinterpret_cast<unsigned char*>(prefix.data()));
    std::size_t size = base::FrameSize(prefix);
    if (size > base::kMaxFrameSize) {
        errno = EMSGSIZE;
        FailChannel(kLog.Here(), "size > base::kMaxFrameSize", "read");
    }
    std::array<unsigned char, 65536> buffer{};
    while (size > 0) {
        const std::size_t piece = std::min(size, buffer.size());
        BufferRead(fd, static_cast<unsigned int>(piece), buffer.data());
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
            FailChannel(kLog.Here(), "0 > read(fd, buf, size)", "read");
        }
        if (received == 0) {
            // Not a failure here, whatever it means; but it must not take a core.
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
            FailChannel(kLog.Here(), "0 >= write(fd, buf, size)", "write");
        }
        buf += written;
        size -= static_cast<unsigned int>(written);
    }
}

void SendCommandToDaemon(const std::string& type, const Json::Value& data) {
    // For the whole process and for good: a daemon that goes away must not end its client.
    signal(SIGPIPE, SIG_IGN);
    const base::UniqueFd fd_socket(socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!fd_socket.IsValid()) {
        FailChannel(kLog.Here(), "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))", "socket");
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
