#include <unistd.h>

#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

constexpr const char* kState = "/var/run/fileindexd/s.json";

class StatusTest : public CtlTest {
  protected:
    StatusTest() {
        AddShare("s");
        SetFolders({"/s"});
        std::filesystem::create_directories("/var/run/fileindexd");
        std::filesystem::remove(kState);
    }

    static void SetWorker(const std::string& members) {
        WriteFile(kState,
                  R"({"share":"s","pid":)" + std::to_string(getpid()) + "," + members + "}");
    }
};

TEST_F(StatusTest, SurvivesDaemonsThatAreDown) {
    const Json::Value status = PipedJson({"status", "--json"});
    EXPECT_EQ(status["daemons"], Parse(R"({"kestoelasticd": false, "fileindexd": false})"));
    EXPECT_TRUE(status["share"][0]["documents"].isNull());
    EXPECT_FALSE(status["share"][0]["worker"]["running"].asBool());
    EXPECT_NE(Piped({"status"}).out.find("kestoelasticd does not answer"), std::string::npos);
    EXPECT_TRUE(fake::Sleeps().empty());
}

TEST_F(StatusTest, CountsWhatIsDoneAndLeft) {
    fake::ScriptedServer search(kSearchSocket);
    search.SetHandler([](const Json::Value& request) {
        EXPECT_EQ(request["data"]["query"]["limit"], 0);
        return fake::Frame(R"({"success": true, "data": [], "total": 1234})");
    });
    WriteFile(QueueOf("s"),
              "{\"event\":2,\"path\":\"/volume1/s/a\"}\n{\"event\":2,\"path\":\"/volume1/s/b\"}");
    WriteFile(QueueOf("s") + ".tmp", "{\"event\":2,\"path\":\"/volume1/s/c\"}\n");
    SetWorker(R"("state":"processing","done":30,"total":120,"current":"/volume1/s/\u001b[2J",
                 "last_error":"disk on fire")");
    const Json::Value share = PipedJson({"status", "--json"})["share"][0];
    EXPECT_EQ(share["queue"], 2);
    EXPECT_EQ(share["queue_working"], 1);
    EXPECT_EQ(share["documents"], 1234);
    EXPECT_EQ(share["worker"]["done"], 30);
    EXPECT_TRUE(share["worker"]["running"].asBool());
    const std::string text = OnTerminal({"status"}).out;
    EXPECT_NE(text.find("1234 documents, 3 changes waiting"), std::string::npos) << text;
    EXPECT_NE(text.find("[#####-----------------] 30 of 120"), std::string::npos) << text;
    EXPECT_NE(text.find("30 of 120  /volume1/s/\\x1b[2J"), std::string::npos) << text;
}

TEST_F(StatusTest, AStateFileIsNotBelieved) {
    for (const char* text :
         {"", "{", "[]", R"({"pid":"x","done":-1,"total":1e99,"state":{},"last_pass":[]})",
          R"({"pid":-1})", R"({"pid":99999999999,"state":"processing"})"}) {
        WriteFile(kState, text);
        EXPECT_FALSE(PipedJson({"status", "--json"})["share"][0]["worker"]["running"].asBool())
            << text;
        EXPECT_EQ(OnTerminal({"status"}).status, kSuccess);
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
    EXPECT_NE(result.out.find("\x1b[6A\r\x1b[J"), std::string::npos) << result.out;

    SetFolders({"/s", "/unknown/x"});
    const Result failed = Piped({"status", "--until-finished"});
    EXPECT_EQ(failed.status, kFailure);
    EXPECT_NE(failed.out.find("error"), std::string::npos);
}

TEST_F(StatusTest, TellsOfAPause) {
    fake::SetTime(1000);
    WriteFile("/var/packages/Quivra/etc/fileindex.status", R"({"resume_time": 1061})");
    EXPECT_NE(Piped({"status"}).out.find("2 more minutes"), std::string::npos);
    WriteFile("/var/packages/Quivra/etc/fileindex.status", "{");
    EXPECT_NE(Piped({"status"}).err.find("[504]"), std::string::npos);
}

}  // namespace
}  // namespace quivra::ctl
