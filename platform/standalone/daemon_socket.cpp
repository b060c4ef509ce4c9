#include <kesto/daemon_socket.h>

#include <unistd.h>

#include "base/frame.h"

namespace kestodaemon {

// The classes keep a plain descriptor: their layout is the platform's, which others replace, and
// knows nothing of our own types.

SockConnection::~SockConnection() {
    if (fd_ >= 0) {
        close(fd_);
    }
}

bool SockConnection::Send(const std::string& message) {
    return quivra::base::SendFrame(fd_, message);
}

bool SockConnection::Recv(std::string& message) {
    return quivra::base::ReceiveFrame(fd_, message);
}

DomainSockConnection::DomainSockConnection(const std::string& path) : path_(path) {}

bool DomainSockConnection::Connect() {
    if (fd_ >= 0) {
        close(fd_);
    }
    fd_ = quivra::base::ConnectUnix(path_).Release();
    return fd_ >= 0;
}

}  // namespace kestodaemon
