// The real program: what only shows between processes.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "tests/support/program.h"

namespace {

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream(path) << text;
}

std::string BigQueue() {
    std::string text;
    for (int i = 0; i < 20000; ++i) {
        text += "{\"event\":64,\"path\":\"/v/s/" + std::to_string(i) + "\"}\n";
    }
    return text;
}

TEST(ProgramTest, ShowsAQueueAndReportsFailures) {
    WriteFile("/tmp/queue", "{\"event\":64,\"path\":\"/v/s/a\"}\nbad line\n");
    const support::Outcome shown =
        support::RunProgram("fileindexctl", {"queue", "show", "/tmp/queue"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_EQ(shown.output, "[02] /v/s/a\nconsumed: 1\n");  // the library's log stays in the log
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show", "/tmp/none"}).status, 1);
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show"}).status, 2);
}

TEST(ProgramTest, AReaderThatGoesAwayIsNoFailure) {
    WriteFile("/tmp/queue", BigQueue());
    const std::string program = FILEINDEX_BIN_DIR "/fileindexctl";
    const std::string command =
        "{ " + program +
        " queue show /tmp/queue; echo $? >/tmp/status; } 2>/tmp/errors | head -1 "
        ">/tmp/first";
    ASSERT_EQ(std::system(command.c_str()), 0);
    std::string status;
    std::ifstream("/tmp/status") >> status;
    EXPECT_EQ(status, "0");
    EXPECT_EQ(std::filesystem::file_size("/tmp/errors"), 0U);
}

TEST(ProgramTest, AFullDiskIsAFailure) {
    WriteFile("/tmp/queue", BigQueue());
    const std::string program = FILEINDEX_BIN_DIR "/fileindexctl";
    const int status =
        std::system((program + " queue show /tmp/queue >/dev/full 2>/tmp/errors").c_str());
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_GT(std::filesystem::file_size("/tmp/errors"), 0U);
}

}  // namespace
