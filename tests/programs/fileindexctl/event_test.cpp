#include <sys/resource.h>
#include <unistd.h>

#include <csignal>

#include "common/lock_file.h"
#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

class EventAddTest : public CtlTest {
  protected:
    EventAddTest() { AddShare("s"); }

    static Json::Value LastLine() {
        std::string text = ReadFile(QueueOf("s"));
        EXPECT_TRUE(text.ends_with("\n"));
        text.pop_back();
        return Parse(text.substr(text.rfind('\n') + 1));
    }
};

TEST_F(EventAddTest, EachKindIsOneBit) {
    struct Row {
        std::vector<std::string> arguments;
        std::string line;
    };
    const Row rows[] = {
        {{"/volume1/s/a", "--kind", "create"},
         R"({"event":64,"is_dir":false,"path":"/volume1/s/a","path_old":"","data":null})"},
        {{"/volume1/s/a", "--kind", "modify"},
         R"({"event":2,"is_dir":false,"path":"/volume1/s/a","path_old":"","data":null})"},
        {{"/volume1/s/d", "--kind", "delete", "--dir"},
         R"({"event":128,"is_dir":true,"path":"/volume1/s/d","path_old":"","data":null})"},
        {{"/volume1/s/a", "--kind", "attr"},
         R"({"event":4,"is_dir":false,"path":"/volume1/s/a","path_old":"","data":null})"},
        {{"--kind=rename", "--from=/volume1/s/old", "/volume1/s/new"},
         R"({"event":256,"is_dir":false,"path":"/volume1/s/new","path_old":"/volume1/s/old",
             "data":null})"},
        {{"/volume1/s", "--kind", "reindex", "--dir"},
         R"({"event":65536,"is_dir":true,"path":"/volume1/s","path_old":"","data":null})"},
    };
    for (const Row& row : rows) {
        std::vector<std::string> arguments = {"event", "add"};
        arguments.insert(arguments.end(), row.arguments.begin(), row.arguments.end());
        EXPECT_EQ(Piped(arguments).status, kSuccess) << row.line;
        EXPECT_EQ(LastLine(), Parse(row.line));
    }
    const Json::Value told =
        PipedJson({"event", "add", "/volume1/s/a", "--kind", "attr", "--json"});
    EXPECT_EQ(told["event"], LastLine());
}

TEST_F(EventAddTest, PathsAreCanonical) {
    std::filesystem::create_directories("/volume1/s/real/sub");
    std::filesystem::create_directory_symlink("real", "/volume1/s/link");
    std::filesystem::current_path("/volume1/s/real");
    const std::pair<const char*, const char*> relative[] = {
        {"x", "/volume1/s/real/x"},
        {"./sub/../y//z/", "/volume1/s/real/y/z"},
        {"../link/x", "/volume1/s/link/x"},
        {".", "/volume1/s/real"},
    };
    for (const auto& [given, meant] : relative) {
        EXPECT_EQ(Piped({"event", "add", given, "--kind", "modify"}).status, kSuccess) << given;
        EXPECT_EQ(LastLine()["path"], meant) << given;
    }
    std::filesystem::current_path("/");
    const std::string before = ReadFile(QueueOf("s"));
    for (const char* path : {"/volume1/s/", "/volume1//s/a", "/volume1/s/./a", "/volume1/s/../s/a",
                             "//volume1/s", ""}) {
        EXPECT_EQ(Piped({"event", "add", path, "--kind", "modify"}).status, kWrongCall) << path;
    }
    EXPECT_EQ(Piped({"event", "add", "/volume1/s/a", "--kind", "rename", "--from", "/volume1/s/b/"})
                  .status,
              kWrongCall);
    EXPECT_EQ(ReadFile(QueueOf("s")), before);
}

TEST_F(EventAddTest, PathsOutsideTheShareAreRefused) {
    AddShare("t");
    const Result outside = Piped({"event", "add", "/etc/passwd", "--kind", "modify"});
    EXPECT_EQ(outside.status, kFailure);
    EXPECT_NE(outside.err.find("/etc/passwd"), std::string::npos);
    EXPECT_NE(outside.err.find("[800]"), std::string::npos) << outside.err;
    EXPECT_EQ(Piped({"event", "add", "/volume1/s/a", "--kind", "rename", "--from", "/volume1/t/a"})
                  .status,
              kFailure);
    EXPECT_FALSE(std::filesystem::exists(QueueOf("s")));
}

TEST_F(EventAddTest, ALineThatACrashCutOffDoesNotSwallowTheNext) {
    WriteFile(QueueOf("s"), R"({"event":64,"pa)");
    EXPECT_EQ(Piped({"event", "add", "/volume1/s/a", "--kind", "modify"}).status, kSuccess);
    EXPECT_EQ(Piped({"queue", "show", QueueOf("s")}).out, "[02] /volume1/s/a\nconsumed: 1\n");
}

TEST_F(EventAddTest, AFullDiskLeavesWholeLinesOnly) {
    WriteFile(QueueOf("s"), "{\"event\":64,\"path\":\"/volume1/s/a\"}\n");
    const std::string before = ReadFile(QueueOf("s"));
    rlimit old{};
    getrlimit(RLIMIT_FSIZE, &old);
    const rlimit small = {before.size() + 20, old.rlim_max};
    std::signal(SIGXFSZ, SIG_IGN);
    setrlimit(RLIMIT_FSIZE, &small);
    const Result result = Piped({"event", "add", "/volume1/s/b", "--kind", "modify"});
    setrlimit(RLIMIT_FSIZE, &old);
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find(QueueOf("s")), std::string::npos) << result.err;
    EXPECT_EQ(ReadFile(QueueOf("s")), before);
}

TEST_F(EventAddTest, WaitsForTheQueuesLock) {
    const LockFile lock(QueueOf("s"), true);
    const Result result = Piped({"event", "add", "/volume1/s/b", "--kind", "modify"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("[506]"), std::string::npos) << result.err;
    EXPECT_FALSE(fake::Sleeps().empty());
    EXPECT_EQ(ReadFile(QueueOf("s")), "");
}

}  // namespace
}  // namespace quivra::ctl
