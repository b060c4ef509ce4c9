// Random file operations on a real directory, with the queue lines that a monitor would write, and
// passes of the real programs in between, which are killed now and then: in the end the index holds
// exactly what is on disk.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iomanip>
#include <memory>
#include <random>
#include <thread>

#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/event.h"
#include "tests/support/index_state.h"
#include "tests/support/program.h"

namespace {

namespace fs = std::filesystem;
using namespace quivra::fileindex;
using support::Contents;
using support::Program;

const std::string kShare = "photo";
const std::string kRoot = "/volume1/photo";
const std::string kOutside = "/volume1/outside";
const std::string kQueue = kRoot + "/@eaDir/fileindex/queue";
const std::string kEngineSocket = "/var/run/kestoelasticd.sock";

Contents OnDisk() {
    return support::ContentsOnDisk(kRoot);
}

/// Does things to the files below the share, and writes the lines of a monitor that watches.
class FileUser {
  public:
    explicit FileUser(unsigned int seed) : random_(seed) {}

    void DoSomething() {
        static constexpr void (FileUser::*kActions[])() = {
            &FileUser::CreateFile,   &FileUser::CreateFile, &FileUser::CreateDirectory,
            &FileUser::ModifyFile,   &FileUser::ModifyFile, &FileUser::DeleteSomething,
            &FileUser::Rename,       &FileUser::Rename,     &FileUser::ReplaceByRename,
            &FileUser::ChangeRights, &FileUser::MoveOut,    &FileUser::MoveIn};
        (this->*kActions[Below(std::size(kActions))])();
    }

    std::size_t Below(std::size_t limit) { return random_() % limit; }

  private:
    void Line(unsigned int event, bool is_dir, const std::string& path,
              const std::string& path_old = "") {
        Json::Value line;
        line["event"] = event;
        line["is_dir"] = is_dir;
        line["path"] = path;
        line["path_old"] = path_old;
        const quivra::LockFile lock(kQueue, true);
        std::ofstream(kQueue, std::ios::app) << quivra::toString(line) << '\n';
    }

    std::vector<std::string> Existing(bool directories) {
        std::vector<std::string> found;
        for (const auto& [path, content] : OnDisk()) {
            if ((content == "/") == directories) {
                found.push_back(path);
            }
        }
        return found;
    }

    std::string SomeFile() { return Pick(Existing(false)); }
    std::string SomeDirectory() { return Pick(Existing(true)); }
    std::string Pick(const std::vector<std::string>& from) {
        return from.empty() ? std::string() : from[Below(from.size())];
    }

    /// Few names, so that they come back after a delete or a rename.
    std::string FreeName() {
        std::vector<std::string> parents = Existing(true);
        parents.push_back(kRoot);
        for (int attempt = 0; attempt < 20; ++attempt) {
            const std::string path = Pick(parents) + "/" + "abcde\xff"[Below(6)];
            if (!fs::exists(path)) {
                return path;
            }
        }
        return kRoot + "/n" + std::to_string(++counter_);
    }

    void Write(const std::string& path) {
        // All of one size, so that size and second often stay the same.
        std::ofstream(path) << "token" << std::setw(8) << std::setfill('0') << ++counter_ << '\n';
    }

    void CreateFile() {
        const std::string path = FreeName();
        Write(path);
        Line(EVENT_CREATE, false, path);
        Line(EVENT_MODIFY, false, path);
    }

    void CreateDirectory() {
        const std::string path = FreeName();
        fs::create_directory(path);
        Line(EVENT_CREATE, true, path);
    }

    void ModifyFile() {
        const std::string path = SomeFile();
        if (!path.empty()) {
            Write(path);
            Line(EVENT_MODIFY, false, path);
        }
    }

    void ChangeRights() {
        const std::string path = SomeFile();
        if (!path.empty()) {
            chmod(path.c_str(), Below(2) == 0 ? 0600 : 0644);
            Line(EVENT_ATTR, false, path);
        }
    }

    void DeleteTree(const std::string& path) {
        if (fs::is_directory(path)) {
            const std::vector<fs::path> children(fs::directory_iterator{path}, {});
            for (const fs::path& child : children) {
                DeleteTree(child);
            }
        }
        const bool is_dir = fs::is_directory(path);
        fs::remove(path);
        Line(EVENT_DELETE, is_dir, path);
    }

