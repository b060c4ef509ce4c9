#include "programs/fileindexd/pass.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <set>

#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/event.h"
#include "programs/fileindexd/catch_up.h"
#include "tests/fake/fake_libc.h"
#include "tests/programs/fileindexd/fake_index.h"

namespace fs = std::filesystem;

namespace fileindexd {
namespace {

using quivra::Error;
using quivra::base::IsAtOrBelow;
using quivra::base::IsBelow;
using namespace quivra::fileindex;

/// The rules of a test: what lies below one of `excluded`, or not below `only`, is not indexed,
/// what lies below one of `without_meta` without content.
class TestScope : public Scope {
  public:
    bool Covers(const std::string& path, bool) const override {
        return !IsIn(path, excluded) && IsAtOrBelow(path, only);
    }
    bool NeedsMeta(const std::string& path) const override { return !IsIn(path, without_meta); }
    std::vector<std::string> RootsWithin(const std::string& path) const override {
        if (Covers(path, true)) {
            return {path};
        }
        return IsBelow(only, path) ? std::vector{only} : std::vector<std::string>{};
    }
    bool HaveSameRules(const std::string& one, const std::string& other) const override {
        return IsIn(one, excluded) == IsIn(other, excluded) &&
               IsIn(one, without_meta) == IsIn(other, without_meta);
    }
    std::string Describe(const std::string&) const override {
        return std::to_string(without_meta.size());
    }

    std::string only = "/volume1";
    std::set<std::string> excluded;
    std::set<std::string> without_meta;

  private:
    static bool IsIn(const std::string& path, const std::set<std::string>& places) {
        return std::any_of(places.begin(), places.end(),
                           [&](const std::string& place) { return IsAtOrBelow(path, place); });
    }
};

/// A share on disk, its queue and its index. Paths are given without the share's root.
class PassTest : public testing::Test {
  protected:
    PassTest() { StartAgain(); }

    void StartAgain() {
        catch_up_.reset();
        backlog_.reset();
        fs::remove_all(root_);
        fs::create_directories(root_ + "/@eaDir/fileindex");
        index_ = std::make_unique<FakeIndex>();
        Open(root_);
    }

    /// As a worker that starts.
    void Open(const std::string& root) {
        catch_up_.reset();
        backlog_.reset();
        directory_ = quivra::base::PrivateDirectory::Open(root + "/@eaDir/fileindex");
        backlog_ = std::make_unique<Backlog>(directory_);
        catch_up_ = std::make_unique<CatchUp>(*backlog_);
        if (backlog_->IsNew()) {
            backlog_->BeginEmpty(scope_.Describe(root));
        }
    }

    std::string Full(const std::string& path) const { return root_ + path; }

    void Put(const std::string& path, const std::string& text) {
        fs::create_directories(Full(path).substr(0, Full(path).rfind('/')));
        std::ofstream(Full(path), std::ios::trunc) << text;
    }

    void Queue(unsigned int event, const std::string& path, const std::string& old = "",
               bool is_dir = false, const Json::Value& data = Json::Value()) {
        Json::Value line;
        line["event"] = event;
        line["is_dir"] = is_dir;
        line["path"] = Full(path);
        line["path_old"] = old.empty() ? "" : Full(old);
        line["data"] = data;
        std::ofstream(queue_, std::ios::app) << quivra::toString(line) << "\n";
    }

    /// A change of the disk together with its event.
    void Write(const std::string& path, const std::string& text) {
        const bool existed = fs::exists(Full(path));
        Put(path, text);
        Queue(existed ? EVENT_MODIFY : EVENT_CREATE, path);
    }
    void Mkdir(const std::string& path) {
        if (fs::create_directory(Full(path))) {
            Queue(EVENT_CREATE, path, "", true);
        }
    }
    void Remove(const std::string& path) {
        const bool is_dir = fs::is_directory(Full(path));
        std::error_code ignored;  // a file may stand where the path wants a directory
        if (fs::remove_all(Full(path), ignored) + 1 > 1) {
            Queue(EVENT_DELETE, path, "", is_dir);
        }
    }
    bool Move(const std::string& from, const std::string& to) {
        const bool is_dir = fs::is_directory(Full(from));
        if (from == to || rename(Full(from).c_str(), Full(to).c_str()) != 0) {
            return false;
        }
        Queue(EVENT_RENAME, to, from, is_dir);
        return true;
    }

