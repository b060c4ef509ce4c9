#include "fileindex/index_mgr.h"
#include "tests/fileindex/management_fixture.h"

namespace quivra::fileindex {
namespace {

class ServicesTest : public ManagementTest {
  protected:
    ServicesTest() {
        AddShare("s");
        StartSteps();
    }
    static void SetQueue(const std::string& text) {
        std::filesystem::create_directories("/volume1/s/@eaDir/fileindex");
        WriteFile(QueuePath("/volume1/s"), text);
    }
};

TEST_F(ServicesTest, ACustomEventIsOneLine) {
    SetQueue(R"({"event":2,"path":"/volume1/s/a"})");  // its end is missing
    AddCustomEvent(0x20000, "/volume1/s/a\nb\xff", "", Parse(R"({"photo":true})"));
    AddCustomEvent(0x40, "/volume1/s/c", "/volume1/s/o", Json::Value());
    const auto lines = Queue("/volume1/s");
    ASSERT_EQ(lines.size(), 3U);
    EXPECT_EQ(lines[1]["path"], "/volume1/s/a\nb\xff");
    EXPECT_EQ(lines[2], Parse(R"({"event":64,"path":"/volume1/s/c","path_old":"/volume1/s/o",
                                  "data":null})"));
}

TEST_F(ServicesTest, AnEventThatCannotBeWrittenFlagsTheShare) {
    for (const char* call : {"KESTOShareGet", "FILEIDXQueuePathCompose"}) {
        fake::FailNext(call);
        AddCustomEvent(2, "/volume1/s/a", "", Json::Value());
        EXPECT_EQ(Status()["share"]["s"], 1) << call;
        StatusMgr().ClearShareStatus("s");
    }
    AddCustomEvent(2, "/elsewhere/a", "", Json::Value());
    EXPECT_EQ(Status()["share"], Json::Value(Json::objectValue));
}

}  // namespace
}  // namespace quivra::fileindex
