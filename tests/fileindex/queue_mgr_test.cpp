#include "fileindex/queue_mgr.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "common/lock_file.h"
#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

class QueueMgrTest : public QueueTest {
  protected:
    std::vector<std::string> Process(bool use_tmp, int count) {
        std::vector<std::string> ops;
        const auto collect = [&](const std::shared_ptr<OP>& op) { ops.push_back(Printed(op)); };
        EXPECT_EQ(QueueMgr(queue_).ProcessOP(collect, use_tmp), count);
        return ops;
    }
    bool Exists(const std::string& suffix) const {
        return std::filesystem::exists(queue_ + suffix);
    }

    using Ops = std::vector<std::string>;
};

TEST_F(QueueMgrTest, PassMovesTheQueueAsideAndKeepsTheCopy) {
    Write(queue_, {Line(EVENT_CREATE, "/a"), Line(EVENT_MODIFY, "/a")});
    EXPECT_EQ(Process(false, 2), Ops{"[02] /a"});
    EXPECT_TRUE(Exists("") && !Exists(".tmp"));
    EXPECT_EQ(Process(true, 2), Ops{"[02] /a"});
    EXPECT_TRUE(!Exists("") && Exists(".tmp"));
    EXPECT_EQ(Process(false, 0), Ops{});

    // A pass that fails leaves the copy.
    const auto fail = [](auto) { throw Error(1401, "busy"); };
    EXPECT_EQ(ErrorOf([&] { QueueMgr(queue_).ProcessOP(fail, true); }).first, 1401);

    // The copy comes first again, whatever has been queued meanwhile, until it is deleted.
    Write(queue_, {Line(EVENT_DELETE, "/b")});
    EXPECT_EQ(Process(true, 2), Ops{"[02] /a"});
    EXPECT_EQ(Process(false, 1), Ops{"[01] /b"});
    QueueMgr manager(queue_);
    EXPECT_EQ(manager.DeleteTmp(), 0);
    EXPECT_EQ(manager.DeleteTmp(), -1);
    EXPECT_EQ(Process(true, 1), Ops{"[01] /b"});
    EXPECT_EQ(manager.DeleteTmp(), 0);
    EXPECT_EQ(Process(true, 0), Ops{});
    EXPECT_FALSE(Exists("")) << "looking at an absent queue made one";
}

TEST_F(QueueMgrTest, NoEventIsLostBetweenWritersAndPasses) {
    constexpr int kWriters = 3;
    constexpr int kLines = 200;
    fake::OnSleep([](auto) { poll(nullptr, 0, 1); });
    for (int writer = 0; writer < kWriters; ++writer) {
        if (fork() == 0) {
            for (int i = 0; i < kLines; ++i) {
                const LockFile lock(queue_, true);
                std::ofstream(queue_, std::ios::app)
                    << Line(EVENT_CREATE, "/" + std::to_string(writer * kLines + i)) << '\n';
            }
            _exit(0);
        }
    }
    QueueMgr manager(queue_);
    std::set<std::string> seen;
    const auto pass = [&] {
        manager.ProcessOP([&](const std::shared_ptr<OP>& op) { seen.insert(Printed(op)); }, true);
        manager.DeleteTmp();
    };
    int running = kWriters;
    while (running > 0) {
        pass();
        running -= waitpid(-1, nullptr, WNOHANG) > 0 ? 1 : 0;
    }
    pass();
    EXPECT_EQ(seen.size(), static_cast<std::size_t>(kWriters * kLines));
}

TEST_F(QueueMgrTest, OnlyAPrivatePlaceBelowTheSystemDirectoryIsUsed) {
    const std::string share = std::filesystem::path(queue_).parent_path() / "share";
    const std::string place = share + "/@eaDir/fileindex";
    const std::string queue = place + "/queue";
    const std::string secret = share + "/secret";
    Json::Value event;
    fromString(event, Line(EVENT_REINDEX, "/x"));
    const struct {
        const char* what;
        std::function<void()> plant;
        int prepare;  // code of PrepareTmpQueue
        int append;
    } rows[] = {
        {"nothing", [] {}, 0, 0},
        {"others may write", [&] { chmod((share + "/@eaDir").c_str(), 0777); }, 506, 506},
        {"a link as @eaDir",
         [&] {
             std::filesystem::rename(share + "/@eaDir", share + "/theirs");
             std::filesystem::create_symlink("theirs", share + "/@eaDir");
         },
         506, 506},
        {"a link as queue", [&] { std::filesystem::create_symlink(secret, queue); }, 0, 506},
        {"a FIFO as queue", [&] { mkfifo(queue.c_str(), 0600); }, 0, 506},
        {"no directory", [&] { std::filesystem::remove_all(share + "/@eaDir"); }, 0, 506},
    };
    for (const auto& row : rows) {
        std::filesystem::remove_all(share);
        std::filesystem::create_directories(place);
        std::ofstream(secret) << "theirs";
        row.plant();
        QueueMgr manager(queue);
        EXPECT_EQ(ErrorOf([&] { manager.PrepareTmpQueue(); }).first, row.prepare) << row.what;
        EXPECT_EQ(ErrorOf([&] { manager.Append(event); }).first, row.append) << row.what;
        EXPECT_EQ(std::filesystem::file_size(secret), 6U) << row.what;
        if (row.prepare == 0) {
            EXPECT_EQ(manager.IsFullPathHasReindex("/x"), row.append == 0) << row.what;
        } else {
            const auto [code, reason] = ErrorOf([&] { manager.IsFullPathHasReindex("/x"); });
            EXPECT_EQ(code, 502) << row.what;
            EXPECT_NE(reason.find("@eaDir"), std::string::npos) << reason;
        }
    }
    std::filesystem::remove_all(share);
}

TEST_F(QueueMgrTest, TellsWhatIsPending) {
    const struct {
        std::string line;
        const char* path;
        bool processing;
        bool reindex;
    } rows[] = {
        {Line(EVENT_CREATE, "/v/s/dir/file"), "/v/s/dir", true, false},
        {Line(EVENT_CREATE, "/v/s/dir2/file"), "/v/s/dir", false, false},
        {Line(EVENT_CREATE, "/v/s"), "/v/s/dir", false, false},
        {Line(EVENT_RENAME, "/w/x", "/v/s/dir/x"), "/v/s/dir", true, false},
        {Line(EVENT_REINDEX, "/v/s/dir"), "/v/s/dir/sub", false, true},
        {Line(EVENT_REINDEX, "/v/s/dir"), "/v/s/dir", true, true},
        {Line(EVENT_REINDEX | EVENT_ATTR, "/v/s/dir"), "/v/s/dir/sub", false, false},
    };
    for (const auto& row : rows) {
        for (const bool in_copy : {false, true}) {
            Write(queue_ + (in_copy ? ".tmp" : ""), {row.line});
            if (in_copy) {
                Write(queue_, {Line(EVENT_CREATE, "/other")});
            }
            const QueueMgr manager(queue_);
            EXPECT_EQ(manager.IsFullPathProcessing(row.path), row.processing) << row.line;
            EXPECT_EQ(manager.IsFullPathHasReindex(row.path), row.reindex) << row.line;
            std::filesystem::remove(queue_ + ".tmp");
        }
    }
    // A bad line does not mean that nothing is pending.
    Write(queue_, {"bad", rows[0].line});
    EXPECT_EQ(ErrorOf([&] { QueueMgr(queue_).IsFullPathProcessing("/b"); }).first, 906);
}

}  // namespace
}  // namespace quivra::fileindex
