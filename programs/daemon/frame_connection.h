#pragma once

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <string>

#include "base/frame.h"
#include "base/unique_fd.h"

namespace quivra::daemon {

/// One client of a FrameServer: reads one frame (base/frame.h), then writes one, without ever
/// blocking.
class FrameConnection {
  public:
    using Clock = std::chrono::steady_clock;
    enum class Progress {
        kPending,  ///< the socket has no more bytes, or room, for now
        kDone,     ///< the frame is complete
        kFailed,   ///< refused, closed early or broken: the connection is of no more use
    };

    /// `fd` is a non-blocking stream socket.
    FrameConnection(base::UniqueFd fd, Clock::time_point deadline);
    FrameConnection(const FrameConnection&) = delete;
    FrameConnection& operator=(const FrameConnection&) = delete;

    /// Reads what has arrived, up to some fixed amount, so that one fast client does not keep the
    /// others waiting. A length above `max_size` is refused at once; memory grows with the bytes
    /// that arrive, never with the length that was announced.
    Progress Read(std::size_t max_size);

    /// Puts the reply in the place of the request, to be written by Write until `deadline`.
    void SetReply(std::string reply, Clock::time_point deadline);
    Progress Write();

    int Fd() const { return fd_.Get(); }
    Clock::time_point Deadline() const { return deadline_; }
    void LimitDeadline(Clock::time_point latest) { deadline_ = std::min(deadline_, latest); }
    bool HasReply() const { return has_reply_; }
    /// The text of the request as far as it has arrived; after SetReply the reply's.
    const std::string& Text() const { return text_; }

  private:
    Progress ReadPrefix();

    base::UniqueFd fd_;
    Clock::time_point deadline_;
    base::FramePrefix prefix_{};
    std::size_t prefix_moved_ = 0;  ///< bytes of the prefix read or written so far
    std::size_t size_ = 0;
    std::string text_;
    std::size_t text_moved_ = 0;  ///< bytes of the text written so far
    bool has_reply_ = false;
};

}  // namespace quivra::daemon
