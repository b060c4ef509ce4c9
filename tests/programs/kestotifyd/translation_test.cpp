#include <gtest/gtest.h>
#include <sys/fanotify.h>
#include <sys/inotify.h>

#include <algorithm>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "common/json.h"
#include "programs/kestotifyd/fanotify_translation.h"
#include "programs/kestotifyd/inotify_translation.h"
#include "programs/kestotifyd/move_pairing.h"
#include "programs/kestotifyd/queue_translator.h"
#include "programs/kestotifyd/registration.h"
#include "programs/kestotifyd/watch_tree.h"

namespace kestotifyd {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using Lines = std::vector<std::string>;

/// "rename dir /b <- /a": a queue line, short enough for a table.
std::string Short(const std::string& line) {
    static const std::map<unsigned, std::string> names{
        {0x2, "modify"},   {0x4, "attr"},    {0x40, "create"},    {0x80, "delete"},
        {0x100, "rename"}, {0x200, "crash"}, {0x10000, "reindex"}};
    Json::Value json;
    EXPECT_TRUE(line.back() == '\n' && quivra::fromString(json, line)) << line;
    const auto name = names.find(json["event"].asUInt());
    std::string text = name == names.end() ? "not one bit" : name->second;
    text += json["is_dir"].asBool() ? " dir " : " ";
    text += json["path"].asString();
    return json.isMember("path_old") ? text + " <- " + json["path_old"].asString() : text;
}

bool IsHidden(const std::string& name) {
    return name == "@eaDir";
}

/// Two watched folders of one queue, /r (wd 1) with the watched directories d (wd 2), d/sub (wd 3)
/// and e (wd 4), and /q (wd 9); and the whole way from raw events to lines.
class TranslationTest : public testing::Test {
  public:
    explicit TranslationTest(unsigned mask = 65478)
        : translator_({"/r/@eaDir/queue", {"/r", "/q"}, mask, {"skip"}}, IsHidden) {
        WatchNode* const root = tree_.AddRoot("/r", 1);
        tree_.AddChild(*tree_.AddChild(*root, "d", 2), "sub", 3);
        tree_.AddChild(*root, "e", 4);
        tree_.AddRoot("/q", 9);
    }

    void Feed(const InotifyEvent& event) {
        pairing_.Push(event, now_);
        Run();
    }

    void Run() {
        while (const auto paired = pairing_.Pop(now_)) {
            const InotifyOutcome outcome = TranslateInotify(*paired, tree_);
            for (const Change& change : outcome.changes) {
                translator_.Apply(change, now_);
            }
            for (const auto& appeared : outcome.appeared) {
                appeared_.push_back(appeared.parent.node->PathOf(appeared.name));
            }
            unused_.insert(unused_.end(), outcome.unused_watches.begin(),
                           outcome.unused_watches.end());
        }
    }

    Lines Advance(milliseconds duration) {
        now_ += duration;
        Run();
        translator_.Flush(now_);
        Lines lines;
        for (const std::string& line : translator_.TakeLines()) {
            lines.push_back(Short(line));
        }
        return lines;
    }

