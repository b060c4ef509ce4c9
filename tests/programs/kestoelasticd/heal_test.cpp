#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>

#include "common/json.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/service.h"
#include "tests/programs/kestoelasticd/client.h"

namespace elasticd {
namespace {

namespace fs = std::filesystem;

const std::string kState = "/var/lib/heal_test";
const std::string kShare = kState + "/share";
const std::string kDatabase = kShare + "/@eaDir/fileindex/db";
const std::string kFile = kDatabase + "/index.sqlite";

/// Indexes that are damaged, gone or not ours any more, beside one that has nothing to do with it.
class HealTest : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kState);
        fs::create_directories(kShare);
        Start();
        other.index = "fileindex_other";
        ASSERT_EQ(client.Create(kDatabase, TestMappings()), 0);
        ASSERT_EQ(other.Create(kState + "/other", TestMappings()), 0);
        for (Client* each : {&client, &other}) {
            ASSERT_EQ(each->Upsert("/kept", R"({"title": "kept"})"), 0);
            ASSERT_EQ(each->Commit(), 0);
        }
    }
    void TearDown() override {
        service.reset();
        fs::remove_all(kState);
    }
    void Start() {
        ServiceOptions options;
        options.state_directory = kState + "/state";
        options.min_free_space = 0;
        service.reset();
        service = std::make_unique<Service>(options);
    }
    Json::Value StateOf(const std::string& id) const {
        Json::Value request;
        request["command"] = "state";
        const Json::Value reply = client.Ask(request);
        for (const Json::Value& state : reply["data"]["indexes"]) {
            if (state["id"] == id) {
                return state;
            }
        }
        return {};
    }
    int Accept() const { return client.Code("index_accept"); }

    static std::size_t CountSetAside() {
        std::size_t count = 0;
        for (const auto& entry : fs::directory_iterator(kShare + "/@eaDir/fileindex")) {
            count += entry.path().filename().string().starts_with("db.set-aside-") ? 1 : 0;
        }
        return count;
    }

    /// Made anew, empty and fresh, until its client has taken note; the other did not notice.
    void ExpectMadeAnew(const char* label) {
        EXPECT_EQ(client.Upsert("/a"), kIndexMadeAnew) << label;
        EXPECT_EQ(client.Commit(), kIndexMadeAnew) << label;
        EXPECT_EQ(client.All(), Ids{}) << label;
        EXPECT_TRUE(StateOf(client.index)["fresh"].asBool()) << label;
        Start();  // remembered
        EXPECT_EQ(client.Delete("/a"), kIndexMadeAnew) << label;
        EXPECT_EQ(Accept(), 0) << label;
        EXPECT_EQ(client.Upsert("/new"), 0) << label;
        EXPECT_EQ(client.Commit(), 0) << label;
        EXPECT_EQ(client.All(), Ids{"/new"}) << label;
        EXPECT_EQ(other.All(), Ids{"/kept"}) << label;
        EXPECT_FALSE(StateOf(other.index)["fresh"].asBool()) << label;
    }

    std::unique_ptr<Service> service;
    Client client{[this](const std::string& request) { return service->Handle(request); }};
    Client other = client;
};

