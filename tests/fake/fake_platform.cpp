#include "tests/fake/fake_platform.h"

#include <kesto/content_extract.h>
#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <kesto/filesystem.h>
#include <kesto/monitor_queue.h>
#include <kesto/process.h>
#include <kesto/service.h>
#include <kesto/string_list.h>
#include <kesto/user.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <filesystem>
#include <iterator>

#include "base/path.h"
#include "common/json.h"

namespace fake {
namespace {

thread_local int last_code = 0;

int SetCode(int code) {
    last_code = code;
    return -1;
}

std::string Text(const std::string& text) {
    return text;
}
std::string Text(const KESTOShare* share) {
    return share->szName;
}
template <typename Number>
requires std::is_arithmetic_v<Number> std::string Text(Number number) {
    return std::to_string(number);
}

/// Records a call. True when it is to fail; its code is set then.
template <typename... Arguments>
bool Begin(const std::string& name, const Arguments&... arguments) {
    std::string text;
    ((text += (text.empty() ? "" : ", ") + Text(arguments)), ...);
    const std::string call = name + "(" + text + ")";
    Platform()->calls.push_back(call);
    const auto action = Platform()->on_call;
    if (action) {
        action(call);
    }
    const auto failure = Platform()->failures.extract(name);
    if (!failure.empty()) {
        SetCode(failure.mapped());
    }
    return !failure.empty();
}

bool IsInShareDirectory(const std::string& path, const std::string& name) {
    Platform machine;
    return std::any_of(machine->shares.begin(), machine->shares.end(), [&](const auto& entry) {
        return quivra::base::IsAtOrBelow(path, entry.second.szPath + ("/" + name));
    });
}

int Compose(const char* call, const std::string& share_path, const char* name, char* out,
            int size) {
    if (Begin(call, share_path)) {
        return -1;
    }
    const std::string directory = share_path + "/@eaDir/fileindex";
    std::error_code error;
    if (std::filesystem::is_directory(share_path) &&
        (std::filesystem::create_directories(directory, error), error)) {
        return -1;  // something stands in the way
    }
    std::snprintf(out, static_cast<std::size_t>(size), "%s/%s", directory.c_str(), name);
    return 0;
}

template <typename Value>
int Get(const char* call, const KESTOShare* share, Value KESTOShare::*flag, int* out) {
    const bool fails = Begin(call, share);
    *out = fails ? *out : share->*flag;
    return fails ? -1 : 0;
}

/// The effective id: the fake one where one is set, else the real one.
unsigned int EffectiveId(unsigned int std::pair<unsigned int, unsigned int>::*member,
                         long system_call) {
    Platform machine;
    return machine->effective_ids ? (*machine->effective_ids).*member
                                  : static_cast<unsigned int>(syscall(system_call));
}

}  // namespace

Machine* Platform::operator->() {
    static Machine* machine = new Machine;  // outlives every thread that is left at exit
    return machine;
}

std::recursive_mutex& Platform::Mutex() {
    static auto* mutex = new std::recursive_mutex;
    return *mutex;
}

void ResetPlatform() {
    Machine old;  // destroyed after the lock is free: it may own what calls back
    Platform machine;
    std::swap(*machine.operator->(), old);
}

void FailNext(const std::string& call, int code) {
    Platform()->failures[call] = code;
}

std::vector<std::string> CallsOf(const std::string& prefix) {
    Platform machine;
    std::vector<std::string> found;
    std::copy_if(machine->calls.begin(), machine->calls.end(), std::back_inserter(found),
                 [&](const std::string& call) { return call.starts_with(prefix); });
    return found;
}

void AddShare(const std::string& name, const std::string& path) {
    KESTOShare share{};
    std::snprintf(share.szName, sizeof(share.szName), "%s", name.c_str());
    std::snprintf(share.szPath, sizeof(share.szPath), "%s", path.c_str());
    Platform()->shares[name] = share;
}

}  // namespace fake

using fake::Begin;
using fake::Platform;
using fake::SetCode;

