#include <unistd.h>

#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

/// A share with one folder, and its daemons as the test wants them.
class StatusTest : public DaemonsTest {
  protected:
    StatusTest() {
        AddShare("s");
        SetFolders({"/s"});
    }

    static std::string FolderStatus() {
        return PipedJson({"status", "--json"}, kFailure)["folder"][0]["status"]["text"].asString();
    }
};

TEST_F(StatusTest, FinishedIsSaidOnlyWhenEverythingWorks) {
    const Json::Value good = PipedJson({"status", "--json"});
    EXPECT_EQ(good["folder"][0]["status"]["text"], "finished");
    EXPECT_TRUE(good["finished"].asBool());
    struct Row {
        std::optional<fake::ScriptedServer>* daemon;  // null: it is not there
        std::string state;                            // what it tells instead
        const char* part;                             // of what status says
        const char* text = "incomplete";
    };
    const std::string queue = QueueOf("s");
    const Row rows[] = {
        {&monitor_, R"({"folders":[]})", "does not watch it"},
        {&monitor_, R"({"folders":[{"queue":")" + queue + R"(","watched":50,"unwatched":150}]})",
         "150 of 200 directories are not watched"},
        {&monitor_,
         R"({"folders":[{"queue":")" + queue + R"(","watched":5,"problem":"out of watches"}]})",
         "problem: out of watches"},
        {&monitor_,
         R"({"problem":"no descriptors left.","folders":[{"queue":")" + queue + R"("}]})",
         "no descriptors left."},
        {&monitor_, "7", "kestotifyd does not tell how it is (its reply makes no sense)"},
        {&indexer_, R"({"shares":[]})", "fileindexd does not work on it"},
        {&indexer_, R"({"shares":[{"share":"s","problem":"its store is damaged"}]})",
         "its store is damaged"},
        {&search_, R"({"indexes":[{"id":"fileindex_s","documents":3,"problem":"disk on fire"}]})",
         "disk on fire"},
    };
    for (const Row& row : rows) {
        Tell(*row.daemon, row.state);
        EXPECT_EQ(FolderStatus(), row.text) << row.part;
        const Result shown = Piped({"status"});
        EXPECT_NE(shown.out.find(row.part), std::string::npos) << shown.out;
        EXPECT_EQ(shown.out.find("finished"), std::string::npos) << shown.out;
        TellThatAllIsWell();
    }
    for (std::optional<fake::ScriptedServer>* daemon : {&indexer_, &search_, &monitor_}) {
        daemon->reset();
        EXPECT_EQ(FolderStatus(), "incomplete");
        const Result shown = Piped({"status"});
        EXPECT_EQ(shown.status, kFailure);
        EXPECT_NE(shown.out.find("is not running"), std::string::npos) << shown.out;
        StartDaemons();
    }
    std::filesystem::remove_all("/volume1/s/@eaDir");
    WriteFile("/volume1/s/@eaDir", "planted");
    const std::string text = Piped({"status"}).out;
    EXPECT_NE(text.find("/volume1/s/@eaDir is not a directory; remove it"), std::string::npos)
        << text;
}

TEST_F(StatusTest, WorkThatIsLeftIsNotFinished) {
    Tell(search_, R"({"indexes":[{"id":"fileindex_s","documents":0,"fresh":true}]})");
    Json::Value status = PipedJson({"status", "--json"});
    EXPECT_EQ(status["folder"][0]["status"]["text"], "processing");
    EXPECT_FALSE(status["finished"].asBool());
    TellThatAllIsWell();
    Tell(indexer_, R"({"shares":[{"share":"s","state":"processing","done":30,"total":120,
        "current":"/volume1/s/\u001b[2J","last_error":"disk on fire","waiting":200,
        "waiting_bytes":3200000,"phase":"contents","eta":150,"failed":2}]})");
    WriteFile(QueueOf("s"),
              "{\"event\":2,\"path\":\"/volume1/s/a\"}\n{\"event\":2,\"path\":\"/volume1/s/b\"}");
    WriteFile(QueueOf("s") + ".tmp", "{\"event\":2,\"path\":\"/volume1/s/c\"}\n");
    const std::string text = OnTerminal({"status"}).out;
    for (const char* part :
         {"7 documents, 3 changes waiting, processing", "[#####-----------------] 30 of 120",
          "30 of 120  /volume1/s/\\x1b[2J", "last error: disk on fire",
          "200 files of 3.2 MB waiting (contents), about 3 minutes left",
          "2 files without content, see 'fileindexctl failed s'"}) {
        EXPECT_NE(text.find(part), std::string::npos) << part << "\n" << text;
    }
    std::filesystem::remove(QueueOf("s"));
    std::filesystem::remove(QueueOf("s") + ".tmp");
    EXPECT_EQ(PipedJson({"status", "--json"})["folder"][0]["status"]["text"], "processing");
    Tell(indexer_, R"({"shares":[{"share":"s","waiting":0,"phase":"names"}]})");
    EXPECT_EQ(PipedJson({"status", "--json"})["folder"][0]["status"]["text"], "processing");
}