    PassResult RunPass(PassListener listener = {}) {
        Pass pass({directory_, directory_.Path() + "/queue", Root(), *backlog_}, *index_, scope_,
                  std::move(listener));
        const PassResult result = pass.Run();
        catch_up_->Forget(result.left);
        return result;
    }
    /// As short a slice as there is.
    void RunSlice(PassListener listener = {}, std::int64_t now = 1000) {
        const ShareTree tree(Root());
        catch_up_->Run({*index_, tree, scope_}, listener, {}, now);
    }
    void Run(const PassListener& listener = {}) {
        RunPass(listener);
        while (backlog_->NextDue() == 0) {
            RunSlice(listener);
        }
    }
    std::string Root() const {
        return directory_.Path().substr(0, directory_.Path().find("/@eaDir"));
    }

    /// What the index should hold: the disk, walked in the simplest way.
    FakeIndex::Documents Expected() const {
        FakeIndex::Documents expected;
        const auto add = [&](const std::string& path, bool is_dir) {
            if (scope_.Covers(path, is_dir)) {
                expected[path] = Extract(path, scope_.NeedsMeta(path));
            }
        };
        add(root_, true);
        for (auto it = fs::recursive_directory_iterator(root_); it != fs::end(it); ++it) {
            if (it->path().filename() == "@eaDir") {
                it.disable_recursion_pending();
            } else if (!it->is_symlink()) {
                add(it->path(), it->is_directory());
            }
        }
        return expected;
    }

    void IndexAll() {
        Queue(EVENT_REINDEX, "");
        Run();
        index_->extracted = 0;
        ASSERT_EQ(index_->Committed(), Expected());
    }

    const std::string root_ = "/volume1/share";
    const std::string queue_ = root_ + "/@eaDir/fileindex/queue";
    quivra::base::PrivateDirectory directory_;
    std::unique_ptr<Backlog> backlog_;
    std::unique_ptr<CatchUp> catch_up_;
    std::unique_ptr<FakeIndex> index_;
    TestScope scope_;
};

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

/// Random changes with their events. Few names, so that they collide.
class RandomPassTest : public PassTest {
  protected:
    void StartAgain(unsigned int seed) {
        random_.seed(seed);
        PassTest::StartAgain();
        scope_.excluded = {Full("/c/a")};
        scope_.without_meta = {Full("/b")};
        IndexAll();
    }

    void Change(int count) {
        for (int i = 0; i < count; ++i) {
            ChangeOnce(RandomPath());
        }
    }

  private:
    void ChangeOnce(const std::string& path) {
        const bool exists = fs::exists(Full(path));
        const bool has_parent = HasParent(path);
        switch (random_() % 10) {
            case 0:
                return Remove(path);
            case 1:
                return has_parent && !exists ? Mkdir(path) : void();
            case 2:
                return Queue(random_() % 4 == 0 ? EVENT_REINDEX : EVENT_ATTR, path);
            case 3:
            case 4:
            case 5:
                return has_parent && !fs::is_directory(Full(path)) ? Write(path, Text()) : void();
            default:
                const std::string to = RandomPath();
                if (exists && HasParent(to)) {
                    Move(path, to);
                }
        }
    }
    std::string Text() { return std::to_string(10000 + ++number_); }
    std::string RandomPath() {
        std::string path;
        for (auto depth = 1 + random_() % 3; depth > 0; --depth) {
            path += std::string("/") + "abc"[random_() % 3];
        }
        return path;
    }
    bool HasParent(const std::string& path) const {
        return fs::is_directory(Full(path.substr(0, path.rfind('/'))));
    }

    std::mt19937 random_;
    int number_ = 0;
};

TEST_F(RandomPassTest, TheIndexEqualsTheDiskAfterEveryPass) {
    for (unsigned int seed = 0; seed < 150; ++seed) {
        SCOPED_TRACE(seed);
        StartAgain(seed);
        for (int pass = 0; pass < 8; ++pass) {
            Change(12);
            if (pass == 4) {
                scope_.excluded = {Full("/a/b")};
                Queue(EVENT_UPDATE_CFG, "");
            }
            Run();
            ASSERT_EQ(index_->Committed(), Expected());
        }
    }
}

TEST_F(RandomPassTest, APassThatWasKilledAnywhereEndsTheSame) {
    for (unsigned int seed = 0; seed < 12; ++seed) {
        bool killed = true;
        for (int kill = 1; killed; ++kill) {
            SCOPED_TRACE("seed " + std::to_string(seed) + ", killed at " + std::to_string(kill));
            StartAgain(seed);
            Change(15);
            Run();
            Change(15);
            index_->KillAt(kill);
            killed = false;
            try {
                Run();
            } catch (const Killed&) {
                killed = true;
            }
            index_->KillAt(0);
            if (kill % 2 == 0) {
                index_->LoseBatch();
            }
            Change(4);
            Run();
            Run();
            ASSERT_EQ(index_->Committed(), Expected());
        }
    }
}

}  // namespace
}  // namespace fileindexd
