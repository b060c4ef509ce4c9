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

TEST_F(EventAddTest, EachKindIsOneBitOfOneLine) {
    const std::pair<const char*, int> kinds[] = {
        {"create", 64}, {"modify", 2}, {"delete", 128}, {"attr", 4}, {"reindex", 65536}};
    for (const auto& [kind, event] : kinds) {
        EXPECT_EQ(Piped({"event", "add", "/volume1/s/a", "--kind", kind}).status, kSuccess);
        EXPECT_EQ(LastLine()["event"], event) << kind;
    }
    const Json::Value told = PipedJson({"event", "add", "--kind=rename", "--dir", "--json",
                                        "--from=/volume1/s/old", "/volume1/s/new"});
    EXPECT_EQ(LastLine(), Parse(R"({"event":256,"is_dir":true,"path":"/volume1/s/new",
                                    "path_old":"/volume1/s/old","data":null})"));
    EXPECT_EQ(told["event"], LastLine());
}

TEST_F(EventAddTest, RelativePathsAreResolvedButNotLinks) {
    std::filesystem::create_directories("/volume1/s/real/sub");
    std::filesystem::create_directory_symlink("real", "/volume1/s/link");
    std::filesystem::current_path("/volume1/s/real");
    const std::pair<const char*, const char*> rows[] = {
        {"./sub/../y//z/", "/volume1/s/real/y/z"},
        {"../link/x", "/volume1/s/link/x"},
        {".", "/volume1/s/real"},
    };
    for (const auto& [given, meant] : rows) {
        EXPECT_EQ(Piped({"event", "add", given, "--kind", "modify"}).status, kSuccess) << given;
        EXPECT_EQ(LastLine()["path"], meant) << given;
    }
    std::filesystem::current_path("/");
}

TEST_F(EventAddTest, PathsThatNoEventHasAreRefused) {
    AddShare("t");
    for (const char* path : {"/volume1/s/", "/volume1//s/a", "/volume1/s/../s/a", ""}) {
        EXPECT_EQ(Piped({"event", "add", path, "--kind", "modify"}).status, kWrongCall) << path;
    }
    const Result outside = Piped({"event", "add", "/etc/passwd", "--kind", "modify"});
    EXPECT_EQ(outside.status, kFailure);
    EXPECT_NE(outside.err.find("[800]"), std::string::npos) << outside.err;
    const std::pair<const char*, int> old_paths[] = {{"/volume1/s/b/", kWrongCall},
                                                     {"/volume1/t/a", kFailure}};
    for (const auto& [from, status] : old_paths) {
        EXPECT_EQ(Piped({"event", "add", "/volume1/s/a", "--kind=rename", "--from", from}).status,
                  status);
    }
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
