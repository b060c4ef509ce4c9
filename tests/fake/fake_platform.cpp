#include "tests/fake/fake_platform.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "common/util.h"
#include "tests/fake/fake_platform_state.h"

namespace fake {
namespace {

State& GetState() {
    static State* state = new State;  // outlives every thread that is left at exit
    return *state;
}

thread_local int last_code = 0;

}  // namespace

State* Locked::operator->() {
    return &GetState();
}

State& Locked::operator*() {
    return GetState();
}

std::mutex& Locked::Mutex() {
    static std::mutex* mutex = new std::mutex;
    return *mutex;
}

int LastCode() {
    return last_code;
}

int SetCode(int code) {
    last_code = code;
    return -1;
}

bool MustFail(const std::string& name) {
    Locked state;
    const auto it = state->failures.find(name);
    if (it == state->failures.end()) {
        return false;
    }
    last_code = it->second.code;
    if (it->second.times > 0 && --it->second.times == 0) {
        state->failures.erase(it);
    }
    return true;
}

bool Record(const std::string& name, const std::string& arguments) {
    const std::string call = name + "(" + arguments + ")";
    std::function<void(const std::string&)> action;
    {
        Locked state;
        state->calls.push_back(call);
        action = state->on_call;
    }
    if (action) {
        action(call);
    }
    return MustFail(name);
}

void ResetPlatform() {
    State old;  // destroyed after the lock is free: it may own what calls back
    Locked state;
    std::swap(*state, old);
    last_code = 0;
}

void FailNext(const std::string& call, int times, int code) {
    Locked()->failures[call] = {times, code};
}

void OnCall(std::function<void(const std::string& call)> action) {
    Locked()->on_call = std::move(action);
}

std::vector<std::string> Calls() {
    return Locked()->calls;
}

std::vector<std::string> CallsOf(const std::string& prefix) {
    const std::vector<std::string> calls = Calls();
    std::vector<std::string> found;
    std::copy_if(calls.begin(), calls.end(), std::back_inserter(found),
                 [&](const std::string& call) { return quivra::StringStartWith(call, prefix); });
    return found;
}

void ClearCalls() {
    Locked()->calls.clear();
}

void AddShare(const std::string& name, const std::string& path) {
    Locked()->shares[name] = Share{path, 0, {}, {}};
}

void RemoveShare(const std::string& name) {
    Locked()->shares.erase(name);
}

void SetFlag(const std::string& share, ShareFlag flag, int value) {
    Locked()->shares.at(share).flags[flag] = value;
}

void SetFTPPrivilege(const std::string& share, unsigned int value) {
    Locked()->shares.at(share).ftp_privilege = value;
}

void SetUserPrivilege(const std::string& share, const std::string& user, int privilege) {
    Locked()->shares.at(share).privileges[user] = privilege;
}

void AddUser(const std::string& name, unsigned int uid, unsigned int gid) {
    Locked()->users[name] = {uid, gid};
}

void AddAdministrator(const std::string& name) {
    Locked()->administrators.insert(name);
}

void SetEffectiveIds(unsigned int uid, unsigned int gid) {
    Locked()->effective_ids = {uid, gid};
}

void EnableHomes(int kind, bool enabled) {
    Locked state;
    if (enabled) {
        state->home_kinds.insert(kind);
    } else {
        state->home_kinds.erase(kind);
    }
}

void AddHomeRecyclePath(const std::string& path) {
    Locked()->home_recycle_paths.push_back(path);
}

void SetFSType(const std::string& path, int type) {
    Locked()->fs_types[path] = type;
}

void SetMountPoint(const std::string& path, bool mounted) {
    Locked state;
    if (mounted) {
        state->mount_points.insert(path);
    } else {
        state->mount_points.erase(path);
    }
}

void SetInSnapshot(const std::string& path) {
    Locked()->snapshot_paths.insert(path);
}

void SetACL(const std::string& path, int mask) {
    Locked()->acls[path] = mask;
}

void SetSpace(bool enough, int code) {
    Locked state;
    state->space_enough = enough;
    state->space_code = code;
}

void SetRecycle(const std::string& path, int answer) {
    Locked()->recycle_answers[path] = answer;
}

void SetSpotlight(bool enabled) {
    Locked()->spotlight = enabled;
}

bool IsSpotlightEnabled() {
    return Locked()->spotlight;
}

void OnExec(std::function<int(const std::vector<std::string>& command)> action) {
    Locked()->on_exec = std::move(action);
}

void SetDocument(const std::string& path, const Json::Value& data) {
    Locked()->documents[path] = data;
}

std::map<std::pair<std::string, std::string>, Json::Value> MonitorQueues() {
    return Locked()->monitor_queues;
}

}  // namespace fake