TEST_F(StatusTest, NothingNeedsToRunForNothing) {
    SetFolders({});
    monitor_.reset();
    indexer_.reset();
    const Result result = Piped({"status"});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_EQ(result.out.find("not running"), std::string::npos) << result.out;
    EXPECT_EQ(Piped({"services", "list"}).status, kSuccess);
    SetFolders({"/s"});
    const Result services = Piped({"services", "list"});
    EXPECT_EQ(services.status, kFailure);
    EXPECT_NE(services.out.find("kestotifyd     not running"), std::string::npos) << services.out;
}

TEST_F(StatusTest, WhatADaemonTellsIsNotBelieved) {
    for (const char* state :
         {R"({"shares":7})", R"({"shares":[7,{"share":"s","done":-1,"total":1e99,"state":{},
              "problem":[],"eta":"soon","waiting":-5}]})",
          R"({"folders":{},"indexes":"","problem":3})"}) {
        for (std::optional<fake::ScriptedServer>* daemon : {&indexer_, &search_, &monitor_}) {
            Tell(*daemon, state);
        }
        EXPECT_NE(OnTerminal({"status"}).out.find("Shares:"), std::string::npos) << state;
        OnTerminal({"services", "list"});
    }
}

TEST_F(StatusTest, UntilFinishedWaitsForTheQueue) {
    const std::string queue = QueueOf("s");
    WriteFile(queue, "{\"event\":2,\"path\":\"/volume1/s/a\"}\n");
    int sleeps = 0;
    fake::OnSleep([&](std::chrono::microseconds) {
        if (++sleeps == 3) {
            std::filesystem::remove(queue);
        }
    });
    const Result result = OnTerminal({"status", "--watch", "--until-finished"});
    EXPECT_EQ(result.status, kSuccess);
    EXPECT_EQ(sleeps, 3);
    // A new frame goes back up by as many lines as were drawn.
    EXPECT_NE(result.out.find("\x1b[4A\r\x1b[J"), std::string::npos) << result.out;

    SetFolders({"/s", "/unknown/x"});
    const Result failed = Piped({"status", "--until-finished"});
    EXPECT_EQ(failed.status, kFailure);
    EXPECT_NE(failed.out.find("error"), std::string::npos);
}

TEST_F(StatusTest, UntilFinishedEndsWhenADaemonHasGone) {
    WriteFile(QueueOf("s"), "{\"event\":2,\"path\":\"/volume1/s/a\"}\n");
    std::chrono::microseconds slept{0};
    fake::OnSleep([&](std::chrono::microseconds time) {
        monitor_.reset();
        slept += time;
    });
    const Result result = Piped({"status", "--until-finished"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_NE(result.err.find("kestotifyd is not running"), std::string::npos) << result.err;
    EXPECT_LE(slept, std::chrono::seconds(2));
}

TEST_F(StatusTest, TellsOfAPause) {
    fake::SetTime(1000);
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"resume_time": 1061})");
    EXPECT_NE(Piped({"status"}).out.find("2 more minutes"), std::string::npos);
    WriteFile("/var/packages/Quivra/etc/fileindex.status", "{");
    EXPECT_NE(Piped({"status"}).err.find("[504]"), std::string::npos);
}

TEST_F(StatusTest, FailedListsAndTriesAgain) {
    std::vector<std::string> asked;
    indexer_->SetHandler([&asked](const Json::Value& request) {
        asked.push_back(request["type"].asString() + " " + request["data"]["share"].asString());
        return fake::Frame(request["type"] == "failed" ? R"({"success":true,"data":[
            {"path":"/volume1/s/\u001b","reason":"a lease","since":1,"next_try":0}, 7]})"
                                                       : R"({"success":true})");
    });
    EXPECT_NE(Piped({"failed"}).out.find("/volume1/s/\\x1b  1970-01-01 00:00  when it changes"),
              std::string::npos);
    EXPECT_EQ(PipedJson({"failed", "--json"})["failed"][0]["reason"], "a lease");
    EXPECT_EQ(Piped({"failed", "s", "--retry"}).status, kSuccess);
    EXPECT_EQ(asked.back(), "retry s");
    EXPECT_EQ(Piped({"failed", "unknown"}).status, kFailure);
    indexer_->SetHandler([](const Json::Value&) {
        return fake::Frame(R"({"success":false,"error":{"code":120,"msg":"it is paused"}})");
    });
    EXPECT_NE(Piped({"failed", "--retry"}).err.find("share s: it is paused"), std::string::npos);
    indexer_.reset();
    EXPECT_NE(Piped({"failed"}).err.find("fileindexd is not running"), std::string::npos);
}

}  // namespace
}  // namespace quivra::ctl
