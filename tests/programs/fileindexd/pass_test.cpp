#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tests/fake/fake_libc.h"
#include "tests/programs/fileindexd/pass_fixture.h"

namespace fileindexd {
namespace {

TEST_F(PassTest, ARenamedDirectoryIsNotExtractedAgain) {
    for (int i = 0; i < 50; ++i) {
        Put("/old/" + std::to_string(i) + ".txt", "text");
    }
    Put("/file.txt", "file");
    IndexAll();
    Move("/old", "/new");
    Move("/file.txt", "/moved.txt");
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
    EXPECT_EQ(index_->extracted, 0);
}

// All files are of the same size and age here: only the right order of things keeps them apart.
TEST_F(PassTest, RenamesThatCrossEachOther) {
    using Moves = std::vector<std::pair<std::string, std::string>>;
    const std::pair<const char*, Moves> cases[] = {
        {"exchange of files", {{"/a", "/t"}, {"/b", "/a"}, {"/t", "/b"}}},
        {"exchange of directories", {{"/d", "/t"}, {"/e", "/d"}, {"/t", "/e"}}},
        {"chain", {{"/d", "/t"}, {"/t", "/u"}}},
        {"chain over a replaced file", {{"/a", "/b"}, {"/b", "/c"}}},
        {"rotation", {{"/b", "/c"}, {"/a", "/b"}}},
        {"child, then parent", {{"/d/x", "/d/y"}, {"/d", "/t"}}},
        {"parent, then child", {{"/d", "/t"}, {"/t/x", "/a"}}},
        {"into a directory that moves on", {{"/a", "/d/x"}, {"/d", "/t"}}},
        {"out of a directory that is replaced", {{"/d/x", "/t"}, {"/e", "/u"}, {"/t", "/e"}}},
        {"twice to one place", {{"/a", "/c"}, {"/b", "/c"}}},
        {"there and back", {{"/d", "/t"}, {"/t", "/d"}}},
    };
    for (const auto& [name, moves] : cases) {
        SCOPED_TRACE(name);
        for (const char* path : {"/d", "/e", "/t", "/u"}) {
            fs::remove_all(Full(path));
        }
        for (const char* path : {"/a", "/b", "/c", "/d/x", "/d/y", "/e/x", "/e/y"}) {
            Put(path, path + std::string(4 - std::string(path).size(), '_'));
        }
        IndexAll();
        for (const auto& [from, to] : moves) {
            EXPECT_TRUE(Move(from, to));
        }
        Run();
        EXPECT_EQ(index_->Committed(), Expected());
    }
}

TEST_F(PassTest, AFileThatIsIndexedForItselfIsNotExtractedTwice) {
    Mkdir("/d");
    Write("/d/f.txt", "text");
    Run();
    EXPECT_EQ(index_->extracted, 1);
}

// The folding lets a reindex take changed settings along.
TEST_F(PassTest, ChangedSettingsExtractTheirClassesAgainAlsoBeforeAReindex) {
    Put("/a.txt", "text");
    Put("/b.mp3", "sound");
    scope_.without_meta = {Full("")};
    IndexAll();
    scope_.without_meta.clear();
    Json::Value settings;
    settings["document"] = true;
    settings["audio"] = false;
    Queue(EVENT_UPDATE_CFG, "", "", true, settings);
    Run();
    EXPECT_EQ(index_->Committed().at(Full("/a.txt")).text, "text");
    EXPECT_EQ(index_->Committed().at(Full("/b.mp3")).text, "");

    scope_.without_meta = {Full("")};
    IndexAll();
    scope_.without_meta.clear();
    Queue(EVENT_UPDATE_CFG, "", "", true, settings);
    Queue(EVENT_REINDEX, "");
    Run();
    EXPECT_EQ(index_->Committed().at(Full("/a.txt")).text, "text");
    const int extracted = index_->extracted;
    Queue(EVENT_REINDEX, "");
    Run();
    EXPECT_EQ(index_->extracted, extracted);
}

TEST_F(PassTest, ARenamedShareTakesItsDocumentsAlong) {
    Put("/in/d/f.txt", "text");
    Put("/out/g.txt", "text");
    scope_.only = Full("/in");
    IndexAll();
    const std::string renamed = "/volume1/renamed";
    fs::remove_all(renamed);
    fs::rename(root_, renamed);
    scope_.only = renamed + "/in";
    const std::string queue = renamed + "/@eaDir/fileindex/queue";
    std::ofstream(queue) << R"({"event":256,"is_dir":true,"path":"/volume1/renamed",)"
                         << R"("path_old":"/volume1/share"})"
                         << "\n";
    Open(renamed);
    Run();
    FakeIndex::Documents expected;
    for (const char* path : {"/in", "/in/d", "/in/d/f.txt"}) {
        expected[renamed + path] = Extract(renamed + path, true);
    }
    EXPECT_EQ(index_->Committed(), expected);
    EXPECT_EQ(index_->extracted, 0);
    fs::remove_all(renamed);
}

TEST_F(PassTest, LinksMountsAndPreservedNamesAreNoFiles) {
    Put("/d/f.txt", "text");
    fs::create_directories(Full("/mount"));
    fs::create_symlink(Full("/d"), Full("/link"));
    fs::create_symlink("/etc/passwd", Full("/file"));
    ASSERT_EQ(mkfifo(Full("/pipe").c_str(), 0600), 0);
    ASSERT_EQ(mount(Full("/d").c_str(), Full("/mount").c_str(), nullptr, MS_BIND, nullptr), 0);
    Queue(EVENT_REINDEX, "");
    for (const char* path : {"/link/f.txt", "/file", "/pipe", "/mount/f.txt", "/@eaDir/x",
                             "/d/@eaDir/fileindex", "/d/.DS_Store"}) {
        Queue(EVENT_MODIFY, path);
    }
    Run();
    FakeIndex::Documents expected;
    for (const char* path : {"", "/d", "/d/f.txt"}) {
        expected[Full(path)] = Extract(Full(path), true);
    }
    EXPECT_EQ(umount(Full("/mount").c_str()), 0);
    EXPECT_EQ(index_->Committed(), expected);
}

TEST_F(PassTest, AVolumeThatVanishesInTheMiddleCommitsNothing) {
    Put("/f.txt", "text");
    Put("/g.txt", "text");
    IndexAll();
    const FakeIndex::Documents before = index_->Committed();
    Queue(EVENT_REINDEX, "");
    const std::string aside = root_ + ".aside";
    const auto unmount = [&](const PassState&) {
        if (!fs::exists(aside)) {
            fs::rename(root_, aside);
            fs::create_directories(root_);
        }
    };
    fake::ResetLibc();
    EXPECT_THROW(Run(unmount), Error);
    EXPECT_FALSE(fake::LogLinesWith("is its volume mounted?").empty());
    EXPECT_EQ(index_->Committed(), before);

    fs::create_directories("/var/outside");
    std::ofstream("/var/outside/queue") << R"({"event":512,"path":"/"})"
                                        << "\n";
    const auto outside = quivra::base::PrivateDirectory::Open("/var/outside");
    Pass pass({outside, "/var/outside/queue", root_, *backlog_}, *index_, scope_, {});
    EXPECT_THROW(pass.Run(), Error) << "an empty mount point is not a share without files";
    EXPECT_EQ(index_->Committed(), before);

    fs::remove_all(root_);
    fs::rename(aside, root_);
    Run();
    EXPECT_EQ(index_->Committed(), Expected());
}

}  // namespace
}  // namespace fileindexd
