#include <sys/stat.h>

#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

class QueueShowTest : public CtlTest {
  protected:
    static constexpr const char* kQueue = "/tmp/queue";
};

TEST_F(QueueShowTest, TellsWhatIsLeftToDo) {
    const std::string text = R"({"event":2,"path":"/v/s/a"}
{"event":256,"path":"/v/s/b","path_old":"/v/s/a"}
{"event":131072,"path":"/v/s","data":{"photo":true}}
{"event":64,"path":"/v/s/gone"}
{"event":128,"path":"/v/s/gone"}
)";
    WriteFile(kQueue, text);
    const Result result = Piped({"queue", "show", kQueue});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_EQ(result.out,
              "[05] /v/s/a -> /v/s/b\n"
              "[02] /v/s/b\n"
              "[04] /v/s, data={\"photo\":true}\n"
              "[01] /v/s/gone\n"
              "consumed: 6\n");
    EXPECT_EQ(PipedJson({"queue", "show", "--json", kQueue}), Parse(R"({"ops": [
        {"op": 5, "path": "/v/s/b", "path_old": "/v/s/a", "data": null},
        {"op": 2, "path": "/v/s/b", "path_old": "", "data": null},
        {"op": 4, "path": "/v/s", "path_old": "", "data": {"photo": true}},
        {"op": 1, "path": "/v/s/gone", "path_old": "", "data": null}], "consumed": 6})"));
    EXPECT_EQ(ReadFile(kQueue), text);
}

TEST_F(QueueShowTest, HostileQueues) {
    struct Row {
        std::string text;
        std::string out;
    };
    const Row rows[] = {
        {"", "consumed: 0\n"},
        {std::string(5000, '[') + "\n{\"event\":64,\"path\":\"/a\"}", "[02] /a\nconsumed: 1\n"},
        {std::string("\0\xff\n{\"event\":64,\"path\":\"/a\"}\n", 28), "[02] /a\nconsumed: 1\n"},
        {"{\"event\":64,\"path\":\"/a\"}\n{\"event\":512,\"path\":\"/a\"}\n",
         "[07] \nconsumed: 1\n"},
    };
    for (const Row& row : rows) {
        WriteFile(kQueue, row.text);
        const Result result = Piped({"queue", "show", kQueue});
        EXPECT_EQ(result.status, kSuccess);
        EXPECT_EQ(result.out, row.out) << row.text.substr(0, 80);
        Piped({"queue", "show", "--json", kQueue});
    }
}

TEST_F(QueueShowTest, WhatIsNotAQueueIsAFailure) {
    std::filesystem::create_directories("/tmp/directory");
    std::filesystem::remove("/tmp/fifo");
    ASSERT_EQ(mkfifo("/tmp/fifo", 0600), 0);
    WriteFile("/tmp/text", "nonsense\n{}\n[]\n{\"event\":\"x\",\"path\":1}\n");
    for (const char* path : {"/tmp/directory", "/tmp/fifo", "/tmp/text", "/tmp/missing"}) {
        for (const char* form : {"--json", "--"}) {
            const Result result = Piped({"queue", "show", form, path});
            EXPECT_EQ(result.status, kFailure) << path;
            EXPECT_EQ(result.out, "") << path;
            EXPECT_NE(result.err.find(path), std::string::npos) << result.err;
        }
    }
}

TEST_F(QueueShowTest, NamesAreEscapedInTextAndExactInJson) {
    WriteFile(kQueue, "{\"event\":64,\"path\":\"/s/\\u001b[2J\xff\"}\n");
    EXPECT_EQ(Piped({"queue", "show", kQueue}).out, "[02] /s/\\x1b[2J\\xff\nconsumed: 1\n");
    EXPECT_EQ(PipedJson({"queue", "show", "--json", kQueue})["ops"][0]["path"].asString(),
              "/s/\x1b[2J\xff");
}

}  // namespace
}  // namespace quivra::ctl
