#include "fileindex/folder_mgr.h"

#include <sys/stat.h>

#include "fileindex/status_mgr.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {
namespace {

using FolderPtr = FolderMgr::FolderPtr;

class FolderTest : public LibraryTest {
  protected:
    FolderTest() {
        AddShare("s");
        AddShare("t");
        std::filesystem::create_directories("/volume1/s/a/b");
    }

    static std::string Stored(const std::string& path, const std::string& rest = "") {
        return R"({"path":")" + path + R"(","name":"n","document":true,"audio":false,)" +
               R"("video":true,"photo":false)" + rest + "}";
    }
    static void SetFolders(const std::string& text) { WriteFile(kFileIndexFoldersCfgPath, text); }
    static FolderPtr Make(const std::string& path, const std::string& name = "n",
                          bool photo = true) {
        return std::make_shared<Folder>(path, name, true, false, true, photo, false);
    }
    static std::string Status(const Folder& folder) {
        Json::Value status;
        folder.GetStatus(status);
        return status["text"].asString();
    }
    static void SetQueue(const std::string& lines) {
        std::filesystem::create_directories("/volume1/s/@eaDir/fileindex");
        WriteFile("/volume1/s/@eaDir/fileindex/queue", lines);
    }
};

TEST_F(FolderTest, TheStoredFormHasDefaultsAndChecks) {
    const Folder folder(Parse(Stored("/s/a")));
    EXPECT_EQ(folder.GetData(),
              Parse(Stored("/s/a", R"(,"paused":false,"volume_to_be_clean":"")")));
    EXPECT_EQ(folder.GetIndexCfg(),
              Parse(R"({"document":true,"audio":false,"video":true,"photo":false})"));
    const std::string full = Stored("/s", R"(,"paused":true,"volume_to_be_clean":"/volume1")");
    EXPECT_EQ(Folder(Parse(full)).GetData(), Parse(full));

    for (const std::string key : {"path", "name", "document", "audio", "video", "photo"}) {
        Json::Value data = Parse(Stored("/s"));
        data[key] = Json::Value(Json::arrayValue);
        EXPECT_TRUE(ErrorOf([&] { const Folder bad(data); }).reason.starts_with("Not a string"));
        data.removeMember(key);
        const Error error = ErrorOf([&] { const Folder bad(data); });
        EXPECT_EQ(error.code, 120);
        EXPECT_TRUE(error.reason.starts_with("Missing property: " + key)) << error.reason;
    }
    EXPECT_EQ(ErrorOf([] { const Folder bad(Json::Value(5)); }).code, 120);
    Folder folder_moved = *Make("/s/x");
    EXPECT_EQ(folder_moved.GetFullPath(), "/volume1/s/x");  // computed once, so it stays
    folder_moved.SetShare("t");
    EXPECT_EQ(folder_moved.GetShare() + folder_moved.GetPath() + folder_moved.GetFullPath(),
              "t/t/x/volume1/s/x");
    EXPECT_EQ(ErrorOf([] { Folder("s/a", "", true, true, true, true, false).GetShare(); }).code,
              120);
}

TEST_F(FolderTest, TheFirstStatusRuleThatAppliesCounts) {
    const Folder folder = *Make("/s/a");
    fake::SetTime(1000);
    const auto store = [](const std::string& status) {
        WriteFile(kFileIndexStatusCfgPath, status);
    };
    EXPECT_EQ(Status(folder), "finished");
    SetQueue(R"({"event":2,"path":"/volume1/s/a2/f"})"
             "\n");
    EXPECT_EQ(Status(folder), "finished");
    SetQueue(R"({"event":2,"path":"/volume1/s/a/f"})"
             "\n");
    EXPECT_EQ(Status(folder), "processing");
    for (const auto& [resume_time, text] : {std::pair{"0", "paused"},
                                            {"1001", "paused"},
                                            {"1000", "processing"},
                                            {"-1", "processing"},
                                            {"-5", "processing"}}) {
        store(std::string(R"({"resume_time":)") + resume_time + "}");
        EXPECT_EQ(Status(folder), text) << resume_time;
    }
    store(R"({"resume_time":0,"share":{"s":1}})");
    EXPECT_EQ(Status(folder), "need_reindex");
    store(R"({"resume_time":0,"share":{"s":2}})");
    EXPECT_EQ(Status(folder), "paused");

    Json::Value out = Parse(R"({"kept":1})");
    fake::SetFlag("s", fake::ShareFlag::kReadOnly);
    folder.GetStatus(out);
    EXPECT_EQ(out, Parse(R"({"kept":1,"text":"error","desc":"invalid_path"})"));
    SetQueue("broken\n");
    fake::SetFlag("s", fake::ShareFlag::kReadOnly, 0);
    EXPECT_EQ(ErrorOf([&] { Status(folder); }).code, 906);
}

TEST_F(FolderTest, AdditionalItemsAreNamed) {
    const Folder folder = *Make("/s/a");
    EXPECT_EQ(folder.GetDataWithAdditional(Json::Value(Json::arrayValue)), folder.GetData());
    const Json::Value with = folder.GetDataWithAdditional(Parse(R"(["status","status"])"));
    EXPECT_EQ(with["additional"], Parse(R"({"status":{"text":"finished"}})"));
    struct Row {
        const char* additionals;
        const char* reason;
        const char* log;
    };
    const Row rows[] = {
        {R"({"a":1})", R"({"a":1})", "folder.cpp:45 "},
        {R"([5])", "5", "folder.cpp:48 "},
        {R"(["status","size"])", "Unknown additioal: size", "folder.cpp:"},
    };
    for (const Row& row : rows) {
        fake::ResetLibc();
        const Error error = ErrorOf([&] { folder.GetDataWithAdditional(Parse(row.additionals)); });
        EXPECT_EQ(error.code, 120);
        EXPECT_EQ(error.reason, row.reason);
        EXPECT_EQ(fake::LogLinesWith(row.log).size(), 1U) << row.log;
    }
}

using FolderMgrTest = FolderTest;

TEST_F(FolderMgrTest, FilesThatCannotBeReadOrWrittenAreErrors) {
    struct Row {
        std::string text;
        int code;
    };
    const Row rows[] = {
        {"[", 504},
        {"", 504},
        {"{}", 120},
        {"null", 120},
        {"[5]", 120},
        {"[[]]", 120},
        {"[" + Stored("/s") + ",{}]", 120},
        {"[]", 0},
        {"[" + Stored("no slash") + "]", 0},
    };
    for (const Row& row : rows) {
        SetFolders(row.text);
        EXPECT_EQ(ErrorOf([] { FolderMgr(); }).code, row.code) << row.text;
    }
    EXPECT_EQ(fake::LogLinesWith("folder_mgr.cpp:39 ").size(), 2U);
    const FolderMgr folder_mgr;
    EXPECT_EQ(ErrorOf([&] { folder_mgr.IsFullPathIndexed("/volume1/s"); }).code, 120);
    EXPECT_EQ(ErrorOf([&] { folder_mgr.IsShareIndexed("s"); }).code, 120);
    fake::FailNext("ResetCredentialsByName");
    EXPECT_EQ(ErrorOf([&] { folder_mgr.Save(); }).code, 503);
    std::filesystem::remove_all("/var/packages/Quivra/etc");
    EXPECT_EQ(ErrorOf([&] { folder_mgr.Save(); }).code, 505);
    EXPECT_EQ(fake::LogLinesWith("folder_mgr.cpp:229 ").size(), 1U);
}

TEST_F(FolderMgrTest, TheDeepestFolderGoverns) {
    SetFolders("[" + Stored("/s", R"(,"name":"outer")") + "," + Stored("/s/a") + "," +
               Stored("/s/a", R"(,"paused":true)") + "]");
    const FolderMgr folder_mgr;
    struct Row {
        const char* path;
        const char* governor;
        bool own;
    };
    const Row rows[] = {
        {"/volume1/s", "/s", true},
        {"/volume1/s/ab", "/s", false},
        {"/volume1/s/a", "/s/a", true},
        {"/volume1/s/a/b/c", "/s/a", false},
        {"/volume1/s2", nullptr, false},
        {"/volume1", nullptr, false},
        {"", nullptr, false},
    };
    for (const Row& row : rows) {
        const FolderPtr cfg = folder_mgr.GetMostSuitableCfg(row.path);
        ASSERT_EQ(cfg != nullptr, row.governor != nullptr) << row.path;
        EXPECT_EQ(folder_mgr.IsFullPathIndexed(row.path), row.governor != nullptr) << row.path;
        EXPECT_EQ(folder_mgr.IsFullPathHasOwnCfg(row.path), row.own) << row.path;
        if (cfg != nullptr) {
            EXPECT_EQ(cfg->GetPath(), row.governor);
            EXPECT_FALSE(cfg->GetPaused());  // of two the earlier
        }
    }
    for (const auto& [name, need] : {std::pair{"x.txt", true},
                                     {"x.mp3", false},
                                     {"x.avi", true},
                                     {"x.jpg", false},
                                     {"x.zzz", false},
                                     {"x", true}}) {
        EXPECT_EQ(folder_mgr.IsFullPathNeedMeta(std::string("/volume1/s/") + name), need) << name;
    }
    EXPECT_FALSE(folder_mgr.IsFullPathNeedMeta("/volume1/x.txt"));
    EXPECT_TRUE(folder_mgr.IsShareIndexed("s"));
    EXPECT_FALSE(folder_mgr.IsShareIndexed("S"));
    EXPECT_EQ(folder_mgr.GetIndexedShares(), std::set<std::string>{"s"});
}

TEST_F(FolderMgrTest, ChangesTellWhichContentChangesState) {
    const auto cfg = [](const FolderPtr& diff) { return toString(diff->GetIndexCfg()); };
    const std::string all = R"({"audio":true,"document":true,"photo":true,"video":true})";
    const std::string none = R"({"audio":false,"document":false,"photo":false,"video":false})";
    const std::string photo = R"({"audio":false,"document":false,"photo":true,"video":false})";
    FolderMgr folder_mgr;
    FolderPtr diff;
    folder_mgr.Upsert(diff, Make("/s"));
    EXPECT_EQ(cfg(diff), all);
    EXPECT_FALSE(diff->GetPaused());
    folder_mgr.Upsert(diff, Make("/t"));
    folder_mgr.Upsert(diff, Make("/s", "renamed"));
    EXPECT_EQ(cfg(diff), none);
    EXPECT_EQ(folder_mgr.GetFolders().back()->GetName(), "renamed");
    EXPECT_EQ(folder_mgr.GetFolders().size(), 2U);
    folder_mgr.Upsert(diff, Make("/s/a", "n", false));
    EXPECT_EQ(cfg(diff), photo);  // against the enclosing folder
    folder_mgr.Delete(diff, "/s/a");
    EXPECT_EQ(diff->GetPath() + cfg(diff), "/s/a" + photo);
    folder_mgr.Delete(diff, "/s/never");
    EXPECT_EQ(cfg(diff), none);
    folder_mgr.Delete(diff, "/s");
    EXPECT_EQ(diff->GetPath() + cfg(diff), "/s" + all);

    EXPECT_EQ(ErrorOf([&] { folder_mgr.Delete(diff, "/s"); }).code, 902);
    FolderPtr found;
    const Error error = ErrorOf([&] { folder_mgr.Get(found, "/t/"); });
    EXPECT_EQ(error.code, 902);
    EXPECT_EQ(fake::LogLinesWith("folder_mgr.cpp:101 ").size(), 1U);
    folder_mgr.Get(found, "/t");
    EXPECT_TRUE(found != nullptr && folder_mgr.HasFolder("/t") && !folder_mgr.HasFolder("/t/"));
    folder_mgr.DeleteByShare("t");
    EXPECT_TRUE(folder_mgr.GetFolders().empty());
}

TEST_F(FolderMgrTest, TheSetIsLimited) {
    std::string folders = Stored("/s/0");
    for (int i = 1; i < 1000; ++i) {
        folders += "," + Stored("/s/" + std::to_string(i));
    }
    SetFolders("[" + folders + "]");
    FolderMgr folder_mgr;
    FolderPtr diff;
    folder_mgr.Upsert(diff, Make("/s/999"));
    EXPECT_EQ(ErrorOf([&] { folder_mgr.Upsert(diff, Make("/s/1000")); }).code, 900);
    EXPECT_EQ(fake::LogLinesWith("folder_mgr.cpp:76 ").size(), 1U);
}

TEST_F(FolderMgrTest, PagesAreSorted) {
    SetFolders(
        R"([{"path":"/s/c","name":"a","document":true,"audio":true,"video":false,"photo":true},
        {"path":"/s/a","name":"c","document":false,"audio":false,"video":true,"photo":true},
        {"path":"/s/B","name":"b","document":true,"audio":false,"video":true,"photo":false}])");
    struct Row {
        const char* sort_by;
        const char* direction;
        unsigned int offset;
        unsigned int limit;
        const char* first;
        std::size_t size;
    };
    const Row rows[] = {
        {"", "DESC", 1, 9, "/s/B", 2},       {"path", "desc", 1, 1, "/s/a", 1},
        {"document", "", 0, 9, "/s/a", 3},   {"audio", "desc", 0, 1, "/s/c", 1},
        {"video", "", 0, 9, "/s/c", 3},      {"photo", "", 0, 9, "/s/B", 3},
        {"name", "", 4000000000U, 9, "", 0}, {"name", "", 0, 0, "", 0},
    };
    const FolderMgr folder_mgr;
    for (const Row& row : rows) {
        std::vector<FolderPtr> page(7);
        unsigned int total = 0;
        folder_mgr.List(page, total, row.offset, row.limit, row.sort_by, row.direction);
        EXPECT_EQ(total, 3U);
        ASSERT_EQ(page.size(), row.size) << row.sort_by;
        if (!page.empty()) {
            EXPECT_EQ(page[0]->GetPath(), row.first) << row.sort_by << " " << row.direction;
        }
    }
}

}  // namespace
}  // namespace quivra::fileindex
