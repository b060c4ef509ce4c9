#include "fileindex/communication.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/time.h>
#include <unistd.h>

#include <array>
#include <cstring>

#include "common/unique_fd.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

using CommunicationTest = LibraryTest;

struct Pipe {
    Pipe() {
        std::array<int, 2> fds{};
        EXPECT_EQ(pipe2(fds.data(), O_CLOEXEC), 0);
        read_end = UniqueFd(fds[0]);
        write_end = UniqueFd(fds[1]);
    }
    UniqueFd read_end;
    UniqueFd write_end;
};

constexpr int kNever = 0;

/// Interrupts the running call every millisecond, and writes a byte to a pipe at the given signal.
class Interruptions {
  public:
    Interruptions(int pipe_fd, int byte_at) {
        pipe_fd_ = pipe_fd;
        byte_at_ = byte_at;
        count_ = 0;
        struct sigaction action {};
        action.sa_handler = [](int) {
            count_ = count_ + 1;
            if (count_ == byte_at_) {
                [[maybe_unused]] const ssize_t written = write(pipe_fd_, "x", 1);
            }
        };
        sigaction(SIGALRM, &action, nullptr);
        const itimerval every{{0, 1000}, {0, 1000}};
        setitimer(ITIMER_REAL, &every, nullptr);
    }
    ~Interruptions() {
        const itimerval never{};
        setitimer(ITIMER_REAL, &never, nullptr);
        signal(SIGALRM, SIG_IGN);
    }
    Interruptions(const Interruptions&) = delete;
    Interruptions& operator=(const Interruptions&) = delete;

  private:
    static inline volatile int count_ = 0;
    static inline volatile int byte_at_ = 0;
    static inline volatile int pipe_fd_ = -1;
};

TEST_F(CommunicationTest, AnEmptyReadIsRepeatedAfterAPause) {
    WriteFile("/tmp/growing", "ab");
    fake::OnSleep([](auto) { std::ofstream("/tmp/growing", std::ios::app) << "cd"; });
    const UniqueFd fd(open("/tmp/growing", O_RDONLY | O_CLOEXEC));
    std::array<unsigned char, 4> buffer{};
    BufferRead(fd.Get(), buffer.size(), buffer.data());
    EXPECT_EQ(std::memcmp(buffer.data(), "abcd", 4), 0);
    EXPECT_EQ(fake::Sleeps().size(), 1U);
}

TEST_F(CommunicationTest, TenInterruptionsArePassedOverAndTheEleventhFails) {
    const Pipe pipe;
    unsigned char byte = 0;
    {
        const Interruptions interruptions(pipe.write_end.Get(), 10);
        BufferRead(pipe.read_end.Get(), 1, &byte);
    }
    EXPECT_EQ(byte, 'x');
    const Error error = ErrorOf([&] {
        const Interruptions interruptions(pipe.write_end.Get(), kNever);
        BufferRead(pipe.read_end.Get(), 1, &byte);
    });
    EXPECT_EQ(error.code, 502);
    EXPECT_EQ(error.reason, "read failed, reason=Interrupted system call");
}

TEST_F(CommunicationTest, ACommandIsOneFrameEachWay) {
    fake::ScriptedServer server(kDaemonSocket);
    server.ThenReply("this is no JSON, and nobody looks");
    server.ThenReply(std::string(200000, ' '));
    server.ThenReply("");
    const std::size_t descriptors = OpenDescriptors();
    const Json::Value big = std::string(100000, 'b');
    SendCommandToDaemon("pause", Parse(R"({"resume_time": 5})"));
    SendCommandToDaemon("resume", Json::Value());
    SendCommandToDaemon("big", big);
    EXPECT_TRUE(NoneLeaked(descriptors));
    const auto requests = server.Requests();
    ASSERT_EQ(requests.size(), 3U);
    EXPECT_EQ(requests[0], Parse(R"({"type": "pause", "data": {"resume_time": 5}})"));
    EXPECT_EQ(requests[1], Parse(R"({"type": "resume", "data": null})"));
    EXPECT_EQ(requests[2]["data"], big);
    struct sigaction action {};
    sigaction(SIGPIPE, nullptr, &action);
    EXPECT_EQ(action.sa_handler, SIG_IGN);
}

TEST_F(CommunicationTest, AMissingSocketIsTriedFiveTimes) {
    const std::size_t descriptors = OpenDescriptors();
    const Error error = ErrorOf([] { SendCommandToDaemon("pause", Json::Value()); });
    EXPECT_EQ(error.code, 502);
    EXPECT_EQ(error.reason, "write failed, reason=Transport endpoint is not connected");
    EXPECT_EQ(fake::Sleeps(), std::vector<std::chrono::microseconds>(4, std::chrono::seconds(1)));
    EXPECT_TRUE(NoneLeaked(descriptors));

    // A daemon that comes up meanwhile is found.
    fake::ResetLibc();
    std::unique_ptr<fake::ScriptedServer> server;
    fake::OnSleep([&](auto) {
        if (fake::Sleeps().size() == 4) {
            server = std::make_unique<fake::ScriptedServer>(kDaemonSocket);
        }
    });
    SendCommandToDaemon("pause", Json::Value());
    EXPECT_EQ(server->Connections(), 1);
}

TEST_F(CommunicationTest, AMisbehavingDaemonIsAnErrorAndLeaksNothing) {
    fake::ScriptedServer server(kDaemonSocket);
    const std::size_t descriptors = OpenDescriptors();
    server.Then({std::string("\xff\xff\xff\xff", 4)});
    const Error huge = ErrorOf([] { SendCommandToDaemon("pause", Json::Value()); });
    EXPECT_EQ(huge.code, 502);
    EXPECT_EQ(huge.reason, "read failed, reason=Message too long");

    server.Then({.bytes = "", .read_request = false});
    const Error hung_up = ErrorOf([] { SendCommandToDaemon("x", std::string(1U << 20, 'x')); });
    EXPECT_EQ(hung_up.code, 502);
    EXPECT_TRUE(NoneLeaked(descriptors));

    server.Then({.bytes = "", .read_request = false, .keep_open = true});
    const Error stalled = ErrorOf([] { SendCommandToDaemon("x", std::string(1U << 22, 'x')); });
    EXPECT_EQ(stalled.reason, "write failed, reason=Resource temporarily unavailable");
}

}  // namespace
}  // namespace quivra::fileindex
