#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "base/frame.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "programs/kestotifyd/fanotify_backend.h"
#include "tests/programs/kestotifyd/share_model.h"
#include "tests/support/files.h"
#include "tests/support/program.h"

namespace fs = std::filesystem;
using support::Eventually;
using support::ReadFile;
using support::WriteFile;

namespace {

constexpr char kShare[] = "/volume1/photo";
constexpr char kRegistrations[] = "/var/lib/kesto/monitor";
constexpr char kLog[] = "/var/log/kestotifyd.log";

/// The real program, on a real directory, with the back end that the parameter names.
class LiveTest : public testing::TestWithParam<const char*> {
  protected:
    void SetUp() override {
        fs::create_directories(Queue().parent_path());
        fs::create_directories("/volume1/outside");
        if (std::string(GetParam()) == "fanotify" && !IsFanotifyThere()) {
            GTEST_SKIP() << "the kernel refuses fanotify here";
        }
    }

    static bool IsFanotifyThere() {
        struct : kestotifyd::BackendSink {
            void OnChange(const kestotifyd::Change&) override {}
            void OnRootComplete(const std::string&) override {}
            void OnGaps(const std::string&) override {}
            void OnRootLost(const std::string&) override {}
            void OnOverflow(const std::string&) override {}
            bool ShouldWatch(const std::string&) const override { return true; }
        } sink;
        const auto backend = kestotifyd::FanotifyBackend::Create(sink);
        return backend && backend->AddRoot(kShare);
    }

    void TearDown() override {
        monitor_.reset();
        fs::remove_all("/var/lib/kesto");
        fs::remove_all("/volume1");
        fs::remove(kLog);
    }

    static fs::path Queue(const std::string& share = kShare) {
        return share + "/@eaDir/fileindex/queue";
    }

    static void Register(const std::string& share = kShare, const std::string& ignore = "@eaDir") {
        Json::Value json;
        json["app"] = "fileindex";
        json["type"] = 1;
        json["queue"] = Queue(share).string();
        json["config"]["path"].append(share);
        json["config"]["mask"] = 65478;
        json["config"]["ignore"].append(ignore);
        fs::create_directories(kRegistrations);
        fs::create_directories(Queue(share).parent_path());
        ASSERT_TRUE(quivra::toFile(json, File(share)));
    }
    static std::string File(const std::string& share) {
        return std::string(kRegistrations) + "/" + fs::path(share).filename().string() + ".json";
    }

    void Start(std::vector<std::string> arguments = {}) {
        arguments.insert(arguments.end(), {"--verbose", "--backend", GetParam()});
        monitor_ = std::make_unique<support::Program>("kestotifyd", arguments);
    }

    /// Starts, and waits for the reindex that every start owes; the queue is empty then.
    bool StartAndSettle() {
        Register();
        Start();
        const std::string reindex = Line(0x10000, true, kShare);
        return Comes(reindex) && Lines() == std::vector<std::string>{reindex} && model_.Converges();
    }

    static Json::Value State() {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(2);
        const auto socket = quivra::base::ConnectUnix("/var/run/kestotifyd.sock", deadline);
        std::string text;
        Json::Value reply;
        EXPECT_TRUE(socket.IsValid() &&
                    quivra::base::SendFrame(socket.Get(), R"({"type":"state"})", deadline) &&
                    quivra::base::ReceiveFrame(socket.Get(), text, 1U << 20, deadline) &&
                    quivra::fromString(reply, text) && reply["success"] == true)
            << text;
        return reply["data"];
    }

    static bool HasLog(const std::string& text) {
        return ReadFile(kLog).find(text) != std::string::npos;
    }

    static std::string Line(unsigned event, bool is_dir, const std::string& path,
                            const std::string& path_old = "") {
        Json::Value json;
        json["event"] = event;
        json["is_dir"] = is_dir;
        json["path"] = path;
        if (!path_old.empty()) {
            json["path_old"] = path_old;
        }
        return quivra::toString(json);
    }

