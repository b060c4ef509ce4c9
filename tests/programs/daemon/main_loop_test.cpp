#include <gtest/gtest.h>
#include <kesto/daemon_socket.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <cstring>
#include <optional>

#include "programs/daemon/frame_server.h"
#include "programs/daemon/program.h"
#include "programs/daemon/service_manager.h"
#include "programs/daemon/signals.h"
#include "tests/support/program.h"

namespace quivra::daemon {
namespace {

using namespace std::chrono_literals;

/// The service manager's end of the socket.
class Manager {
  public:
    Manager() : fd_(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, kPath);
        unlink(kPath);
        EXPECT_EQ(bind(fd_.Get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
        setenv("NOTIFY_SOCKET", kPath, 1);
        setenv("WATCHDOG_USEC", "20000000", 1);
        setenv("WATCHDOG_PID", std::to_string(getpid()).c_str(), 1);
    }
    ~Manager() { unlink(kPath); }

    /// The next message; empty when there is none.
    std::string Next() const {
        char text[64] = {};
        return recv(fd_.Get(), text, sizeof(text) - 1, 0) > 0 ? text : "";
    }

  private:
    static constexpr const char* kPath = "/tmp/main_loop_test.notify";
    base::UniqueFd fd_;
};

TEST(ServiceManager, IsToldOfTheStartAndOfEveryTurnThatCounts) {
    const Manager there;
    ServiceManager manager;
    EXPECT_EQ(std::getenv("NOTIFY_SOCKET"), nullptr) << "workers would speak for the daemon";
    manager.Ready();
    EXPECT_EQ(there.Next(), "READY=1");
    const auto now = ServiceManager::Clock::now();
    manager.Turn(now);
    EXPECT_EQ(there.Next(), "WATCHDOG=1");
    manager.Turn(now + 9s);
    EXPECT_EQ(there.Next(), "");
    EXPECT_EQ(manager.PollTimeout(ServiceManager::Clock::time_point::max(), now + 9s), 1000);
    EXPECT_EQ(manager.PollTimeout(now + 9500ms, now + 9s), 500);
    EXPECT_EQ(manager.PollTimeout(now, now + 9s), 0);
    EXPECT_EQ(manager.PollTimeout(ServiceManager::Clock::time_point::min(), now), 0);
    manager.Turn(now + 10s);
    EXPECT_EQ(there.Next(), "WATCHDOG=1");

    ServiceManager nobody;  // the environment was taken
    nobody.Ready();
    nobody.Turn(now + 100s);
    EXPECT_EQ(there.Next(), "");
    EXPECT_EQ(nobody.PollTimeout(ServiceManager::Clock::time_point::max(), now), -1);
}

constexpr const char* kSocket = "/tmp/main_loop_test.sock";

/// A daemon whose requests "hang" never end.
int RunDaemon() {
    return RunProgram("main_loop_test", {}, [] {
        const Signals signals;
        ServiceManager manager;
        FrameServerOptions options;
        options.path = kSocket;
        options.workers = 2;
        FrameServer server(options, [](const std::string& request) {
            while (request == "hang") {
                pause();
            }
            return request;
        });
        server.RunMain(signals, manager);
        return 0;
    });
}

bool Sends(const std::string& request, std::string* reply = nullptr) {
    kestodaemon::DomainSockConnection connection(kSocket);
    return connection.Connect() && connection.Send(request) &&
           (reply == nullptr || connection.Recv(*reply));
}

TEST(MainLoop, StopsWithinASecondWhateverHangsAndOutlivesOtherSignals) {
    const pid_t child = fork();
    if (child == 0) {
        _exit(RunDaemon());
    }
    std::string reply;
    ASSERT_TRUE(support::Eventually([&] { return Sends("ready", &reply); }));
    kill(child, SIGHUP);
    kill(child, SIGPIPE);
    ASSERT_TRUE(Sends("still there", &reply));
    EXPECT_EQ(reply, "still there");
    kestodaemon::DomainSockConnection hanging(kSocket);
    ASSERT_TRUE(hanging.Connect() && hanging.Send("hang"));
    ASSERT_TRUE(Sends("behind it", &reply));

    const auto begin = std::chrono::steady_clock::now();
    kill(child, SIGTERM);
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 1s);
    unlink(kSocket);
}

}  // namespace
}  // namespace quivra::daemon