extern "C" {

uid_t geteuid() noexcept {
    return fake::EffectiveId(&std::pair<unsigned int, unsigned int>::first, SYS_geteuid);
}

gid_t getegid() noexcept {
    return fake::EffectiveId(&std::pair<unsigned int, unsigned int>::second, SYS_getegid);
}

int KLIBCErrGet() {
    return fake::last_code;
}

int KESTOShareGet(const char* name, KESTOShare** share) {
    *share = nullptr;
    if (Begin("KESTOShareGet", std::string(name))) {
        return -1;
    }
    Platform machine;
    const auto it = machine->shares.find(name);
    if (it == machine->shares.end()) {
        return SetCode(KESTO_ERR_NO_SUCH_SHARE);
    }
    *share = new KESTOShare(it->second);
    return 0;
}

int KESTOShareEnum(KLIBCSzList** list) {
    if (Begin("KESTOShareEnum")) {
        return -1;
    }
    Platform machine;
    for (const auto& [name, share] : machine->shares) {
        KLIBCSzListPush(list, name.c_str());
    }
    return 0;
}

int KESTOShareNamePathGet(const char* full_path, char* name, int name_size, char* path,
                          int path_size) {
    if (Begin("KESTOShareNamePathGet", std::string(full_path))) {
        return -1;
    }
    Platform machine;
    for (const auto& [share_name, share] : machine->shares) {
        if (quivra::base::IsAtOrBelow(full_path, share.szPath)) {
            std::snprintf(name, static_cast<std::size_t>(name_size), "%s", share.szName);
            std::snprintf(path, static_cast<std::size_t>(path_size), "%s", share.szPath);
            return 0;
        }
    }
    return SetCode(KESTO_ERR_NO_SUCH_SHARE);
}

int KESTOShareIsShareRecycle(const char* path) {
    return fake::IsInShareDirectory(path, "#recycle");
}

int KLIBShareHideUnreadableGet(const KESTOShare* share, int* flag) {
    return fake::Get("KLIBShareHideUnreadableGet", share, &KESTOShare::hide_unreadable, flag);
}

int KLIBShareIsEncryptionGet(const KESTOShare* share, int* flag) {
    return fake::Get("KLIBShareIsEncryptionGet", share, &KESTOShare::encryption, flag);
}

int KLIBShareIsEncryptedGet(const KESTOShare* share, int* flag) {
    return fake::Get("KLIBShareIsEncryptedGet", share, &KESTOShare::encrypted, flag);
}

int KLIBShareIsReadOnlyGet(const KESTOShare* share, int* flag) {
    return fake::Get("KLIBShareIsReadOnlyGet", share, &KESTOShare::read_only, flag);
}

int KLIBShareRecycleStatusGet(const KESTOShare* share, int* flag) {
    return fake::Get("KLIBShareRecycleStatusGet", share, &KESTOShare::recycle, flag);
}

int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size) {
    return fake::Compose("FILEIDXQueuePathCompose", share_path, "queue", out, out_size);
}

int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size) {
    return fake::Compose("FILEIDXDBPathCompose", share_path, "db", out, out_size);
}

int KESTOQuotaIsEnough(int kind, const char* path, unsigned long long bytes) {
    if (Begin("KESTOQuotaIsEnough", kind, std::string(path), bytes)) {
        return 0;
    }
    Platform machine;
    fake::last_code = machine->space_code.value_or(0);
    return !machine->space_code.has_value();
}

int KESTOGetFSType(const char* path, int flags) {
    if (Begin("KESTOGetFSType", std::string(path), flags)) {
        return -1;
    }
    Platform machine;
    for (const auto& [top, type] : machine->fs_types) {
        if (quivra::base::IsAtOrBelow(path, top)) {
            return type;
        }
    }
    return 1;
}

int KESTOFSDirIsMntPoint(const char* path) {
    return Begin("KESTOFSDirIsMntPoint", std::string(path))
               ? -1
               : Platform()->mount_points.contains(path);
}

int KLIBFhsPathInSnapshot(const char* path, int* flag) {
    *flag = fake::IsInShareDirectory(path, "#snapshot");
    return Begin("KLIBFhsPathInSnapshot", std::string(path)) ? -1 : 0;
}

int KESTOUserGetByUID(unsigned int uid, KESTOUser** user) {
    *user = nullptr;
    if (Begin("KESTOUserGetByUID", uid)) {
        return -1;
    }
    Platform machine;
    for (const auto& [name, ids] : machine->users) {
        if (ids.first == uid) {
            *user = new KESTOUser{"", ids.first, ids.second};
            std::snprintf((*user)->szName, sizeof((*user)->szName), "%s", name.c_str());
            return 0;
        }
    }
    return SetCode(KESTO_ERR_NOT_FOUND);
}

