// Random file operations on a real directory, with the queue lines that a monitor would write, and
// passes of the real programs in between, which are killed now and then: in the end the index holds
// exactly what is on disk.

#include <gtest/gtest.h>
#include <signal.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <thread>

#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "tests/support/index_state.h"
#include "tests/support/program.h"
#include "tests/system/file_user.h"

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

/// Writes the line of a monitor that watches.
void WriteLine(unsigned int event, bool is_dir, const std::string& path,
               const std::string& path_old) {
    Json::Value line;
    line["event"] = event;
    line["is_dir"] = is_dir;
    line["path"] = path;
    line["path_old"] = path_old;
    const quivra::LockFile lock(kQueue, true);
    std::ofstream(kQueue, std::ios::app) << quivra::toString(line) << '\n';
}

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
    FileUser user(GetParam(), kRoot, kOutside, WriteLine);
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
            const Contents disk = support::ContentsOnDisk(kRoot);
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
