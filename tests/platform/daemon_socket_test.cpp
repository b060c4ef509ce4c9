#include <kesto/daemon_socket.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <csignal>
#include <memory>
#include <thread>

#include "base/frame.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using kestodaemon::DomainSockConnection;
using support::Frame;

class DaemonSocketTest : public PlatformTest {
  protected:
    DaemonSocketTest() {
        sockaddr_un address{AF_UNIX, "/volume1/socket"};
        EXPECT_EQ(bind(server_, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
        EXPECT_EQ(listen(server_, 8), 0);
    }
    ~DaemonSocketTest() override { close(server_); }

    const int server_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    DomainSockConnection connection_{"/volume1/socket"};
};

/// A frame that announces another length than it has.
std::string FrameOf(std::size_t announced, const std::string& body) {
    const auto prefix = quivra::base::MakeFramePrefix(announced);
    return std::string(prefix.begin(), prefix.end()) + body;
}

TEST_F(DaemonSocketTest, HostileFramesFail) {
    const std::string large(3U << 20, 'x');
    const std::pair<std::string, int> rows[] = {
        {FrameOf(5, "hello and more"), 0},
        {Frame(""), 0},
        {Frame(large), 0},
        {Frame("hello").substr(0, 3), ECONNRESET},
        {FrameOf(6, "hello"), ECONNRESET},
        {FrameOf(1U << 30, "hello"), ECONNRESET},  // announced, and never allocated
        {FrameOf((1U << 30) + 1, ""), EMSGSIZE},
    };
    for (const auto& [sent, error] : rows) {
        ASSERT_TRUE(connection_.Connect());
        const int peer = accept(server_, nullptr, nullptr);
        std::thread server([&, bytes = sent] {
            send(peer, bytes.data(), bytes.size(), MSG_NOSIGNAL);
            close(peer);
        });
        std::string message;
        errno = 0;
        EXPECT_EQ(connection_.Recv(message), error == 0);
        EXPECT_EQ(errno, error);
        EXPECT_TRUE(error != 0 || sent.starts_with(Frame(message)));
        server.join();
    }
}

TEST_F(DaemonSocketTest, EachConnectionEndsWithItsUse) {
    for (const bool again : {false, true}) {
        auto connection = std::make_unique<DomainSockConnection>("/volume1/socket");
        ASSERT_TRUE(connection->Connect());
        const int peer = accept(server_, nullptr, nullptr);
        again ? static_cast<void>(connection->Connect()) : connection.reset();
        char byte = 0;
        EXPECT_EQ(recv(peer, &byte, 1, MSG_DONTWAIT), 0) << again;
        close(peer);
    }
}

TEST_F(DaemonSocketTest, SendsWholeFramesAndSurvivesAHangUp) {
    const std::string large(3U << 20, 'y');
    ASSERT_TRUE(connection_.Connect());
    const int peer = accept(server_, nullptr, nullptr);
    std::string received(large.size() + 4, '\0');
    std::thread reader([&] { recv(peer, received.data(), received.size(), MSG_WAITALL); });
    EXPECT_TRUE(connection_.Send(large));
    reader.join();
    EXPECT_TRUE(received == Frame(large));
    close(peer);
    static volatile std::sig_atomic_t broken_pipes = 0;
    const auto old_handler = std::signal(SIGPIPE, [](int /*signal*/) { broken_pipes = 1; });
    EXPECT_FALSE(connection_.Send(large));
    EXPECT_EQ(errno, EPIPE);
    EXPECT_EQ(broken_pipes, 0);
    std::signal(SIGPIPE, old_handler);
    EXPECT_FALSE(DomainSockConnection("/volume1/none").Connect());
    EXPECT_FALSE(DomainSockConnection("/" + std::string(200, 'x')).Connect());
    EXPECT_EQ(errno, ENAMETOOLONG);
}

}  // namespace
