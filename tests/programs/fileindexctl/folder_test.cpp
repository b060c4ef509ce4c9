#include <unistd.h>

#include "common/lock_file.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/programs/fileindexctl/ctl_fixture.h"
#include "tests/support/files.h"

namespace quivra::ctl {
namespace {

/// Both daemons answer; the set is empty.
class FolderTest : public CtlTest {
  protected:
    FolderTest() : search_(kSearchSocket), indexer_(kDaemonSocket) {
        AddShare("photo");
        AddShare("music");
        std::filesystem::create_directories("/volume1/photo/2019");
    }

    static Json::Value Folders() {
        return Parse(ReadFile("/var/packages/Quivra/etc/fileindex.folders"));
    }

    fake::ScriptedServer search_;
    fake::ScriptedServer indexer_;
};

TEST_F(FolderTest, AddAndSetKeepWhatIsNotNamed) {
    std::filesystem::current_path("/volume1/photo");
    EXPECT_EQ(Piped({"folder", "add", "2019/"}).status, kSuccess);
    std::filesystem::current_path("/");
    EXPECT_EQ(Folders()[0]["path"], "/photo/2019");
    EXPECT_EQ(Folders()[0]["name"], "2019");
    EXPECT_EQ(Piped({"folder", "add", "/volume1/music", "--name", "Mine", "--no-audio"}).status,
              kSuccess);
    EXPECT_EQ(Piped({"folder", "set", "/music", "--no-video", "--audio"}).status, kSuccess);
    const Json::Value folder = PipedJson({"folder", "get", "/music", "--json"});
    EXPECT_EQ(folder["name"], "Mine");
    EXPECT_TRUE(folder["audio"].asBool());
    EXPECT_FALSE(folder["video"].asBool());
    EXPECT_TRUE(folder["photo"].asBool());
    EXPECT_NE(folder["additional"]["status"]["text"].asString(), "");
    EXPECT_EQ(Piped({"folder", "delete", "/volume1/music/"}).status, kSuccess);
    EXPECT_EQ(Folders().size(), 1U);
}

TEST_F(FolderTest, FailuresNameObjectCauseAndRemedy) {
    ASSERT_EQ(Piped({"folder", "add", "/photo"}).status, kSuccess);
    std::filesystem::create_directory_symlink("2019", "/volume1/photo/link");
    struct Row {
        std::vector<std::string> arguments;
        const char* code;
        const char* object;
    };
    const Row rows[] = {
        {{"folder", "add", "/photo"}, "[901]", "/photo"},
        {{"folder", "add", "/photo/link"}, "[903]", "/photo/link"},
        {{"folder", "add", "/nowhere/x"}, "[800]", "/nowhere/x"},
        {{"folder", "set", "/music"}, "[902]", "/music"},
        {{"share", "pause", "music"}, "share music", "folder list"},
        {{"volume", "pause", "/volume9"}, "volume /volume9", "status"},
        {{"volume", "clear", "/volume1"}, "volume /volume1", "cleared"},
        {{"share", "rename", "photo", "music"}, "photo", "old name"},
        {{"share", "migrate", "photo", "/volume1/photo"}, "photo", "still lies there"},
        {{"share", "migrate", "photo", "/nowhere"}, "photo", "ends in /photo"},
        {{"folder", "add", "/photo/inner/x"}, "share inner", "use /inner/x"},
    };
    fake::AddShare("inner", "/volume1/photo/inner");
    const Json::Value before = Folders();
    for (const Row& row : rows) {
        const Result result = Piped(row.arguments);
        EXPECT_EQ(result.status, kFailure) << testing::PrintToString(row.arguments);
        EXPECT_EQ(result.out, "");
        EXPECT_NE(result.err.find(row.code), std::string::npos) << result.err;
        EXPECT_NE(result.err.find(row.object), std::string::npos) << result.err;
    }
    EXPECT_EQ(Folders(), before);
}

TEST_F(FolderTest, AFailureAfterTheSaveSaysHowToGoOn) {
    fake::FailNext("MonitorQueue::Upsert");
    const Result result = Piped({"folder", "add", "/photo"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("folder set /photo"), std::string::npos) << result.err;
    EXPECT_EQ(Folders().size(), 1U);
    // Nothing is lost when nobody does: the folder's content waits in the queue.
    EXPECT_EQ(Piped({"queue", "show", QueueOf("photo")}).out, "[06] /volume1/photo\nconsumed: 1\n");
    EXPECT_EQ(Piped({"folder", "set", "/photo"}).status, kSuccess);
    EXPECT_EQ(search_.Requests().back()["command"], "index_create");
    EXPECT_EQ(fake::Platform()->monitor_queues.size(), 1U);
}

TEST_F(FolderTest, PausingReachesTheDaemon) {
    Piped({"folder", "add", "/photo"});
    const std::pair<std::vector<std::string>, const char*> rows[] = {
        {{"share", "pause", "photo"}, "worker_delete"},
        {{"share", "resume", "photo"}, "worker_create"},
        {{"volume", "pause", "/volume1"}, "worker_delete"},
        {{"volume", "resume", "/volume1"}, "worker_create"},
        {{"pause", "2"}, "pause"},
        {{"resume"}, "resume"},
    };
    for (const auto& [arguments, command] : rows) {
        EXPECT_EQ(Piped(arguments).status, kSuccess);
        EXPECT_EQ(indexer_.Requests().back()["type"], command);
    }
    std::filesystem::remove(kDaemonSocket);
    const Result marked = Piped({"volume", "pause", "/volume1"});
    EXPECT_NE(marked.err.find("the folders are marked"), std::string::npos) << marked.err;
    EXPECT_TRUE(Folders()[0]["paused"].asBool());
    const Result result = Piped({"pause"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("it is recorded"), std::string::npos) << result.err;
    EXPECT_EQ(ReadFile("/var/packages/Quivra/etc/fileindex.status"), R"({"resume_time":0})");
    const LockFile lock(fileindex::kFileIndexStatusLockPath, true);
    const Result locked = Piped({"resume"});
    EXPECT_EQ(locked.status, kFailure);
    EXPECT_EQ(locked.err.find("recorded"), std::string::npos) << locked.err;
}

/// Runs the command while somebody else holds the folder lock.
TEST_F(FolderTest, ChangesOfTheSetRunUnderItsLock) {
    Piped({"folder", "add", "/photo"});
    const std::string before = ReadFile("/var/packages/Quivra/etc/fileindex.folders");
    const LockFile lock(fileindex::kFileIndexFoldersLockPath, true);
    const std::vector<std::string> rows[] = {
        {"folder", "add", "/music"},     {"share", "pause", "photo"},
        {"share", "resume", "photo"},    {"share", "clear", "photo", "/volume1/photo"},
        {"volume", "pause", "/volume1"}, {"volume", "resume", "/volume1"},
        {"volume", "clear", "/volume1"},
    };
    for (const std::vector<std::string>& row : rows) {
        const Result result = Piped(row);
        EXPECT_EQ(result.status, kFailure) << testing::PrintToString(row);
        EXPECT_NE(result.err.find("[506]"), std::string::npos) << result.err;
    }
    EXPECT_EQ(ReadFile("/var/packages/Quivra/etc/fileindex.folders"), before);
}

TEST_F(FolderTest, ClearingBringsAShareToRestFirst) {
    Piped({"folder", "add", "/photo"});
    Piped({"folder", "add", "/music"});
    for (const char* path : {"/volume1/music", "/volume9/photo", "/volume1/photo/x"}) {
        const Result wrong = Piped({"share", "clear", "photo", path});
        EXPECT_EQ(wrong.status, kFailure) << path;
        EXPECT_EQ(wrong.out, "") << path;
    }
    EXPECT_EQ(Piped({"share", "clear", "nobody", "/volume1/nobody"}).status, kFailure);
    EXPECT_EQ(Folders().size(), 2U);

    EXPECT_EQ(Piped({"share", "clear", "photo", "/volume1/photo"}).out, "Cleared share photo.\n");
    EXPECT_EQ(indexer_.Requests().back()["type"], "worker_delete");
    EXPECT_EQ(fake::Platform()->monitor_queues.size(), 1U);
    // One that the platform has forgotten already.
    fake::Platform()->shares.erase("music");
    EXPECT_EQ(Piped({"share", "clear", "music", "/volume1/music"}).out, "Cleared share music.\n");
    EXPECT_EQ(indexer_.Requests().back()["data"]["share_name"], "music");
    EXPECT_TRUE(fake::Platform()->monitor_queues.empty());
    EXPECT_EQ(Folders().size(), 0U);
}

TEST_F(FolderTest, AShareThatIsGoneIsNamedWithItsRemedy) {
    Piped({"folder", "add", "/photo"});
    Piped({"folder", "add", "/music"});
    fake::Platform()->shares.erase("music");
    const std::vector<std::string> rows[] = {
        {"folder", "delete", "/music"}, {"share", "pause", "music"}, {"why", "/music"}};
    for (const std::vector<std::string>& row : rows) {
        const Result result = Piped(row);
        EXPECT_NE(result.err.find("share music, which has indexed folders, is gone"),
                  std::string::npos)
            << result.err;
        EXPECT_NE(result.err.find("fileindexctl share clear music PATH"), std::string::npos);
    }
    EXPECT_NE(Piped({"folder", "list"}).out.find("error: its share is gone"), std::string::npos);
}

TEST_F(FolderTest, WhatStandsInThePlaceOfTheIndexIsNamed) {
    Piped({"folder", "add", "/photo"});
    const std::size_t commands = indexer_.Requests().size();
    std::filesystem::remove_all("/volume1/photo/@eaDir");
    WriteFile("/volume1/photo/@eaDir", "planted");
    const std::vector<std::string> rows[] = {
        {"folder", "reindex", "/photo"}, {"folder", "set", "/photo"}, {"share", "pause", "photo"}};
    for (const std::vector<std::string>& row : rows) {
        const Result result = Piped(row);
        EXPECT_EQ(result.status, kFailure);
        EXPECT_EQ(result.out, "");
        EXPECT_NE(result.err.find("/volume1/photo/@eaDir is not a directory; remove it"),
                  std::string::npos)
            << result.err;
    }
    EXPECT_EQ(indexer_.Requests().size(), commands);
}

TEST_F(FolderTest, AReindexThatCouldNotBeQueuedIsNotClaimed) {
    Piped({"folder", "add", "/photo"});
    const LockFile lock(QueueOf("photo"), true);
    const Result result = Piped({"folder", "reindex", "/photo/2019"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_EQ(result.out, "");
}

TEST_F(FolderTest, WhatServicesPrintDoesNotMixWithTheOutput) {
    fake::Platform()->on_call = [](const std::string&) {
        EXPECT_EQ(write(STDOUT_FILENO, "chatter", 7), 7);
        EXPECT_EQ(write(STDERR_FILENO, "chatter", 7), 7);
    };
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    Piped({"services", "prepare"});
    EXPECT_EQ(write(STDOUT_FILENO, "o", 1), 1);  // the silence is over
    EXPECT_EQ(write(STDERR_FILENO, "e", 1), 1);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "e");
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "o");
}

TEST_F(FolderTest, ShareListTellsHowEachStands) {
    AddShare("locked");
    fake::Platform()->shares.at("locked").read_only = 1;
    Piped({"folder", "add", "/photo"});
    EXPECT_EQ(Piped({"share", "list"}).out,
              "SHARE   PATH             FOLDERS  INDEXING\n"
              "locked  /volume1/locked  0        not possible\n"
              "music   /volume1/music   0        off\n"
              "photo   /volume1/photo   1        on\n");
    support::WriteFile("/etc/kesto/shares.conf", "[s]\npath = /volume1/s/\n[t\n");
    const Result wrong = Piped({"share", "list"});
    EXPECT_EQ(wrong.status, kFailure);
    EXPECT_NE(wrong.err.find("/etc/kesto/shares.conf:2: "), std::string::npos) << wrong.err;
    EXPECT_NE(Piped({"status"}).out.find("/etc/kesto/shares.conf:3: "), std::string::npos);
    std::filesystem::remove("/etc/kesto/shares.conf");
}

}  // namespace
}  // namespace quivra::ctl