    static std::vector<std::string> Lines(const std::string& share = kShare) {
        std::vector<std::string> lines;
        std::ifstream file(Queue(share));
        for (std::string line; std::getline(file, line);) {
            lines.push_back(line);
        }
        return lines;
    }
    static bool Has(const std::string& line, const std::string& share = kShare) {
        const std::vector<std::string> lines = Lines(share);
        return std::find(lines.begin(), lines.end(), line) != lines.end();
    }
    static testing::AssertionResult Comes(const std::string& line,
                                          const std::string& share = kShare) {
        if (Eventually([&] { return Has(line, share); }, std::chrono::seconds(10))) {
            return testing::AssertionSuccess();
        }
        return testing::AssertionFailure() << line << "\nQueue:\n"
                                           << ReadFile(Queue(share)) << "\nLog:\n"
                                           << ReadFile(kLog);
    }
    /// The lines up to the one for a file that is made now.
    std::vector<std::string> LinesUntilNow() {
        const std::string mark = std::string(kShare) + "/mark" + std::to_string(++marks_);
        WriteFile(mark);
        EXPECT_TRUE(Comes(Line(0x2, false, mark)));
        std::vector<std::string> lines = Lines();
        std::erase_if(lines, [&](const std::string& line) {
            return line.find("/mark") != std::string::npos;
        });
        return lines;
    }

