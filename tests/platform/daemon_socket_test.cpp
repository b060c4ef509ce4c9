#include <kesto/daemon_socket.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <thread>

#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using kestodaemon::DomainSockConnection;

constexpr const char* kSocket = "/volume1/socket";

class DaemonSocketTest : public PlatformTest {
  protected:
    DaemonSocketTest() {
        sockaddr_un address{AF_UNIX, "/volume1/socket"};
        EXPECT_EQ(bind(server_, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
        EXPECT_EQ(listen(server_, 8), 0);
    }
    ~DaemonSocketTest() override { close(server_); }

    /// What a client receives from a server that sends these bytes and hangs up; "errno N" on
    /// failure.
    std::string ReceiveFrom(const std::string& bytes) {
        std::thread peer([&] {
            const int fd = accept(server_, nullptr, nullptr);
            send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL);
            close(fd);
        });
        DomainSockConnection connection(kSocket);
        std::string message;
        EXPECT_TRUE(connection.Connect());
        const bool received = connection.Recv(message);
        const int error = errno;
        peer.join();
        return received ? message : "errno " + std::to_string(error);
    }

    const int server_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
};

std::string Frame(std::uint32_t size, const std::string& body) {
    std::string frame(sizeof(size), '\0');
    std::memcpy(frame.data(), &size, sizeof(size));
    return frame + body;
}

TEST_F(DaemonSocketTest, HostileFramesFail) {
    const std::string reset = "errno " + std::to_string(ECONNRESET);
    const std::string large(3U << 20, 'x');
    EXPECT_EQ(ReceiveFrom(Frame(5, "hello")), "hello");
    EXPECT_EQ(ReceiveFrom(Frame(5, "hello and more")), "hello");
    EXPECT_EQ(ReceiveFrom(Frame(0, "")), "");
    EXPECT_EQ(ReceiveFrom(Frame(3U << 20, large)), large);
    EXPECT_EQ(ReceiveFrom(""), reset);
    EXPECT_EQ(ReceiveFrom(Frame(5, "hello").substr(0, 3)), reset);
    EXPECT_EQ(ReceiveFrom(Frame(6, "hello")), reset);
    EXPECT_EQ(ReceiveFrom(Frame(1U << 30, "hello")), reset);  // announced, and never allocated
    EXPECT_EQ(ReceiveFrom(Frame((1U << 30) + 1, "")), "errno " + std::to_string(EMSGSIZE));
    EXPECT_EQ(ReceiveFrom(Frame(0xffffffff, "")), "errno " + std::to_string(EMSGSIZE));
}

TEST_F(DaemonSocketTest, SendsWholeFramesAndSurvivesAHangUp) {
    const std::string large(3U << 20, 'y');
    DomainSockConnection connection(kSocket);
    ASSERT_TRUE(connection.Connect());
    const int peer = accept(server_, nullptr, nullptr);
    std::string received(large.size() + 4, '\0');
    std::thread reader([&] { recv(peer, received.data(), received.size(), MSG_WAITALL); });
    EXPECT_TRUE(connection.Send(large));
    reader.join();
    EXPECT_EQ(received, Frame(3U << 20, large));
    close(peer);
    EXPECT_FALSE(connection.Send(large));  // and no SIGPIPE
    EXPECT_EQ(errno, EPIPE);
}

TEST_F(DaemonSocketTest, ConnectFailsWithItsReason) {
    const std::pair<std::string, int> rows[] = {
        {"/volume1/none", ENOENT}, {"", ECONNREFUSED}, {"/" + std::string(200, 'x'), ENAMETOOLONG}};
    for (const auto& [path, error] : rows) {
        DomainSockConnection connection(path);
        EXPECT_FALSE(connection.Connect());
        EXPECT_EQ(errno, error) << path;
        std::string message;
        EXPECT_FALSE(connection.Send("x"));
        EXPECT_FALSE(connection.Recv(message));
    }
}

}  // namespace
