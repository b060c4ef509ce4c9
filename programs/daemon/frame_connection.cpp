#include "programs/daemon/frame_connection.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace quivra::daemon {
namespace {

constexpr std::size_t kReadChunk = 256 * 1024;

FrameConnection::Progress AfterError() {
    return errno == EAGAIN || errno == EWOULDBLOCK ? FrameConnection::Progress::kPending
                                                   : FrameConnection::Progress::kFailed;
}

/// recv without the interruptions.
ssize_t Receive(int fd, char* buffer, std::size_t size) {
    ssize_t received = 0;
    do {
        received = recv(fd, buffer, size, 0);
    } while (received < 0 && errno == EINTR);
    return received;
}

}  // namespace

FrameConnection::FrameConnection(base::UniqueFd fd, Clock::time_point deadline)
    : fd_(std::move(fd)), deadline_(deadline) {}

FrameConnection::Progress FrameConnection::ReadPrefix() {
    while (prefix_moved_ < prefix_.size()) {
        const ssize_t received =
            Receive(Fd(), prefix_.data() + prefix_moved_, prefix_.size() - prefix_moved_);
        if (received <= 0) {
            return received == 0 ? Progress::kFailed : AfterError();
        }
        prefix_moved_ += static_cast<std::size_t>(received);
    }
    size_ = base::FrameSize(prefix_);
    return Progress::kDone;
}

FrameConnection::Progress FrameConnection::Read(std::size_t max_size) {
    if (const Progress progress = ReadPrefix(); progress != Progress::kDone) {
        return progress;
    }
    if (size_ > max_size) {
        return Progress::kFailed;
    }
    static thread_local std::string buffer(kReadChunk, '\0');
    for (std::size_t budget = 4 * kReadChunk; text_.size() < size_ && budget > 0;) {
        const std::size_t wanted = std::min({size_ - text_.size(), kReadChunk, budget});
        const ssize_t received = Receive(Fd(), buffer.data(), wanted);
        if (received <= 0) {
            return received == 0 ? Progress::kFailed : AfterError();
        }
        text_.append(buffer.data(), static_cast<std::size_t>(received));
        budget -= static_cast<std::size_t>(received);
    }
    return text_.size() == size_ ? Progress::kDone : Progress::kPending;
}

void FrameConnection::SetReply(std::string reply, Clock::time_point deadline) {
    text_ = std::move(reply);
    size_ = text_.size();
    prefix_ = base::MakeFramePrefix(size_);
    prefix_moved_ = 0;
    text_moved_ = 0;
    has_reply_ = true;
    deadline_ = deadline;
}

FrameConnection::Progress FrameConnection::Write() {
    while (prefix_moved_ < prefix_.size() || text_moved_ < text_.size()) {
        iovec parts[2] = {{prefix_.data() + prefix_moved_, prefix_.size() - prefix_moved_},
                          {text_.data() + text_moved_, text_.size() - text_moved_}};
        msghdr message{};
        message.msg_iov = parts;
        message.msg_iovlen = 2;
        const ssize_t sent = sendmsg(Fd(), &message, MSG_NOSIGNAL);
        if (sent < 0) {
            if (errno == EINTR) {
                continue;
            }
            return AfterError();
        }
        const std::size_t of_prefix = std::min(static_cast<std::size_t>(sent), parts[0].iov_len);
        prefix_moved_ += of_prefix;
        text_moved_ += static_cast<std::size_t>(sent) - of_prefix;
    }
    return Progress::kDone;
}

}  // namespace quivra::daemon