    const std::string share_ = kShare;
    std::unique_ptr<support::Program> monitor_;
    ShareModel model_{kShare, Queue()};
    int marks_ = 0;
};

INSTANTIATE_TEST_SUITE_P(Backends, LiveTest, testing::Values("inotify", "fanotify"),
                         [](const auto& name) { return std::string(name.param); });

TEST_P(LiveTest, ADirectoryRenameIsOneLine) {
    fs::create_directories(share_ + "/many/sub");
    for (int i = 0; i < 1000; ++i) {
        WriteFile(share_ + "/many/sub/f" + std::to_string(i));
    }
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    fs::rename(share_ + "/many", share_ + "/moved");
    WriteFile(share_ + "/moved/sub/f7", "new content");
    EXPECT_EQ(LinesUntilNow(),
              (std::vector<std::string>{Line(0x100, true, share_ + "/moved", share_ + "/many"),
                                        Line(0x2, false, share_ + "/moved/sub/f7")}));
    EXPECT_TRUE(model_.Converges());
}

TEST_P(LiveTest, MovesInAndOutAndBetweenShares) {
    const std::string other = "/volume1/video";
    Register(other);
    fs::create_directories(share_ + "/keep/deep");
    WriteFile(share_ + "/keep/deep/f");
    fs::create_directories("/volume1/outside/in/deep");
    WriteFile("/volume1/outside/in/deep/f");
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    ASSERT_TRUE(Comes(Line(0x10000, true, other), other));
    fs::rename("/volume1/outside/in", share_ + "/in");
    EXPECT_TRUE(Comes(Line(0x40, true, share_ + "/in")));
    WriteFile(share_ + "/in/deep/late");
    EXPECT_TRUE(Comes(Line(0x40, false, share_ + "/in/deep/late")));
    fs::rename(share_ + "/in", "/volume1/outside/out");
    EXPECT_TRUE(Comes(Line(0x80, true, share_ + "/in")));
    WriteFile("/volume1/outside/out/deep/unseen");
    fs::rename(share_ + "/keep", other + "/kept");
    EXPECT_TRUE(Comes(Line(0x80, true, share_ + "/keep")));
    EXPECT_TRUE(Comes(Line(0x40, true, other + "/kept"), other));
    WriteFile(other + "/kept/deep/f", "changed");
    EXPECT_TRUE(Comes(Line(0x2, false, other + "/kept/deep/f"), other));
    EXPECT_EQ(ReadFile(Queue()).find("unseen"), std::string::npos);
    EXPECT_TRUE(model_.Converges());
}

TEST_P(LiveTest, RegistrationsComeChangeAndGoWhileItRuns) {
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    const std::string other = "/volume1/video";
    WriteFile(std::string(kRegistrations) + "/broken.json", "{\"queue\":");
    Register(other);
    // Whether a file that is written now is reported. The queue is never taken away, so that no
    // line can come between; the lines of a file are counted instead.
    const auto reports = [&](const std::string& name) {
        const auto count = [&] {
            const std::vector<std::string> lines = Lines(other);
            return std::count(lines.begin(), lines.end(), Line(0x2, false, other + "/" + name));
        };
        const auto before = count();
        WriteFile(other + "/" + name);
        // A queue is written within one turn of the loop; the second mark belongs to a later one.
        LinesUntilNow();
        LinesUntilNow();
        return count() > before;
    };
    ASSERT_TRUE(Eventually([&] { return reports("skip"); })) << ReadFile(kLog);
    EXPECT_FALSE(Has(Line(0x10000, true, other), other)) << "new in this run";
    EXPECT_TRUE(HasLog("broken.json skipped"));

    Register(other, "skip");
    EXPECT_TRUE(Eventually([&] { return !reports("skip"); }));
    EXPECT_TRUE(reports("seen"));
    fs::remove(File(other));
    EXPECT_TRUE(Eventually([&] { return !reports("seen"); }));
    Register(other);  // what happened meanwhile was not seen
    EXPECT_TRUE(Comes(Line(0x10000, true, other), other));
}

TEST_P(LiveTest, EveryStartBeginsWithAReindex) {
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    for (const int signal : {SIGKILL, SIGTERM}) {
        WriteFile(share_ + "/last");
        fs::create_directories(share_ + "/a/b/c");
        monitor_->Stop(signal);
        fs::remove(Queue());
        WriteFile(share_ + "/meanwhile" + std::to_string(signal));
        Start();
        ASSERT_TRUE(Comes(Line(0x10000, true, kShare)));
        EXPECT_EQ(Lines().front(), Line(0x10000, true, kShare));
        EXPECT_TRUE(model_.Converges());
    }
    EXPECT_EQ(support::RunProgram("kestotifyd", {}).status, 1) << "a second instance";
}

TEST_P(LiveTest, OverflowBecomesACrashMarkerAndNothingStaysUnwatched) {
    fs::create_directories(share_ + "/outer/inner/deep");
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    kill(monitor_->Pid(), SIGSTOP);
    for (int i = 0; i < 300; ++i) {
        fs::create_directories(share_ + "/d" + std::to_string(i) + "/sub");
    }
    for (int i = 0; i < 17000; ++i) {
        WriteFile(share_ + "/f" + std::to_string(i));
    }
    // Unseen, a directory takes the place of the one above it.
    fs::rename(share_ + "/outer/inner", share_ + "/between");
    fs::remove(share_ + "/outer");
    fs::rename(share_ + "/between", share_ + "/outer");
    kill(monitor_->Pid(), SIGCONT);
    EXPECT_TRUE(Comes(Line(0x200, true, kShare)));
    EXPECT_TRUE(HasLog("max_queued_events"));
    EXPECT_TRUE(model_.Converges());
    WriteFile(share_ + "/d299/sub/late");
    EXPECT_TRUE(Comes(Line(0x2, false, share_ + "/d299/sub/late")));
    for (const std::string place : {"/outer/late", "/outer/deep/late"}) {
        WriteFile(share_ + place);
        EXPECT_TRUE(Comes(Line(0x2, false, share_ + place)));
    }
}

TEST_P(LiveTest, ARefusedWatchBecomesACrashMarker) {
    if (std::string(GetParam()) != "inotify") {
        GTEST_SKIP() << "needs no watches";
    }
    for (int i = 0; i < 20; ++i) {
        fs::create_directories(share_ + "/d" + std::to_string(i));
    }
    Register();
    Start({"--max-watches", "12"});
    EXPECT_TRUE(Comes(Line(0x200, true, kShare)));
    EXPECT_EQ(Lines().front(), Line(0x10000, true, kShare));
    EXPECT_TRUE(HasLog("sysctl fs.inotify.max_user_watches="));
    EXPECT_TRUE(model_.Converges());
    fs::create_directories(share_ + "/refused");
    EXPECT_TRUE(Comes(Line(0x40, true, share_ + "/refused")));
    EXPECT_TRUE(model_.Converges());
    const Json::Value state = State()["folders"][0];
    EXPECT_EQ(state["watched"], 12);
    EXPECT_EQ(state["unwatched"], 10);
    EXPECT_NE(state["problem"].asString().find("sysctl"), std::string::npos);

    WriteFile(share_ + "/refused/unseen");
    for (int i = 0; i < 20; ++i) {
        fs::remove(share_ + "/d" + std::to_string(i));
    }
    EXPECT_TRUE(Comes(Line(0x200, true, kShare))) << "tried again when watches came free";
    EXPECT_TRUE(model_.Converges());
    WriteFile(share_ + "/refused/seen");
    EXPECT_TRUE(Comes(Line(0x2, false, share_ + "/refused/seen")));
    EXPECT_EQ(State()["folders"][0]["unwatched"], 0);
}

TEST_P(LiveTest, WithoutDescriptorsNothingIsLostInSilence) {
    fs::create_directories(share_ + "/old");  // no event has told fanotify where it is
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    const rlimit none{3, 1024};
    const rlimit enough{1024, 1024};
    ASSERT_EQ(prlimit(monitor_->Pid(), RLIMIT_NOFILE, &none, nullptr), 0);
    fs::create_directories(share_ + "/unseen/deep");
    WriteFile(share_ + "/unseen/deep/f");
    WriteFile(share_ + "/old/f");
    EXPECT_TRUE(Eventually([] { return HasLog("cannot be watched") || HasLog("are missed"); }));
    ASSERT_EQ(prlimit(monitor_->Pid(), RLIMIT_NOFILE, &enough, nullptr), 0);
    EXPECT_TRUE(Comes(Line(0x200, true, kShare)));
    EXPECT_TRUE(model_.Converges());
    WriteFile(share_ + "/unseen/deep/g");
    EXPECT_TRUE(Comes(Line(0x2, false, share_ + "/unseen/deep/g")));
}

TEST_P(LiveTest, TellsItsState) {
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    fs::create_directories(share_ + "/sub");
    kill(monitor_->Pid(), SIGHUP);  // reads the registrations again
    LinesUntilNow();
    const Json::Value state = State();
    EXPECT_EQ(state["backend"], GetParam());
    EXPECT_EQ(state["overflows"], 0);
    EXPECT_EQ(state["problem"], "");
    EXPECT_LT(state["last_event"].asInt(), 60);
    ASSERT_EQ(state["folders"].size(), 1U);
    const Json::Value& folder = state["folders"][0];
    EXPECT_EQ(folder["queue"], Queue().string());
    EXPECT_EQ(folder["share_path"], kShare);
    EXPECT_EQ(folder["watched"], state["backend"] == "inotify" ? 2 : 1);
    EXPECT_EQ(folder["unwatched"], 0);
    EXPECT_EQ(folder["problem"], "");

    fs::rename(share_ + "/@eaDir", share_ + "/away");
    WriteFile(share_ + "/@eaDir");
    EXPECT_TRUE(Eventually([&] {
        return State()["folders"][0]["problem"] == share_ + "/@eaDir is not a directory; remove it";
    }));
    fs::remove(share_ + "/@eaDir");  // made anew, and what was not read yet is owed
    EXPECT_TRUE(Comes(Line(0x200, true, kShare)));
    EXPECT_EQ(State()["folders"][0]["problem"], "");
    fs::remove_all("/volume1");
    fs::create_directories("/volume1");
    EXPECT_TRUE(Eventually([&] {
        return State()["folders"][0]["problem"].asString().find(share_ + " cannot be watched") == 0;
    }));
}

/// Each event of a deep tree used to cost a look-up from the root for each directory above, and
/// neither a stop signal nor anything else was looked at meanwhile.
TEST_P(LiveTest, DeepTreesHoldUpNothing) {
    std::string deep = share_ + "/a";
    fs::create_directories(deep);
    for (int i = 0; i < 1500; ++i) {
        deep += "/d";
        ASSERT_EQ(mkdir(deep.c_str(), 0755), 0);
    }
    fs::create_directories(share_ + "/b");
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    kill(monitor_->Pid(), SIGSTOP);
    const std::string a = share_ + "/a";
    const std::string b = share_ + "/b";
    // Where the names on the disk contradict the events, nothing is remembered.
    ASSERT_EQ(renameat2(AT_FDCWD, a.c_str(), AT_FDCWD, b.c_str(), RENAME_EXCHANGE), 0);
    deep.replace(0, a.size(), b);
    for (int i = 0; i < 1000; ++i) {
        WriteFile(deep + "/f");
        deep.resize(deep.size() - 2);
    }
    kill(monitor_->Pid(), SIGCONT);
    LinesUntilNow();
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(monitor_->Stop(SIGTERM), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(1));
}

TEST_P(LiveTest, ExchangedDirectoriesAndFilesAreBothFollowed) {
    for (const std::string name : {"/a", "/b"}) {
        fs::create_directories(share_ + name + name + "/deep");
        WriteFile(share_ + name + ".txt", name);
    }
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    const auto exchange = [&](const std::string& ending) {
        return renameat2(AT_FDCWD, (share_ + "/a" + ending).c_str(), AT_FDCWD,
                         (share_ + "/b" + ending).c_str(), RENAME_EXCHANGE);
    };
    ASSERT_EQ(exchange(""), 0);
    ASSERT_EQ(exchange(".txt"), 0);
    EXPECT_TRUE(model_.Converges());
    for (const std::string place : {"/a/b/deep/f", "/b/a/deep/f"}) {
        WriteFile(share_ + place);
        EXPECT_TRUE(Comes(Line(0x2, false, share_ + place)));
    }
}

TEST_P(LiveTest, WhatIsMountedBelowIsWatchedAndItsUnmountingIsNoDelete) {
    const std::string disk = share_ + "/disk";
    fs::create_directories(disk + "/covered");
    WriteFile(disk + "/covered/hidden");
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    ASSERT_EQ(mount("none", disk.c_str(), "tmpfs", 0, nullptr), 0);
    EXPECT_TRUE(Comes(Line(0x10000, true, disk)));
    WriteFile(disk + "/f");
    EXPECT_TRUE(Comes(Line(0x2, false, disk + "/f")));
    EXPECT_EQ(ReadFile(Queue()).find("\"event\":128"), std::string::npos);
    EXPECT_TRUE(model_.Converges());
    ASSERT_EQ(umount(disk.c_str()), 0) << "the monitor keeps it busy";
    EXPECT_TRUE(Comes(Line(0x10000, true, disk))) << "what it had hidden is back";
    WriteFile(disk + "/covered/under");
    EXPECT_TRUE(Comes(Line(0x2, false, disk + "/covered/under")));
    EXPECT_EQ(ReadFile(Queue()).find("\"event\":128"), std::string::npos);
    EXPECT_TRUE(model_.Converges());
}

TEST_P(LiveTest, AVolumeThatIsAwayIsNotTakenForEmpty) {
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    const std::string volume = "/volume2";
    const std::string queue = "/volume1/video.queue";
    fs::create_directories(volume);
    ASSERT_EQ(mount("none", volume.c_str(), "tmpfs", 0, nullptr), 0);
    Json::Value json;
    json["queue"] = queue;
    json["config"]["path"].append(volume);
    json["config"]["mask"] = 65478;
    ASSERT_TRUE(quivra::toFile(json, std::string(kRegistrations) + "/volume2.json"));
    const auto queue_has = [&](const std::string& line) {
        return ReadFile(queue).find(line) != std::string::npos;
    };
    EXPECT_TRUE(Eventually([&] {
        WriteFile(volume + "/f");
        return queue_has(volume + "/f");
    }));
    ASSERT_EQ(umount(volume.c_str()), 0) << "the monitor keeps it busy";
    LinesUntilNow();
    monitor_->Stop(SIGTERM);
    Start();
    EXPECT_TRUE(Comes(Line(0x10000, true, kShare)));
    LinesUntilNow();
    EXPECT_FALSE(queue_has("65536")) << ReadFile(queue);
    ASSERT_EQ(mount("none", volume.c_str(), "tmpfs", 0, nullptr), 0);
    EXPECT_TRUE(Eventually([&] { return queue_has(Line(0x10000, true, volume)); }));
    EXPECT_FALSE(queue_has(":128")) << ReadFile(queue);
    umount(volume.c_str());
}

/// One random operation on a small tree, inside or outside the share.
void RandomOperation(std::mt19937& random) {
    const auto number = [&](unsigned below) { return random() % below; };
    const auto pick = [&] {
        std::string path = number(12) == 0 ? "/volume1/outside" : kShare;
        for (auto depth = 1 + number(3); depth > 0; --depth) {
            path += std::string("/") + "abcd"[number(4)];
        }
        return path;
    };
    std::error_code ignored;
    const std::string path = pick();
    const auto kind = number(10);
    if (kind < 2) {
        fs::create_directories(path, ignored);
    } else if (kind < 5 && !fs::is_directory(path)) {
        // A change is told for the name that it was made through, not for other links.
        if (fs::hard_link_count(path, ignored) > 1) {
            fs::remove(path, ignored);
        }
        WriteFile(path, std::to_string(random()));
    } else if (kind == 5) {
        fs::remove_all(path, ignored);
    } else if (kind == 6) {
        fs::create_hard_link(path, pick(), ignored);
    } else if (kind > 6) {
        fs::rename(path, pick(), ignored);
    }
}

TEST_P(LiveTest, StormsEndWithTheDisk) {
    ASSERT_TRUE(StartAndSettle()) << ReadFile(kLog);
    const char* const given = std::getenv("STORM_SEED");
    const unsigned seed = given != nullptr ? static_cast<unsigned>(std::atoi(given)) : 1;
    std::mt19937 random(seed);
    for (unsigned round = 0; round < 40; ++round) {
        // Stopped meanwhile, the monitor finds every event far behind the disk.
        const bool is_stopped = round % 2 == 0;
        kill(monitor_->Pid(), is_stopped ? SIGSTOP : SIGCONT);
        for (int left = round % 4 < 2 ? 60 : 1500; left > 0; --left) {
            RandomOperation(random);
        }
        kill(monitor_->Pid(), SIGCONT);
        ASSERT_TRUE(model_.Converges()) << "STORM_SEED=" << seed << ", round " << round;
    }
    EXPECT_EQ(model_.CrashCount(), 0U);
    EXPECT_TRUE(monitor_->IsRunning());
}

}  // namespace
