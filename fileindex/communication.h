#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

/// The channel to the indexing daemon. The search daemon's lies in elastic/.
namespace quivra::fileindex {

/// Where the indexing daemon listens. A message is a 4-byte unsigned length in the host's byte
/// order, then that many bytes of JSON text; one goes each way per connection.
inline constexpr const char* kFileIndexDaemonSocketPath = "/var/run/fileindexd.sock";

/// Sends {"type": type, "data": data} to the indexing daemon and waits for its reply, which is
/// read whole and not looked at. While the daemon's socket does not exist, the call tries 5 times
/// to connect, a second apart. Throws Error 502 when the exchange fails: "socket failed, reason=",
/// "setsockopt failed, reason=", "write failed, reason=" (also when nobody listens), "read failed,
/// reason=" (also for a reply above 1 GiB), each followed by the system's text. Sends time out
/// after a second; a daemon that does not reply blocks the caller. SIGPIPE stays ignored for the
/// process from the first call on. Any thread may call it.
QUIVRA_EXPORT void SendCommandToDaemon(const std::string& type, const Json::Value& data);

/// Moves exactly `size` bytes between the descriptor and `buf`, or throws Error 502 ("read failed,
/// reason=", "write failed, reason="); `buf` then holds what came before the failure. Up to 10
/// interruptions by signals are passed over. A read that finds nothing (end of stream) does
/// not count as a failure: it is repeated, with a pause in between, until bytes come or one fails.
QUIVRA_EXPORT void BufferRead(int fd, unsigned int size, unsigned char* buf);
QUIVRA_EXPORT void BufferWrite(int fd, unsigned int size, const unsigned char* buf);

}  // namespace quivra::fileindex