    Time now_{seconds(1000)};
    WatchTree tree_;
    MovePairing pairing_;
    QueueTranslator translator_;
    Lines appeared_;
    std::vector<int> unused_;
};

constexpr unsigned kDir = IN_ISDIR;

TEST_F(TranslationTest, EventsBecomeLines) {
    struct Row {
        const char* label;
        std::vector<InotifyEvent> events;
        Lines expected;
    };
    const std::vector<Row> rows{
        {"create and close",
         {{2, IN_CREATE, 0, "f"}, {2, IN_MODIFY, 0, "f"}, {2, IN_CLOSE_WRITE, 0, "f"}},
         {"create /r/d/f", "modify /r/d/f"}},
        {"modified, then deleted",
         {{1, IN_CLOSE_WRITE, 0, "f"}, {1, IN_DELETE, 0, "f"}},
         {"delete /r/f"}},
        {"same attributes line twice",
         {{1, IN_ATTRIB, 0, "f"}, {1, IN_ATTRIB, 0, "f"}, {1, IN_ATTRIB | kDir, 0, "d"}},
         {"attr /r/f", "attr dir /r/d"}},
        {"a directory's own attributes, told by its parent too",
         {{2, IN_ATTRIB | kDir, 0, ""}},
         {}},
        {"a root's own attributes", {{1, IN_ATTRIB | kDir, 0, ""}}, {"attr dir /r"}},
        {"rename",
         {{1, IN_MOVED_FROM, 7, "f"}, {3, IN_MOVED_TO, 7, "g"}},
         {"rename /r/d/sub/g <- /r/f"}},
        {"a held modification goes out under the name that it had",
         {{1, IN_MODIFY, 0, "f"}, {1, IN_MOVED_FROM, 7, "f"}, {1, IN_MOVED_TO, 7, "g"}},
         {"modify /r/f", "rename /r/g <- /r/f"}},
        {"between the folders of one queue",
         {{1, IN_MOVED_FROM, 7, "f"}, {9, IN_MOVED_TO, 7, "f"}},
         {"rename /q/f <- /r/f"}},
        {"moved in", {{1, IN_MOVED_TO, 8, "f"}}, {"create /r/f"}},
        {"out of an ignored name",
         {{1, IN_MOVED_FROM, 7, "skip"}, {1, IN_MOVED_TO, 7, "f"}},
         {"create /r/f"}},
        {"ignored and hidden names",
         {{1, IN_CREATE, 0, "skip"}, {1, IN_CREATE, 0, "@eaDir"}, {1, IN_CREATE, 0, "skipped"}},
         {"create /r/skipped"}},
        {"moved directory: later events have the new path",
         {{1, IN_MOVED_FROM | kDir, 7, "d"},
          {3, IN_CREATE, 0, "between"},
          {4, IN_MOVED_TO | kDir, 7, "dd"},
          {3, IN_CREATE, 0, "after"},
          {2, IN_DELETE, 0, "x"}},
         {"rename dir /r/e/dd <- /r/d", "create /r/e/dd/sub/between", "create /r/e/dd/sub/after",
          "delete /r/e/dd/x"}},
        {"the old name is taken again before the second half comes",
         {{1, IN_MOVED_FROM, 7, "f"}, {1, IN_CREATE, 0, "f"}, {1, IN_MOVED_TO, 7, "g"}},
         {"rename /r/g <- /r/f", "create /r/f"}},
        {"two moves with their halves mixed",
         {{1, IN_MOVED_FROM, 7, "a"},
          {1, IN_MOVED_FROM, 8, "b"},
          {1, IN_MOVED_TO, 8, "c"},
          {1, IN_MOVED_TO, 7, "b"}},
         {"rename /r/b <- /r/a", "rename /r/c <- /r/b"}},
        {"names are bytes", {{1, IN_CREATE, 0, "n\n\"\xff"}}, {"create /r/n\n\"\xff"}},
        {"directory deleted: nothing below it is heard any more",
         {{1, IN_DELETE | kDir, 0, "d"}, {3, IN_CREATE, 0, "late"}},
         {"delete dir /r/d"}},
    };
    for (const Row& row : rows) {
        struct Fresh : TranslationTest {
            void TestBody() override {}
        } fresh;
        for (const InotifyEvent& event : row.events) {
            fresh.Feed(event);
        }
        EXPECT_EQ(fresh.Advance(MovePairing::kWait), row.expected) << row.label;
    }
}

TEST_F(TranslationTest, ADirectoryInThePlaceOfADeletedFileIsNotFoldedAway) {
    const auto replace = [&] {
        Feed({1, IN_DELETE, 0, "f"});
        Advance(milliseconds(0));
        Feed({1, IN_MOVED_TO | kDir, 0, "f"});
        translator_.Apply({Change::Kind::kCreated, true, "/r/f"}, now_);  // once it is scanned
        return Advance(milliseconds(0));
    };
    EXPECT_EQ(replace(), (Lines{"create /r/f", "create dir /r/f"}));
    Feed({1, IN_DELETE, 0, "g"});
    translator_.OnWritten(false);
    translator_.OnWritten(true);  // in another queue file
    translator_.TakeLines();
    translator_.Apply({Change::Kind::kCreated, true, "/r/g"}, now_);
    EXPECT_EQ(Advance(milliseconds(0)), Lines{"create dir /r/g"});
}

TEST_F(TranslationTest, FirstHalfWaitsAndThenGivesUp) {
    Feed({1, IN_MOVED_FROM, 7, "f"});
    Feed({1, IN_CREATE, 0, "g"});
    EXPECT_EQ(pairing_.NextDue(), now_ + MovePairing::kWait);
    EXPECT_EQ(Advance(MovePairing::kWait - milliseconds(1)), Lines{});
    EXPECT_EQ(Advance(milliseconds(1)), (Lines{"delete /r/f", "create /r/g"}));
    Feed({1, IN_MOVED_TO, 7, "late"});
    EXPECT_EQ(Advance(milliseconds(0)), Lines{"create /r/late"});
    EXPECT_FALSE(pairing_.NextDue());
    Feed({1, IN_MOVED_FROM | kDir, 7, "d"});
    EXPECT_EQ(Advance(MovePairing::kWait), Lines{"delete dir /r/d"});
    EXPECT_EQ(unused_, (std::vector<int>{2, 3})) << "watches of what has left";
}

TEST_F(TranslationTest, AFileThatStaysOpenIsReportedInIntervals) {
    Feed({1, IN_MODIFY, 0, "log"});
    EXPECT_EQ(translator_.NextDue(), now_ + QueueTranslator::kOpenFileInterval);
    EXPECT_EQ(Advance(seconds(4)), Lines{});
    Feed({1, IN_MODIFY, 0, "log"});
    EXPECT_EQ(Advance(seconds(1)), Lines{"modify /r/log"});
    EXPECT_FALSE(translator_.NextDue());
    Feed({1, IN_MODIFY, 0, "log"});
    Feed({1, IN_CLOSE_WRITE, 0, "log"});
    EXPECT_EQ(Advance(seconds(0)), Lines{"modify /r/log"});
}

TEST_F(TranslationTest, ADirectoryThatAppearsIsScannedFirst) {
    Feed({2, IN_CREATE | kDir, 0, "new"});
    Feed({2, IN_CREATE | kDir, 0, "sub"});  // known: its parent's scan was faster
    EXPECT_EQ(appeared_, Lines{"/r/d/new"});
    EXPECT_EQ(Advance(milliseconds(0)), Lines{"create dir /r/d/sub"});
}

/// One directory may be known at two places, the one below the other, while the tree is behind the
/// disk. Then what is done for the one drops the other.
TEST_F(TranslationTest, NodesThatAnEventDropsAreNotUsedForIt) {
    WatchNode* const root = tree_.FindRoot("/r");
    WatchNode* const e = root->Child("e");
    tree_.AddChild(*e, "inner", 20);
    WatchNode* const outer = tree_.AddChild(*root, "outer", 20);
    tree_.Move(*e, *outer, "e");
    ASSERT_EQ(tree_.Find(20).front(), outer) << "the order that does it";
    Feed({20, IN_DELETE | kDir, 0, "e"});
    EXPECT_EQ(Advance(milliseconds(0)), Lines{"delete dir /r/outer/e"});
    EXPECT_EQ(WatchTree::Count(*root), 4U);
}

TEST_F(TranslationTest, AnExchangeHasBothPlacesLookedAt) {
    Feed({1, IN_MOVED_FROM | kDir, 7, "d"});
    Feed({1, IN_MOVED_TO | kDir, 7, "e"});
    EXPECT_EQ(appeared_, (Lines{"/r/e", "/r/d"}));
}

TEST_F(TranslationTest, ADirectorySeenTwiceIsReportedAtBothPlaces) {
    WatchNode* const mirror = tree_.AddRoot("/q/mirror", 1);
    tree_.AddChild(*mirror, "d", 2);
    Feed({2, IN_CREATE, 0, "f"});
    EXPECT_EQ(Advance(milliseconds(0)).size(), 2U);
    Feed({1, IN_MOVED_FROM | kDir, 7, "d"});
    Feed({1, IN_MOVED_TO | kDir, 7, "x"});
    Lines lines = Advance(milliseconds(0));
    std::sort(lines.begin(), lines.end());
    EXPECT_EQ(lines, (Lines{"rename dir /q/mirror/x <- /q/mirror/d", "rename dir /r/x <- /r/d"}));
}

class MaskTest : public TranslationTest {
  protected:
    MaskTest() : TranslationTest(0x40 | 0x100) {}
};

TEST_F(MaskTest, LimitsChangesButNotRepairs) {
    Feed({1, IN_CREATE, 0, "f"});
    Feed({1, IN_CLOSE_WRITE, 0, "f"});
    Feed({1, IN_DELETE, 0, "f"});
    translator_.Apply({Change::Kind::kCrashed, true, "/r"}, now_);
    translator_.Apply({Change::Kind::kReindex, true, "/r"}, now_);
    EXPECT_EQ(Advance(seconds(9)), (Lines{"create /r/f", "crash dir /r", "reindex dir /r"}));
}

/// Directories of one mount by handle; what is not in the table is gone.
class FanotifyTest : public testing::Test {
  protected:
    Lines Feed(unsigned mask, const std::string& target, const FanotifyEvent::Place& from,
               const FanotifyEvent::Place& to) {
        FanotifyEvent event;
        event.mask = mask;
        event.target = target;
        (mask == (FAN_RENAME | FAN_ONDIR) ? event.old_place : event.place) = from;
        event.new_place = to;
        Lines lines;
        const auto lookup = [&](const std::string& handle) { return paths_.Find(handle); };
        for (const Change& change : TranslateFanotify(event, paths_, lookup)) {
            const char* const kind = change.kind == Change::Kind::kRenamed   ? "rename "
                                     : change.kind == Change::Kind::kReindex ? "reindex "
                                     : change.kind == Change::Kind::kCreated ? "create "
                                                                             : "other ";
            lines.push_back(kind + change.path +
                            (change.path_old.empty() ? "" : " <- " + change.path_old));
        }
        return lines;
    }
    Lines Rename(const std::string& target, const FanotifyEvent::Place& from,
                 const FanotifyEvent::Place& to) {
        return Feed(FAN_RENAME | FAN_ONDIR, target, from, to);
    }

