#include <unistd.h>

#include "tests/programs/fileindexctl/ctl_fixture.h"

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

TEST_F(FolderTest, AddUnderstandsEveryKindOfPath) {
    struct Row {
        std::vector<std::string> arguments;
        const char* path;
        const char* name;
        std::string contents;
    };
    std::filesystem::current_path("/volume1/photo");
    const Row rows[] = {
        {{"/photo"}, "/photo", "photo", "1111"},
        {{"/volume1/music", "--name", "All music", "--no-video", "--no-photo"},
         "/music",
         "All music",
         "1100"},
        {{"2019/", "--no-document", "--no-audio"}, "/photo/2019", "2019", "0011"},
    };
    for (const Row& row : rows) {
        std::vector<std::string> arguments = {"folder", "add"};
        arguments.insert(arguments.end(), row.arguments.begin(), row.arguments.end());
        const Result result = Piped(arguments);
        EXPECT_EQ(result.status, kSuccess) << result.err;
        const Json::Value set = Folders();
        const Json::Value& folder = set[set.size() - 1];
        EXPECT_EQ(folder["path"], row.path);
        EXPECT_EQ(folder["name"], row.name);
        std::string contents;
        for (const char* content : {"document", "audio", "video", "photo"}) {
            contents += folder[content].asBool() ? '1' : '0';
        }
        EXPECT_EQ(contents, row.contents);
    }
    std::filesystem::current_path("/");
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
        {{"folder", "get", "/photo/2019"}, "[902]", "/photo/2019"},
        {{"folder", "delete", "/photo/2019"}, "[902]", "/photo/2019"},
        {{"folder", "reindex", "/music"}, "share music", "/music"},
        {{"share", "pause", "music"}, "share music", "folder list"},
        {{"share", "rename", "music", "songs"}, "share music", "folder list"},
        {{"volume", "pause", "/volume9"}, "volume /volume9", "status"},
        {{"volume", "clear", "/volume1"}, "volume /volume1", "cleared"},
    };
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

TEST_F(FolderTest, SetKeepsWhatIsNotNamed) {
    Piped({"folder", "add", "/photo", "--name", "Mine", "--no-audio"});
    EXPECT_EQ(Piped({"folder", "set", "/photo", "--no-video", "--audio"}).status, kSuccess);
    const Json::Value folder = PipedJson({"folder", "get", "/photo", "--json"});
    EXPECT_EQ(folder["name"], "Mine");
    EXPECT_TRUE(folder["audio"].asBool());
    EXPECT_FALSE(folder["video"].asBool());
    EXPECT_TRUE(folder["photo"].asBool());
    EXPECT_NE(folder["additional"]["status"]["text"].asString(), "");
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

TEST_F(FolderTest, ListPagesAndSorts) {
    EXPECT_EQ(Piped({"folder", "list"}).out, "");
    Piped({"folder", "add", "/photo", "--name", "b"});
    Piped({"folder", "add", "/music", "--name", "a"});
    const Result result = Piped({"folder", "list"});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_LT(result.out.find("/music"), result.out.find("/photo"));
    EXPECT_EQ(PipedJson({"folder", "list", "--json", "--sort", "-name"})["folder"][0]["path"],
              "/photo");
    const Result page = Piped({"folder", "list", "--limit", "1", "--offset", "1"});
    EXPECT_EQ(page.out.find("/music"), std::string::npos);
    EXPECT_NE(page.err.find("1 of 2"), std::string::npos);
}

TEST_F(FolderTest, DeleteAlsoFindsAFolderWhosePathIsTypedInFull) {
    Piped({"folder", "add", "/photo"});
    EXPECT_EQ(Piped({"folder", "delete", "/volume1/photo/"}).status, kSuccess);
    EXPECT_EQ(Folders().size(), 0U);
}

TEST_F(FolderTest, ADeletionThatWasCutOffSaysWhatIsLeft) {
    Piped({"folder", "add", "/photo"});
    fake::FailNext("MonitorQueue::Delete");
    const Result result = Piped({"folder", "delete", "/photo"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("share clear photo /volume1/photo'"), std::string::npos)
        << result.err;
    EXPECT_EQ(Folders().size(), 0U);
    EXPECT_EQ(Piped({"share", "clear", "photo", "/volume1/photo"}).status, kSuccess);
    EXPECT_EQ(search_.Requests().back()["command"], "index_delete");
}

TEST_F(FolderTest, SharesVolumesAndPauseReachTheLibrary) {
    Piped({"folder", "add", "/photo"});
    struct Row {
        std::vector<std::string> arguments;
        const char* daemon_command;  ///< null: the daemon is not told
    };
    const Row rows[] = {
        {{"share", "pause", "photo"}, "worker_delete"},
        {{"share", "resume", "photo"}, "worker_create"},
        {{"volume", "pause", "/volume1"}, "worker_delete"},
        {{"volume", "resume", "/volume1"}, "worker_create"},
        {{"share", "check-recycle", "photo"}, nullptr},
        {{"folder", "reindex", "/photo/2019"}, nullptr},
        {{"pause"}, "pause"},
        {{"pause", "2"}, "pause"},
        {{"resume"}, "resume"},
        {{"services", "prepare"}, nullptr},
    };
    for (const Row& row : rows) {
        for (const bool json : {false, true}) {
            std::vector<std::string> arguments = row.arguments;
            if (json) {
                arguments.push_back("--json");
            }
            const Result result = Piped(arguments);
            EXPECT_EQ(result.status, kSuccess) << result.err;
            EXPECT_NE(result.out, "");
            if (json) {
                EXPECT_TRUE(Parse(result.out).isObject());
            }
            if (row.daemon_command != nullptr) {
                EXPECT_EQ(indexer_.Requests().back()["type"], row.daemon_command);
            }
        }
    }
}

TEST_F(FolderTest, APauseThatTheDaemonDidNotHearOfIsRecorded) {
    std::filesystem::remove(kDaemonSocket);
    const Result result = Piped({"pause"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("it is recorded"), std::string::npos) << result.err;
    EXPECT_EQ(ReadFile("/var/packages/Quivra/etc/fileindex.status"), R"({"resume_time":0})");
}

TEST_F(FolderTest, WhatServicesPrintDoesNotMixWithTheOutput) {
    fake::Platform()->on_call = [](const std::string&) {
        EXPECT_EQ(write(STDOUT_FILENO, "chatter", 7), 7);
        EXPECT_EQ(write(STDERR_FILENO, "chatter", 7), 7);
    };
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    Piped({"services", "prepare"});
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
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
    EXPECT_EQ(PipedJson({"share", "list", "--json"})["share"].size(), 3U);
    fake::FailNext("KESTOShareEnum");
    EXPECT_EQ(Piped({"share", "list"}).status, kFailure);
}

}  // namespace
}  // namespace quivra::ctl
