#include "programs/daemon/frame_server.h"

#include <gtest/gtest.h>
#include <kesto/daemon_socket.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <latch>
#include <optional>
#include <thread>
#include <vector>

#include "common/error.h"
#include "tests/support/files.h"

namespace quivra::daemon {
namespace {

using namespace std::chrono_literals;
using base::UniqueFd;
using support::Frame;

const std::string kPath = "/tmp/frame_server_test.sock";

/// A socket after `attach`, which is `bind` or `connect`, to the server's path.
UniqueFd RawSocket(decltype(connect) attach) {
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, kPath.c_str());
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    EXPECT_EQ(attach(fd.Get(), generic, sizeof(address)), 0) << strerror(errno);
    return fd;
}

/// Whether the server ends the connection, without a byte of reply, before the patience is over.
bool IsClosedByServer(const UniqueFd& fd, std::chrono::milliseconds patience = 5s) {
    pollfd wait{fd.Get(), POLLIN, 0};
    char byte = 0;
    return poll(&wait, 1, static_cast<int>(patience.count())) == 1 &&
           recv(fd.Get(), &byte, 1, 0) <= 0;
}

std::optional<std::string> Ask(const std::string& request) {
    kestodaemon::DomainSockConnection connection(kPath);
    std::string reply;
    if (!connection.Connect() || !connection.Send(request) || !connection.Recv(reply)) {
        return std::nullopt;
    }
    return reply;
}

FrameServerOptions Options() {
    FrameServerOptions options;
    options.path = kPath;
    options.max_request = 8 << 20;
    options.max_connections = 24;
    return options;
}

std::string Echo(const std::string& request) {
    return "echo " + request;
}

class RunningServer {
  public:
    explicit RunningServer(FrameServerOptions options = Options(),
                           FrameServer::Handler handler = Echo)
        : server(std::move(options), std::move(handler)), thread([this] { server.Run(); }) {}
    ~RunningServer() { Join(); }
    void Join() {
        server.Stop();
        if (thread.joinable()) {
            thread.join();
        }
    }

    FrameServer server;
    std::thread thread;
};

TEST(FrameServer, ServesManyClientsAtOnce) {
    RunningServer running;
    std::vector<std::jthread> clients;
    for (int client = 0; client < 8; ++client) {
        clients.emplace_back([client] {
            for (unsigned int round = 0; round < 100; ++round) {
                // Some requests and replies are larger than any socket buffer.
                const std::string text(round % 25 == 0 ? 4U << 20 : 10 + round,
                                       static_cast<char>('a' + client));
                EXPECT_TRUE(Ask(text) == "echo " + text);
            }
        });
    }
    clients.clear();
    EXPECT_EQ(Ask(""), "echo ");
}

TEST(FrameServer, RefusesHostileFramesAndGoesOn) {
    FrameServerOptions options = Options();
    options.max_request = 64;
    options.read_timeout = 300ms;
    RunningServer running(options);
    const struct {
        const char* label;
        std::string bytes;
        bool close_writing;
    } cases[] = {
        {"closed in the length", std::string(3, '\1'), true},
        {"half a length", std::string(2, '\1'), false},
        {"4 GiB", std::string(4, '\xff'), false},
        {"above the limit", Frame(std::string(65, 'x')), false},
        {"half a frame", Frame("hello").substr(0, 6), false},
        {"closed in the frame", Frame("hello").substr(0, 6), true},
    };
    for (const auto& test : cases) {
        const UniqueFd fd = RawSocket(connect);
        EXPECT_EQ(send(fd.Get(), test.bytes.data(), test.bytes.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(test.bytes.size()));
        if (test.close_writing) {
            shutdown(fd.Get(), SHUT_WR);
        }
        EXPECT_TRUE(IsClosedByServer(fd)) << test.label;
        EXPECT_EQ(Ask("still there"), "echo still there") << test.label;
    }
}

TEST(FrameServer, ReadsAFrameThatComesByteByByteAndIgnoresWhatFollows) {
    RunningServer running;
    const UniqueFd fd = RawSocket(connect);
    for (const char byte : Frame("slow") + "x") {
        ASSERT_EQ(send(fd.Get(), &byte, 1, MSG_NOSIGNAL), 1);
    }
    char reply[13] = {};
    ASSERT_EQ(recv(fd.Get(), reply, sizeof(reply), MSG_WAITALL), 13);
    EXPECT_EQ(std::string(reply, 13), Frame("echo slow"));
}

TEST(FrameServer, SilentClientsAndSlowReadersHoldUpNobody) {
    FrameServerOptions options = Options();
    options.workers = 1;
    options.write_timeout = 300ms;
    RunningServer running(options, [](const std::string& request) {
        return request == "big" ? std::string(32 << 20, 'b') : request;
    });
    std::vector<UniqueFd> silent;
    for (int i = 0; i < 20; ++i) {
        silent.push_back(RawSocket(connect));
    }
    const UniqueFd reader = RawSocket(connect);
    send(reader.Get(), Frame("big").data(), 7, MSG_NOSIGNAL);
    EXPECT_EQ(Ask("quick"), "quick");
    // The slow reader is given up at its deadline: what is left in the buffers ends early.
    pollfd hung_up{reader.Get(), POLLRDHUP, 0};
    EXPECT_EQ(poll(&hung_up, 1, 5000), 1);
}

TEST(FrameServer, TakesOverFromTheDeadOnly) {
    RawSocket(bind);  // and closed at once
    const auto code_of_second = [] {
        try {
            FrameServer second(Options(), Echo);
            return 0;
        } catch (const Error& error) {
            return static_cast<int>(error.code);
        }
    };
    {
        RunningServer running;
        EXPECT_EQ(code_of_second(), Error::kLockFailed);
        struct stat status {};
        ASSERT_EQ(lstat(kPath.c_str(), &status), 0);
        EXPECT_EQ(status.st_mode, S_IFSOCK | 0600U);
        EXPECT_EQ(Ask("first"), "echo first");
    }
    EXPECT_NE(access(kPath.c_str(), F_OK), 0) << "the socket file was left behind";
    std::ofstream(kPath) << "precious";
    EXPECT_EQ(code_of_second(), Error::kSystemCallFailed);
    EXPECT_EQ(access(kPath.c_str(), F_OK), 0);
    unlink(kPath.c_str());
}

TEST(FrameServer, StopFinishesWhatIsBeingHandled) {
    std::latch started(1);
    std::latch release(1);
    RunningServer running(Options(), [&](const std::string& request) {
        started.count_down();
        release.wait();
        return request;
    });
    std::jthread client([] { EXPECT_EQ(Ask("in work"), "in work"); });
    started.wait();
    const UniqueFd silent = RawSocket(connect);
    running.server.Stop();
    EXPECT_TRUE(IsClosedByServer(silent));
    release.count_down();
    running.Join();
}

TEST(FrameServer, ServesItsOwnUserAndRootOnly) {
    FrameServerOptions options = Options();
    options.mode = 0666;
    RunningServer running(options);
    const pid_t child = fork();
    if (child == 0) {
        _exit(setuid(65534) != 0 ? 2 : Ask("stranger") ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    if (WEXITSTATUS(status) == 2) {
        GTEST_SKIP() << "no other user can be taken on here";
    }
    EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace quivra::daemon
