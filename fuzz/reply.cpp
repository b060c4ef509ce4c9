#include <kesto/daemon_socket.h>

#include <cstdint>
#include <sstream>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"

namespace {

/// What the search daemon replies, a line each; success once they are used up.
std::istringstream replies;

}  // namespace

// In the place of the platform's: a connection to nobody, and no waiting for a busy daemon.
namespace kestodaemon {

SockConnection::~SockConnection() = default;
DomainSockConnection::DomainSockConnection(const std::string& /*path*/) {}
bool DomainSockConnection::Connect() {
    return true;
}
bool SockConnection::Send(const std::string& /*text*/) {
    return true;
}
bool SockConnection::Recv(std::string& text) {
    if (!std::getline(replies, text)) {
        text = R"({"success":true,"data":[]})";
    }
    return true;
}

}  // namespace kestodaemon

extern "C" unsigned int sleep(unsigned int /*seconds*/) {
    return 0;
}

// Any replies to the request that looks most closely at them: only Error may come out.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    quivra::fileindex::log_level = 0;
    replies = std::istringstream(std::string(reinterpret_cast<const char*>(data), size));
    try {
        quivra::fileindex::elastic::IndexRename("s", "/v/b", "/v/a");
    } catch (const quivra::Error&) {
    }
    return 0;
}