bool ResetCredentialsByName(const char* user, bool switch_group) {
    if (Begin("ResetCredentialsByName", std::string(user), switch_group)) {
        return false;
    }
    Platform machine;
    const auto it = machine->users.find(user);
    if (it == machine->users.end()) {
        return SetCode(KESTO_ERR_NOT_FOUND) == 0;
    }
    machine->effective_ids = it->second;
    return true;
}

int KLIBGroupIsAdminGroupMem(const char* user, int flags) {
    return Begin("KLIBGroupIsAdminGroupMem", std::string(user), flags)
               ? -1
               : Platform()->administrators.contains(user);
}

int KESTOServiceUserHomeIsEnabled(int kind, int flags) {
    return Begin("KESTOServiceUserHomeIsEnabled", kind, flags)
               ? -1
               : Platform()->home_kinds.contains(kind);
}

int KESTORecycleHomeEnumRecyclePath(KLIBCSzList** list) {
    if (Begin("KESTORecycleHomeEnumRecyclePath")) {
        return -1;
    }
    Platform machine;
    for (const std::string& path : machine->home_recycle_paths) {
        KLIBCSzListPush(list, path.c_str());
    }
    return 0;
}

int KLIBServiceRestart(const char* name) {
    return Begin("KLIBServiceRestart", std::string(name)) ? -1 : 0;
}

int KLIBServiceStart(const char* name, int wait) {
    return Begin("KLIBServiceStart", std::string(name), wait) ? -1 : 0;
}

int KLIBServiceStop(const char* name, int wait) {
    return Begin("KLIBServiceStop", std::string(name), wait) ? -1 : 0;
}

int KLIBServicectlStart(const char* name, int mode) {
    return Begin("KLIBServicectlStart", std::string(name), mode) ? -1 : 0;
}

int KLIBServicectlStop(const char* name, int mode) {
    return Begin("KLIBServicectlStop", std::string(name), mode) ? -1 : 0;
}

int KESTOSMBIsEnableSpotlight() {
    return Begin("KESTOSMBIsEnableSpotlight") ? -1 : Platform()->spotlight;
}

int KESTOSMBSetSpotlight(int enable) {
    if (Begin("KESTOSMBSetSpotlight", enable)) {
        return -1;
    }
    Platform()->spotlight = enable != 0;
    return 0;
}

int KLIBCExecl(const char* program, int flags, ...) {
    std::string text = std::string(program) + ", " + std::to_string(flags);
    va_list arguments;
    va_start(arguments, flags);
    while (const char* argument = va_arg(arguments, const char*)) {
        text += std::string(", ") + argument;
    }
    va_end(arguments);
    return Begin("KLIBCExecl", text) ? -1 : 0;
}

int KLIBCExec(const char* program, const char* const* argv) {
    std::string text = program;
    for (; *argv != nullptr; ++argv) {
        text += std::string(", ") + *argv;
    }
    return Begin("KLIBCExec", text) ? -1 : 0;
}

}  // extern "C"

namespace KESTO {

namespace CONTENT_EXTRACT {

bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data) {
    if (Begin("ParseFile", full_path, quivra::toString(cfg))) {
        return false;
    }
    Platform machine;
    const auto it = machine->documents.find(full_path);
    file_data = it == machine->documents.end() ? Json::Value() : it->second;
    return it != machine->documents.end();
}

}  // namespace CONTENT_EXTRACT

namespace KESTOTIFYD {

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& app,
                          MonitorQueueType type) {
    const std::string path = queue.Description()["queue"].asString();
    if (Begin("MonitorQueue::Upsert", path, app, static_cast<int>(type))) {
        return false;
    }
    Platform()->monitor_queues[{path, app}] = queue.Description()["config"];
    return true;
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& app,
                          MonitorQueueType type) {
    if (Begin("MonitorQueue::Delete", queue_path, app, static_cast<int>(type))) {
        return false;
    }
    Platform()->monitor_queues.erase({queue_path, app});
    return true;
}

}  // namespace KESTOTIFYD
}  // namespace KESTO
