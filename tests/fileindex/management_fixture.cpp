#include "tests/fileindex/management_fixture.h"

#include <fstream>

#include "common/lock_file.h"

namespace quivra::fileindex {
namespace {

constexpr const char* kSearchFailure = R"({"success":false,"error":{"code":77,"msg":"failed"}})";
constexpr const char* kSuccess = R"({"success":true})";

bool HasEffect(const std::string& call) {
    return call.starts_with("MonitorQueue::") || call.starts_with("KLIBService") ||
           call.starts_with("KESTOSMBSet") || call.starts_with("KLIBCExec");
}

}  // namespace

ManagementTest::ManagementTest() {
    search_.SetHandler([this](const Json::Value& request) {
        const bool fails = Count("search " + request["command"].asString() + " " +
                                 request["data"]["id"].asString());
        return fake::Frame(fails ? kSearchFailure : kSuccess);
    });
    daemon_.SetHandler([this](const Json::Value& request) {
        const bool fails = Count("daemon " + request["type"].asString() + " " +
                                 request["data"]["share_name"].asString());
        return fails ? std::string(4, '\xff') : fake::Frame(kSuccess);
    });
    Reset();
}

ManagementTest::~ManagementTest() {
    fake::Platform()->on_call = nullptr;
}

void ManagementTest::Reset() {
    fake::ResetLibc();
    fake::ResetPlatform();
    std::filesystem::remove_all("/volume1");
    std::filesystem::remove_all("/volume10");
    std::filesystem::remove(kFileIndexFoldersCfgPath);
    std::filesystem::remove(kFileIndexStatusCfgPath);
    fake::Platform()->on_call = [this](const std::string& call) { OnPlatformCall(call); };
    StartSteps();
}

void ManagementTest::OnPlatformCall(const std::string& call) {
    std::string step;
    if (HasEffect(call)) {
        step = call;
    } else if (call.starts_with("ResetCredentialsByName(root")) {
        step = "save";
    }
    if (Count(step)) {
        fake::FailNext(call.substr(0, call.find('(')));
    }
}

bool ManagementTest::Count(const std::string& step) {
    const std::lock_guard lock(mutex_);
    if (!step.empty()) {
        steps_.push_back(step);
    }
    return ++calls_ == failing_call_;
}

std::vector<std::string> ManagementTest::Steps() const {
    const std::lock_guard lock(mutex_);
    return steps_;
}

void ManagementTest::StartSteps(int failing_call) {
    const std::lock_guard lock(mutex_);
    steps_.clear();
    calls_ = 0;
    failing_call_ = failing_call;
    descriptors_ = OpenDescriptors();
}

int ManagementTest::OutsideCalls() const {
    const std::lock_guard lock(mutex_);
    return calls_;
}

void ManagementTest::ExpectNothingHeld() {
    EXPECT_TRUE(NoneLeaked(descriptors_));
    EXPECT_EQ(ErrorOf([] { LockFile(kFileIndexFoldersLockPath, true); }).code, 0);
}

Json::Value ManagementTest::List(const std::vector<std::string>& paths) {
    Json::Value list(Json::arrayValue);
    for (const std::string& path : paths) {
        Json::Value folder = Parse(R"({"name":"n","document":true,"audio":true,"video":true,
                                       "photo":true,"paused":false,"volume_to_be_clean":""})");
        folder["path"] = path;
        list.append(folder);
    }
    return list;
}

std::vector<Json::Value> ManagementTest::Queue(const std::string& root) {
    std::ifstream file(QueuePath(root));
    std::vector<Json::Value> lines;
    for (std::string line; std::getline(file, line);) {
        fromString(lines.emplace_back(), line);
    }
    return lines;
}

}  // namespace quivra::fileindex
