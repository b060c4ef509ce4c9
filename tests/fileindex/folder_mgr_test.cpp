#include "fileindex/folder_mgr.h"

#include "fileindex/status_mgr.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

using FolderPtr = FolderMgr::FolderPtr;

class FolderMgrTest : public LibraryTest {
  protected:
    FolderMgrTest() {
        AddShare("s");
        std::filesystem::create_directories("/volume1/s/a/b");
    }

    static std::string Stored(const std::string& path, const std::string& rest = "") {
        return R"({"path":")" + path + R"(","name":"n","document":true,"audio":false,)" +
               R"("video":true,"photo":false)" + rest + "}";
    }
    static void SetFolders(const std::string& text) { WriteFile(kFileIndexFoldersCfgPath, text); }
};

TEST_F(FolderMgrTest, TheFirstStatusRuleThatAppliesCounts) {
    struct Row {
        const char* queued;
        const char* status;
        const char* text;
    };
    const Row rows[] = {
        {"/volume1/s/a2/f", "{}", "finished"},
        {"/volume1/s/a/f", R"({"resume_time":0})", "paused"},
        {"/volume1/s/a/f", R"({"resume_time":1001})", "paused"},
        {"/volume1/s/a/f", R"({"resume_time":1000})", "processing"},
        {"/volume1/s/a/f", R"({"resume_time":0,"share":{"s":1}})", "need_reindex"},
        {"/volume1/s/a/f", R"({"resume_time":0,"share":{"s":2}})", "paused"},
    };
    fake::SetTime(1000);
    std::filesystem::create_directories("/volume1/s/@eaDir/fileindex");
    const Folder folder(Parse(Stored("/s/a")));
    Json::Value status;
    for (const Row& row : rows) {
        WriteFile("/volume1/s/@eaDir/fileindex/queue",
                  std::string(R"({"event":2,"path":")") + row.queued + "\"}\n");
        WriteFile(kFileIndexStatusCfgPath, row.status);
        folder.GetStatus(status);
        EXPECT_EQ(status["text"], row.text) << row.queued << row.status;
    }
    fake::Platform()->shares.at("s").read_only = 1;
    folder.GetStatus(status);
    EXPECT_EQ(status, Parse(R"({"text":"error","desc":"invalid_path"})"));
}

TEST_F(FolderMgrTest, FilesThatCannotBeReadOrWrittenAreErrors) {
    const std::pair<std::string, int> rows[] = {
        {"", 504},
        {"[" + Stored("/s") + ",{}]", 120},
        {"[" + Stored("/s", R"(,"photo":"yes")") + "]", 120},
        {"[" + Stored("no slash") + "]", 0},
        {"null", 0},
        {"{}", 0},
        {R"({"path":"/s"})", 120},
        {"7", 120},
        {"[]" + std::string("\0x", 2), 504},
    };
    for (const auto& [text, code] : rows) {
        SetFolders(text);
        EXPECT_EQ(ErrorOf([] { FolderMgr(); }).code, code) << text;
    }
    SetFolders("[" + Stored("no slash") + "]");
    const FolderMgr folder_mgr;
    EXPECT_EQ(ErrorOf([&] { folder_mgr.IsFullPathIndexed("/volume1/s"); }).code, 120);
    fake::FailNext("ResetCredentialsByName");
    EXPECT_EQ(ErrorOf([&] { folder_mgr.Save(); }).code, 503);
    std::filesystem::remove_all("/var/packages/Quivra/etc");
    EXPECT_EQ(ErrorOf([&] { folder_mgr.Save(); }).code, 505);
}

