#include "base/frame.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cerrno>
#include <string>
#include <thread>

namespace {

using namespace quivra::base;
using std::chrono::milliseconds;

struct Pair {
    Pair() {
        int ends[2];
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        a = UniqueFd(ends[0]);
        b = UniqueFd(ends[1]);
    }
    UniqueFd a;
    UniqueFd b;
};

Deadline Soon() {
    return std::chrono::steady_clock::now() + milliseconds(20);
}

TEST(FrameTest, MessagesOfAnySizeArriveWhole) {
    for (const std::size_t size : {0U, 1U, 70'000U, 3'000'000U}) {
        Pair pair;
        const std::string sent(size, 'x');
        std::thread sender([&] { EXPECT_TRUE(SendFrame(pair.a.Get(), sent)); });
        std::string received = "old";
        EXPECT_TRUE(ReceiveFrame(pair.b.Get(), received, kMaxFrameSize, kNoDeadline));
        sender.join();
        EXPECT_EQ(received, sent);
    }
}

TEST(FrameTest, NothingIsWaitedForBeyondTheDeadline) {
    Pair pair;
    std::string message;
    EXPECT_FALSE(ReceiveFrame(pair.b.Get(), message, 10, Soon()));
    EXPECT_EQ(errno, ETIMEDOUT);
    // Nobody reads, so the socket's buffer fills.
    EXPECT_FALSE(SendFrame(pair.a.Get(), std::string(10'000'000, 'x'), Soon()));
    EXPECT_EQ(errno, ETIMEDOUT);
}

TEST(FrameTest, ALongOrTornMessageIsRefused) {
    Pair pair;
    std::string message;
    ASSERT_TRUE(SendFrame(pair.a.Get(), "12345"));
    EXPECT_FALSE(ReceiveFrame(pair.b.Get(), message, 4));
    EXPECT_EQ(errno, EMSGSIZE);

    Pair torn;
    const FramePrefix prefix = MakeFramePrefix(5);
    ASSERT_EQ(send(torn.a.Get(), prefix.data(), prefix.size(), 0), 4);
    torn.a.Reset();
    EXPECT_FALSE(ReceiveFrame(torn.b.Get(), message));
    EXPECT_EQ(errno, ECONNRESET);
    EXPECT_FALSE(SendFrame(torn.b.Get(), "nobody there"));  // and no SIGPIPE
}

}  // namespace
