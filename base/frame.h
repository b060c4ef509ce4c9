#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "base/unique_fd.h"

/// One message on a stream socket: its length as a 4-byte unsigned number in the host's byte
/// order, then that many bytes. The format is the wire's and never changes.
namespace quivra::base {

using FramePrefix = std::array<char, sizeof(std::uint32_t)>;

/// The longest message that anybody sends or accepts.
inline constexpr std::size_t kMaxFrameSize = std::size_t{1} << 30;

/// `size` is at most kMaxFrameSize.
FramePrefix MakeFramePrefix(std::size_t size);
std::size_t FrameSize(const FramePrefix& prefix);

/// Until when a whole message must have been moved.
using Deadline = std::chrono::steady_clock::time_point;
inline constexpr Deadline kNoDeadline = Deadline::max();

/// Sends a message; never raises SIGPIPE. False with errno set when that fails: EMSGSIZE for one
/// that is too long, ETIMEDOUT at the deadline. A part may have been sent then.
bool SendFrame(int socket, std::string_view message, Deadline deadline = kNoDeadline);

/// Receives a message into `message`. Its memory grows as bytes arrive, so that a length that is
/// only announced costs none. False with errno set when that fails: EMSGSIZE for one above
/// `limit`, ECONNRESET at the end of the stream, ETIMEDOUT at the deadline.
bool ReceiveFrame(int socket, std::string& message, std::size_t limit = kMaxFrameSize,
                  Deadline deadline = kNoDeadline);

/// Connects a new socket to a Unix stream server, waiting while its backlog is full. The result is
/// not valid when that fails; errno tells why: ENOENT or ECONNREFUSED when nobody listens,
/// ETIMEDOUT at the deadline.
UniqueFd ConnectUnix(const std::string& path, Deadline deadline = kNoDeadline);

}  // namespace quivra::base
