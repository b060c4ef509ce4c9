#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/fileindex/management_fixture.h"

namespace quivra::fileindex {
namespace {

class ServicesTest : public ManagementTest {
  protected:
    ServicesTest() {
        AddShare("s");
        StartSteps();
    }
    static std::string QueueText() { return ReadFile(QueuePath("/volume1/s")); }
    static void SetQueue(const std::string& text) {
        std::filesystem::create_directories("/volume1/s/@eaDir/fileindex");
        WriteFile(QueuePath("/volume1/s"), text);
    }
};

TEST_F(ServicesTest, ServicesFollowTheFolderSet) {
    fake::SetSpotlight(true);
    PrepareServices();
    EXPECT_EQ(Steps(),
              (std::vector<std::string>{"KESTOSMBSetSpotlight(0)", "KLIBServiceRestart(samba)",
                                        "KLIBServiceStop(kestocontentextractd, 0)",
                                        "KLIBServicectlStop(pkg-Quivra-fileindexd, 1)"}));
    EXPECT_TRUE(toFile(List({"/s"}), kFileIndexFoldersCfgPath));
    StartSteps();
    PrepareServices();
    PrepareServices();  // the search integration is on already
    EXPECT_EQ(Steps(),
              (std::vector<std::string>{"KESTOSMBSetSpotlight(1)", "KLIBServiceRestart(samba)",
                                        "KLIBServiceStart(kestocontentextractd, 1)",
                                        "KLIBServicectlStart(pkg-Quivra-fileindexd, 1)",
                                        "KLIBServiceStart(kestocontentextractd, 1)",
                                        "KLIBServicectlStart(pkg-Quivra-fileindexd, 1)"}));
}

TEST_F(ServicesTest, AFailedStepIsLoggedAndTheNextOneRuns) {
    struct Row {
        const char* call;
        bool enable;
        std::string line;
        std::size_t steps;
    };
    const Row rows[] = {
        {"KESTOSMBSetSpotlight", true, "KESTOSMBSetSpotlight failed: err=[0x1000 platform.c:42]",
         3},  // no restart
        {"KLIBServiceRestart", true, "KLIBServiceRestart failed: err=[0x1000 platform.c:42]", 4},
        {"KLIBServiceStart", true, R"(Failed [0 > KLIBServiceStart("kestocontentextractd", TRUE)])",
         4},
        {"KLIBServicectlStart", true,
         R"(Failed [0 > KLIBServicectlStart("pkg-Quivra-fileindexd", KLIB_SERVICECTL_UPSTART)])",
         4},
        {"KLIBServiceStop", false, R"(Failed [0 > KLIBServiceStop("kestocontentextractd", FALSE)])",
         4},
        {"KLIBServicectlStop", false,
         R"(Failed [0 > KLIBServicectlStop("pkg-Quivra-fileindexd", KLIB_SERVICECTL_UPSTART)])", 4},
    };
    for (const Row& row : rows) {
        EXPECT_TRUE(toFile(row.enable ? List({"/s"}) : List({}), kFileIndexFoldersCfgPath));
        fake::SetSpotlight(!row.enable);
        fake::ResetLibc();
        fake::FailNext(row.call);
        StartSteps();
        PrepareServices();
        EXPECT_EQ(Steps().size(), row.steps) << row.call;
        const auto lines = fake::LogLinesWith(row.line);
        ASSERT_EQ(lines.size(), 1U) << row.call;
        EXPECT_TRUE(lines[0].starts_with("index_mgr:")) << lines[0];
    }
}

TEST_F(ServicesTest, NotificationsHaveTheirExactArguments) {
    std::vector<std::vector<std::string>> commands;
    fake::OnExec([&](const auto& command) {
        commands.push_back(command);
        return 3;
    });
    EXPECT_EQ(SendKOSNotify(), 3);
    EXPECT_EQ(NotifyLackOfMemory(), 3);
    const std::string tool = "/usr/kesto/bin/kestokosnotify";
    const std::string application = "KESTO.Quivra.Application";
    EXPECT_EQ(commands,
              (std::vector<std::vector<std::string>>{
                  {tool, "-c", application, "-b", "true", "-e", "false", "@administrators",
                   "app:displayname", "error:index_no_space",
                   "<a data-kesto-app=\"KESTO.Quivra.Application\" data-kesto-fn=\"preference\">",
                   "</a>"},
                  {tool, "-c", application, "@administrators", "app:displayname",
                   "error:lack_of_memory"}}));
    EXPECT_EQ(fake::CallsOf("KLIBCExecl(/usr/kesto/bin/kestokosnotify, 187, -c").size(), 2U);
}

TEST_F(ServicesTest, ACustomEventIsOneLine) {
    SetQueue("");
    AddCustomEvent(0x20000, "/volume1/s/a\nb\xff", "", Parse(R"({"photo":true})"));
    AddCustomEvent(0x40, "/volume1/s/c", "/volume1/s/o", Json::Value());
    const std::string text = QueueText();
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 2);
    const auto lines = Queue("/volume1/s");
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0]["path"], "/volume1/s/a\nb\xff");
    EXPECT_EQ(lines[1], Parse(R"({"event":64,"path":"/volume1/s/c","path_old":"/volume1/s/o",
                                  "data":null})"));
}

TEST_F(ServicesTest, ATornLineDoesNotSwallowTheEvent) {
    SetQueue(R"({"event":2,"path":"/volume1/s/a"})");
    AddCustomEvent(0x40, "/volume1/s/c", "", Json::Value());
    EXPECT_EQ(Queue("/volume1/s").size(), 2U);
}

TEST_F(ServicesTest, APendingReindexCoversAnEvent) {
    const std::string reindex = R"({"event":65536,"path":"/volume1/s/a"})"
                                "\n";
    SetQueue(reindex);
    AddCustomEvent(2, "/volume1/s/a/b", "", Json::Value());
    AddCustomEvent(2, "/volume1/s/a", "", Json::Value());
    EXPECT_EQ(QueueText(), reindex);
    AddCustomEvent(2, "/volume1/s/ab", "", Json::Value());
    EXPECT_EQ(Queue("/volume1/s").size(), 2U);
}

TEST_F(ServicesTest, AnEventThatCannotBeWrittenFlagsTheShare) {
    for (const char* call : {"KESTOShareGet", "FILEIDXQueuePathCompose"}) {
        fake::ResetLibc();
        fake::FailNext(call);
        AddCustomEvent(2, "/volume1/s/a", "", Json::Value());
        EXPECT_EQ(Status()["share"]["s"], 1) << call;
        StatusMgr().ClearShareStatus("s");
        const auto lines = fake::LogLinesWith("AddCustomEvent failed, code=");
        ASSERT_EQ(lines.size(), 1U);
        EXPECT_NE(lines[0].find(". Set [s] need reindex"), std::string::npos) << lines[0];
    }
    std::filesystem::create_directories(QueuePath("/volume1/s"));  // not a file
    AddCustomEvent(2, "/volume1/s/a", "", Json::Value());
    EXPECT_EQ(Status()["share"]["s"], 1);

    const std::string before = ReadFile(kFileIndexStatusCfgPath);
    fake::ResetLibc();
    AddCustomEvent(2, "/elsewhere/a", "", Json::Value());
    EXPECT_EQ(fake::LogLinesWith("AddCustomEvent failed, code=502, reason=KESTOShareNamePathGet "
                                 "failed, full_path=/elsewhere/a. Set [] need reindex")
                  .size(),
              1U);
    EXPECT_EQ(ReadFile(kFileIndexStatusCfgPath), before);
}

}  // namespace
}  // namespace quivra::fileindex
