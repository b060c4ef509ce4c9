#include "fileindex/communication.h"

#include <signal.h>
#include <unistd.h>

#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

using CommunicationTest = LibraryTest;

TEST_F(CommunicationTest, ACommandIsOneFrameEachWay) {
    fake::ScriptedServer server(kDaemonSocket);
    server.ThenReply("this is no JSON, and nobody looks");
    server.ThenReply(std::string(200000, ' '));
    const std::size_t descriptors = OpenDescriptors();
    const Json::Value big = std::string(100000, 'b');
    SendCommandToDaemon("pause", Parse(R"({"resume_time": 5})"));
    SendCommandToDaemon("big", big);
    EXPECT_TRUE(NoneLeaked(descriptors));
    const auto requests = server.Requests();
    ASSERT_EQ(requests.size(), 2U);
    EXPECT_EQ(requests[0], Parse(R"({"type": "pause", "data": {"resume_time": 5}})"));
    EXPECT_EQ(requests[1]["data"], big);
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
    struct Row {
        fake::Turn turn;
        std::size_t size;
        const char* reason;
    };
    const Row rows[] = {
        {{std::string(4, '\xff')}, 1, "read failed, reason=Message too long"},
        {{.bytes = "", .read_request = false}, 1U << 20, ""},  // by what depends on the moment
        {{.bytes = "", .read_request = false, .keep_open = true},
         1U << 22,
         "write failed, reason=Resource temporarily unavailable"},
    };
    fake::ScriptedServer server(kDaemonSocket);
    for (const Row& row : rows) {
        const std::size_t descriptors = OpenDescriptors();
        server.Then(row.turn);
        const Error error = ErrorOf([&] { SendCommandToDaemon("x", std::string(row.size, 'x')); });
        EXPECT_EQ(error.code, 502);
        EXPECT_TRUE(error.reason.starts_with(row.reason)) << error.reason;
        EXPECT_TRUE(NoneLeaked(descriptors + (row.turn.keep_open ? 1 : 0)));
    }
}

}  // namespace
}  // namespace quivra::fileindex