void Overwrite(const std::string& path, std::size_t from, const std::string& bytes) {
    std::fstream file(path, std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(static_cast<std::streamoff>(from));
    file << bytes;
}

TEST_F(HealTest, WhatIsDamagedOrGoneIsMadeAnew) {
    const struct {
        const char* label;
        bool running;  ///< whether the daemon has the files open
        std::function<void()> damage;
        std::size_t set_aside;
    } cases[] = {
        {"all of @eaDir removed", true, [] { fs::remove_all(kShare + "/@eaDir"); }, 0},
        {"the index removed", false, [] { fs::remove_all(kDatabase); }, 0},
        {"its file removed", false, [] { fs::remove(kFile); }, 1},
        {"its file emptied", false, [] { fs::resize_file(kFile, 0); }, 1},
        {"its file cut", false, [] { fs::resize_file(kFile, 3 * 4096); }, 1},
        {"its header overwritten", false, [] { Overwrite(kFile, 0, std::string(100, 'x')); }, 1},
        {"the marker removed", false, [] { fs::remove(kDatabase + "/kestoelasticd.index"); }, 1},
        {"the format of an earlier release", false,
         [] {
             Json::Value marker;
             quivra::fromFile(marker, kDatabase + "/kestoelasticd.index");
             marker["format"] = 1;
             quivra::toFile(marker, kDatabase + "/kestoelasticd.index");
             fs::rename(kFile, kDatabase + "/glass");
         },
         1},
        {"another directory in the place of @eaDir", true,
         [] {
             fs::rename(kShare + "/@eaDir", kShare + "/away");
             fs::create_directories(kDatabase);
         },
         0},
    };
    for (const auto& test : cases) {
        TearDown();
        SetUp();
        if (!test.running) {
            service.reset();
        }
        test.damage();
        if (!test.running) {
            Start();
        }
        ExpectMadeAnew(test.label);
        EXPECT_EQ(CountSetAside(), test.set_aside) << test.label;
    }
}

TEST_F(HealTest, WhatStandsInTheWayIsToldAndLeftAlone) {
    fs::rename(kShare + "/@eaDir", kShare + "/away");
    std::ofstream(kShare + "/@eaDir") << "planted";
    EXPECT_EQ(client.Upsert("/a"), kIndexUnavailable);
    EXPECT_EQ(StateOf(client.index)["problem"].asString(), "");
    Start();
    EXPECT_EQ(client.Upsert("/a"), kIndexUnavailable);
    EXPECT_EQ(StateOf(client.index)["problem"].asString(),
              kShare + "/@eaDir is not a directory; remove it");
    fs::remove(kShare + "/@eaDir");
    ExpectMadeAnew("the place is free");
}

TEST_F(HealTest, AMissingDiskIsWaitedFor) {
    service.reset();
    fs::rename(kShare, kState + "/unplugged");
    Start();
    EXPECT_EQ(client.Upsert("/a"), kIndexUnavailable);
    EXPECT_NE(StateOf(client.index)["problem"].asString(), "");
    EXPECT_FALSE(StateOf(client.index)["fresh"].asBool());
    fs::rename(kState + "/unplugged", kShare);
    EXPECT_EQ(client.All(), Ids{"/kept"});
    EXPECT_EQ(client.Upsert("/a"), 0);
}

/// Spoils a file as a failing disk or a wrong program would.
void DamageAnywhere(std::mt19937& random, const std::string& path) {
    constexpr std::size_t kPage = 4096;
    const std::size_t size = fs::file_size(path);
    const auto page = [&] { return random() % (size / kPage) * kPage; };
    std::ifstream in(path, std::ios::binary);
    std::string bytes((std::istreambuf_iterator<char>(in)), {});
    switch (random() % 4) {
        case 0:
            for (int flips = 1 + static_cast<int>(random() % 50); flips > 0; --flips) {
                char& byte = bytes[random() % size];
                byte = static_cast<char>(byte ^ (1 << random() % 8));
            }
            break;
        case 1:
            bytes.replace(page(), kPage, std::string(kPage, '\0'));
            break;
        case 2:
            bytes.replace(page(), kPage, bytes.substr(page(), kPage));
            break;
        default:
            bytes.resize(random() % size);
    }
    std::ofstream(path, std::ios::binary) << bytes;
}

/// DAMAGES says how often. Nothing ends or hangs the daemon, and every answer is one that the
/// protocol has. SQLite keeps no checksums of its pages, so that a few damages (a page that was
/// written over by one of its own kind) show no sign; they are counted, and stay few.
TEST_F(HealTest, RandomDamageIsSurvived) {
    const char* wanted = std::getenv("DAMAGES");
    std::mt19937 random(17);
    for (int i = 0; i < 300; ++i) {
        const std::string number = std::to_string(i);
        std::string text = "every";
        for (int word = 0; word < 40; ++word) {
            text += " w" + std::to_string(random() % 5000);
        }
        ASSERT_EQ(client.Upsert("/v/" + std::to_string(i % 20) + "/" + number,
                                R"({"name": "n)" + number + R"(", "size": )" + number +
                                    R"(, "KESTOMDTextContent": ")" + text + "\"}"),
                  0);
    }
    ASSERT_EQ(client.Commit(), 0);
    service.reset();
    fs::copy(kDatabase, kState + "/whole", fs::copy_options::recursive);
    int right = 0;
    int healed = 0;
    int wrong = 0;
    for (int damage = wanted != nullptr ? std::atoi(wanted) : 25; damage > 0; --damage) {
        fs::remove_all(kDatabase);
        fs::copy(kState + "/whole", kDatabase, fs::copy_options::recursive);
        DamageAnywhere(random, kFile);
        Start();
        bool as_expected = true;
        const auto expect = [&](const char* qsl, unsigned int total) {
            const Json::Value reply = client.Query(std::string(R"({"qsl": )") + qsl + "}");
            ASSERT_TRUE(reply["success"].isBool());
            as_expected &= reply["total"].asUInt() == total && reply["data"].size() == total;
        };
        expect(R"({"match": {"KESTOMDTextContent": "every"}})", 300);
        expect(R"({"range": {"size": {"gte": 100}}})", 200);
        expect(R"({"below": "/v/7"})", 15);
        for (int i = 0; i < 30; ++i) {
            client.Upsert("/new/" + std::to_string(i), R"({"title": "every"})");
            client.Delete("/v/" + std::to_string(i % 20) + "/" + std::to_string(i));
        }
        client.Commit();
        const bool fresh = StateOf(client.index)["fresh"].asBool();
        if (!fresh) {
            expect(R"({"match": {"_all": "every"}})", 300);
        }
        healed += fresh ? 1 : 0;
        right += !fresh && as_expected ? 1 : 0;
        wrong += !fresh && !as_expected ? 1 : 0;
        EXPECT_EQ(fresh ? Accept() : 0, 0);
        service.reset();
    }
    std::printf("answered right %d, made anew %d, wrong without a sign %d\n", right, healed, wrong);
    EXPECT_LE(wrong * 20, right + healed);
}

}  // namespace
}  // namespace elasticd
