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

TEST(ProgramTest, ShowsAQueueAndReportsFailures) {
    WriteFile("/tmp/queue", "{\"event\":64,\"path\":\"/v/s/a\"}\nbad line\n");
    const support::Outcome shown =
        support::RunProgram("fileindexctl", {"queue", "show", "/tmp/queue"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_EQ(shown.output, "[02] /v/s/a\nconsumed: 1\n");  // the library's log stays in the log
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show", "/tmp/none"}).status, 1);
    EXPECT_EQ(support::RunProgram("fileindexctl", {"queue", "show"}).status, 2);
}

TEST(ProgramTest, AReaderMayGoAwayButAFullDiskIsAFailure) {
    std::string queue;
    for (int i = 0; i < 20000; ++i) {
        queue += "{\"event\":64,\"path\":\"/v/s/" + std::to_string(i) + "\"}\n";
    }
    WriteFile("/tmp/queue", queue);
    const std::string call = FILEINDEX_BIN_DIR "/fileindexctl queue show /tmp/queue";
    const std::string piped =
        "{ " + call + "; echo $? >/tmp/status; } 2>/tmp/errors | head -1 >/tmp/first";
    ASSERT_EQ(std::system(piped.c_str()), 0);
    std::string status;
    std::ifstream("/tmp/status") >> status;
    EXPECT_EQ(status, "0");
    EXPECT_EQ(std::filesystem::file_size("/tmp/errors"), 0U);
    EXPECT_EQ(WEXITSTATUS(std::system((call + " >/dev/full 2>/tmp/errors").c_str())), 1);
    EXPECT_GT(std::filesystem::file_size("/tmp/errors"), 0U);
}

}  // namespace