TEST_F(FolderMgrTest, AShareThatIsGoneStopsNothingOfTheOthers) {
    SetFolders("[" + Stored("/gone") + "," + Stored("/s/a") + "," + Stored("/gone/x") + "]");
    FolderMgr folder_mgr;
    fake::ResetLibc();
    EXPECT_TRUE(folder_mgr.IsFullPathIndexed("/volume1/s/a/f"));
    EXPECT_FALSE(folder_mgr.IsFullPathIndexed("/volume1/gone/f"));
    EXPECT_FALSE(folder_mgr.IsFullPathHasOwnCfg("/volume1/gone"));
    EXPECT_TRUE(folder_mgr.IsFullPathNeedMeta("/volume1/s/a/f.txt"));
    EXPECT_EQ(fake::LogLinesWith("Share gone is gone").size(), 1U) << "once, not for each question";

    FolderPtr diff;
    folder_mgr.Upsert(diff, std::make_shared<Folder>("/s", "n", true, true, true, true, false));
    const Error error = ErrorOf([&] { folder_mgr.Delete(diff, "/gone/x"); });
    EXPECT_EQ(error.code, 800);
    EXPECT_EQ(error.reason, "gone");
    EXPECT_EQ(folder_mgr.GetIndexedShares(), (std::set<std::string>{"gone", "s"}));
    Json::Value status;
    Folder(Parse(Stored("/gone"))).GetStatus(status);
    EXPECT_EQ(status, Parse(R"({"text":"error","desc":"invalid_path"})"));
}

TEST_F(FolderMgrTest, PagesAreCutFromTheSortedList) {
    SetFolders("[" + Stored("/s/2") +
               R"(,{"path":"/s/1","name":"z","document":false,"audio":true,)"
               R"("video":false,"photo":true}])");
    const FolderMgr folder_mgr;
    for (const char* key : {"document", "video", "path", "photo desc", "audio desc", "name desc"}) {
        const std::string text = key;
        const bool descends = text.ends_with(" desc");
        std::vector<FolderPtr> page;
        unsigned int total = 0;
        folder_mgr.List(page, total, 0, 1, text.substr(0, text.find(' ')), descends ? "desc" : "");
        ASSERT_EQ(page.size(), 1U);
        EXPECT_EQ(page[0]->GetPath(), "/s/1") << key;
        folder_mgr.List(page, total, 2, 5, text, "");
        EXPECT_TRUE(page.empty() && total == 2U);
    }
}

TEST_F(FolderMgrTest, TheDeepestFolderGoverns) {
    SetFolders("[" + Stored("/s") + "," + Stored("/s/a") + "," +
               Stored("/s/a", R"(,"paused":true)") + "]");
    const FolderMgr folder_mgr;
    struct Row {
        const char* path;
        std::string governor;
        bool own;
    };
    const Row rows[] = {
        {"/volume1/s", "/s", true},     {"/volume1/s/ab", "/s", false},
        {"/volume1/s/a", "/s/a", true}, {"/volume1/s/a/b/c", "/s/a", false},
        {"/volume1/s2", "", false},     {"/volume1", "", false},
    };
    for (const Row& row : rows) {
        const FolderPtr cfg = folder_mgr.GetMostSuitableCfg(row.path);
        EXPECT_EQ(cfg == nullptr ? "" : cfg->GetPath(), row.governor) << row.path;
        EXPECT_TRUE(cfg == nullptr || !cfg->GetPaused());  // of two the earlier
        EXPECT_EQ(folder_mgr.IsFullPathIndexed(row.path), row.governor != "") << row.path;
        EXPECT_EQ(folder_mgr.IsFullPathHasOwnCfg(row.path), row.own) << row.path;
    }
    for (const auto& [path, need] : {std::pair{"/volume1/s/x.txt", true},
                                     {"/volume1/s/x.mp3", false},
                                     {"/volume1/s/x.avi", true},
                                     {"/volume1/s/x.jpg", false},
                                     {"/volume1/s/x.zzz", false},
                                     {"/volume1/s/list.CUE", false},
                                     {"/volume1/s/dir.mp3/README", true},
                                     {"/volume1/s/x.\xc3\x84\xff", false},
                                     {"/volume1/x.txt", false}}) {
        EXPECT_EQ(folder_mgr.IsFullPathNeedMeta(path), need) << path;
    }
}

}  // namespace
}  // namespace quivra::fileindex
