#pragma once

#include <string>

namespace kestodaemon {

/// A stream connection that carries one message each way. On the wire a message is a 4-byte
/// unsigned length in the host's byte order, then that many bytes of JSON text. Messages above
/// 1 GiB are refused. Use it from one thread at a time; all calls block.
class SockConnection {
  public:
    virtual ~SockConnection();
    SockConnection(const SockConnection&) = delete;
    SockConnection& operator=(const SockConnection&) = delete;

    /// Connects, once more where it was connected before. This and the calls below are false on
    /// failure, with errno telling why; the connection is of no more use then.
    virtual bool Connect() = 0;
    /// Sends a whole message; never raises SIGPIPE.
    bool Send(const std::string& message);
    /// Waits for a whole message, however long that takes. `message` is unspecified after a
    /// failure.
    bool Recv(std::string& message);

  protected:
    SockConnection() = default;

    int fd_ = -1;
};

/// A connection to a Unix stream socket. The destructor closes it.
class DomainSockConnection : public SockConnection {
  public:
    /// Only keeps the path of the server's socket.
    explicit DomainSockConnection(const std::string& path);
    /// Waits while the server's backlog is full. ENAMETOOLONG for a path that no socket can have.
    bool Connect() override;

  private:
    std::string path_;
};

}  // namespace kestodaemon