    HandlePaths paths_;
};

TEST_F(FanotifyTest, KnownPathsFollowRenames) {
    paths_.Set("R", "/r");
    EXPECT_EQ(Feed(FAN_CREATE | FAN_ONDIR, "A", {"R", "a"}, {}), Lines{"create /r/a"});
    EXPECT_EQ(Feed(FAN_CREATE | FAN_ONDIR, "B", {"A", "b"}, {}), Lines{"create /r/a/b"});
    EXPECT_EQ(Rename("A", {"R", "a"}, {"R", "c"}), Lines{"rename /r/c <- /r/a"});
    EXPECT_EQ(paths_.Find("B"), "/r/c/b");
    EXPECT_EQ(Rename("A", {"R", "c"}, {"gone", "c"}), Lines{"other /r/c"});
    EXPECT_EQ(paths_.Find("B"), "");
    EXPECT_FALSE(paths_.IsAhead());
    EXPECT_GT(paths_.Size(), 0U);
}

/// Merged events can look like that. Each one made the paths below it longer, without end.
TEST_F(FanotifyTest, NothingMovesBelowItself) {
    paths_.Set("R", "/r");
    paths_.Set("A", "/r/a");
    paths_.Set("B", "/r/a/b");
    EXPECT_EQ(Rename("A", {"R", "a"}, {"B", "x"}), Lines{"reindex /r/a"});
    EXPECT_TRUE(paths_.IsAhead());
    EXPECT_EQ(paths_.Size(), 0U);
    paths_.Settle();
    paths_.Set("R", "/r");
    paths_.Set("A", "/r/a");
    EXPECT_EQ(Rename("B", {"A", "b"}, {"R", "a"}), Lines{"reindex /r/a"});
    EXPECT_TRUE(paths_.IsAhead());
}

TEST(RegistrationTest, MalformedOnesAreRefused) {
    for (const std::string queue_and_config : {
             R"(7,"config":{"path":["/a"],"mask":1})",
             R"("q","config":{"path":["/a"],"mask":1})",
             R"("/q","config":{"path":"/a","mask":1})",
             R"("/q","config":{"path":["/a/../b"],"mask":1})",
             R"("/q","config":{"path":[7],"mask":1})",
             R"("/q","config":{"path":["/a"],"mask":-1})",
             R"("/q","config":{"path":["/a"],"mask":1,"ignore":[{}]})",
         }) {
        Json::Value json;
        EXPECT_TRUE(quivra::fromString(json, R"({"queue":)" + queue_and_config + "}"));
        EXPECT_THROW(ParseRegistration(json), quivra::Error) << queue_and_config;
    }
}

}  // namespace
}  // namespace kestotifyd