    void DeleteSomething() {
        const std::string path = Below(3) == 0 ? SomeDirectory() : SomeFile();
        if (!path.empty()) {
            DeleteTree(path);
        }
    }

    void Rename() {
        const std::string from = Below(2) == 0 ? SomeDirectory() : SomeFile();
        const std::string to = FreeName();
        if (!from.empty() && (to + "/").compare(0, from.size() + 1, from + "/") != 0) {
            const bool is_dir = fs::is_directory(from);
            fs::rename(from, to);
            Line(EVENT_RENAME, is_dir, to, from);
        }
    }

    void ReplaceByRename() {
        const std::string from = SomeFile();
        const std::string to = SomeFile();
        if (from != to) {
            fs::rename(from, to);
            Line(EVENT_RENAME, false, to, from);
        }
    }

    void MoveOut() {
        const std::string from = Below(2) == 0 ? SomeDirectory() : SomeFile();
        if (!from.empty()) {
            const bool is_dir = fs::is_directory(from);
            fs::rename(from, kOutside + "/" + std::to_string(++counter_));
            Line(EVENT_DELETE, is_dir, from);
        }
    }

    void MoveIn() {
        std::vector<std::string> outside;
        for (const auto& entry : fs::directory_iterator(kOutside)) {
            outside.push_back(entry.path());
        }
        const std::string from = Pick(outside);
        if (!from.empty()) {
            const bool is_dir = fs::is_directory(from);
            const std::string to = FreeName();
            fs::rename(from, to);
            Line(EVENT_CREATE, is_dir, to);
        }
    }

    std::mt19937 random_;
    int counter_ = 0;
};

class RandomOpsTest : public testing::TestWithParam<unsigned int> {
  protected:
    void SetUp() override {
        log_level = 0;
        fs::create_directories(kRoot + "/@eaDir/fileindex");
        fs::permissions(kRoot + "/@eaDir/fileindex", fs::perms::owner_all);
        fs::create_directories(kOutside);
        fs::create_directories("/etc/kesto");
        std::ofstream("/etc/kesto/shares.conf") << "[photo]\npath = " << kRoot << "\n";
        engine_ = std::make_unique<Program>(support::StartDaemon("kestoelasticd", kEngineSocket));
    }

    void TearDown() override {
        elastic::ShareIndexDelete(kShare);
        engine_.reset();
        fs::remove_all("/volume1");
    }

    void Pass() {
        const support::Outcome outcome = support::RunProgram("fileindexd", {"--once", kShare});
        ASSERT_EQ(outcome.status, 0) << outcome.output;
    }

    void KilledPass(std::chrono::microseconds after) {
        Program pass("fileindexd", {"--once", kShare});
        std::this_thread::sleep_for(after);
        pass.Stop(SIGKILL);
    }

    /// The pass fails, or is over already.
    void PassWithKilledEngine(std::chrono::microseconds after) {
        Program pass("fileindexd", {"--once", kShare});
        std::this_thread::sleep_for(after);
        engine_->Stop(SIGKILL);
        pass.Wait();
        *engine_ = support::StartDaemon("kestoelasticd", kEngineSocket);
    }

    std::unique_ptr<Program> engine_;
};

TEST_P(RandomOpsTest, IndexEqualsDisk) {
    FileUser user(GetParam());
    for (int round = 0; round < 12; ++round) {
        for (std::size_t left = user.Below(40) + 1; left > 0; --left) {
            user.DoSomething();
        }
        const std::size_t chance = user.Below(4);
        if (chance == 0) {
            KilledPass(std::chrono::microseconds(user.Below(60000)));
        } else if (chance == 1) {
            PassWithKilledEngine(std::chrono::microseconds(user.Below(60000)));
        }
        if (chance < 3) {
            ASSERT_NO_FATAL_FAILURE(Pass());
            const Contents disk = OnDisk();
            const Contents index = support::ContentsInIndex(kShare, kRoot);
            ASSERT_TRUE(disk == index) << "seed " << GetParam() << ", round " << round << "\n"
                                       << support::Difference(disk, index);
        }
    }
}

std::vector<unsigned int> Seeds() {
    if (const char* seed = std::getenv("SEED")) {
        return {static_cast<unsigned int>(std::strtoul(seed, nullptr, 10))};
    }
    return {1, 2, 3, 4, 5, 6};
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomOpsTest, testing::ValuesIn(Seeds()));

}  // namespace
