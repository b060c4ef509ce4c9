#include <kesto/content_extract.h>
#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <kesto/filesystem.h>
#include <kesto/monitor_queue.h>
#include <kesto/process.h>
#include <kesto/service.h>
#include <kesto/share.h>
#include <kesto/string_list.h>
#include <kesto/user.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <set>

#include "common/util.h"
#include "tests/fake/fake_platform_state.h"

struct KLIBCSzList {
    std::vector<std::string> texts;
};

namespace fake {
namespace {

bool IsAtOrBelow(const std::string& path, const std::string& top) {
    return path == top || quivra::StringStartWith(path, top + "/");
}

int CopyText(const std::string& text, char* out, int size) {
    if (size <= 0 || text.size() >= static_cast<std::size_t>(size)) {
        return SetCode(kErrorNotFound);
    }
    std::memcpy(out, text.c_str(), text.size() + 1);
    return 0;
}

int GetFlag(const char* call, const KESTOShare* share, ShareFlag flag, int* out) {
    if (Begin(call, share)) {
        return -1;
    }
    Locked state;
    const auto it = state->shares.find(share->szName);
    if (it == state->shares.end()) {
        return SetCode(kErrorNotFound);
    }
    *out = it->second.flags[flag];
    return 0;
}

int Compose(const char* call, const std::string& share_path, const char* name, char* out,
            int size) {
    if (Begin(call, share_path)) {
        return -1;
    }
    const std::string directory = share_path + "/@eaDir/fileindex";
    std::error_code ignored;
    if (std::filesystem::is_directory(share_path, ignored)) {
        std::filesystem::create_directories(directory, ignored);
    }
    return CopyText(directory + "/" + name, out, size);
}

int Service(const std::string& call, const std::string& name, const int* mode = nullptr) {
    return (mode == nullptr ? Begin(call, name) : Begin(call, name, *mode)) ? -1 : 0;
}

int RunProgram(const std::vector<std::string>& command) {
    const auto action = Locked()->on_exec;
    return action ? action(command) : 0;
}

Json::Value DefaultDocument(const std::string& path, bool need_meta) {
    Json::Value data;
    data["KESTOMDPath"] = path;
    data["KESTOMDParent"] = quivra::Dirname(path);
    data["KESTOMDFSName"] = data["KESTOMDDisplayName"] = quivra::Basename(path);
    data["KESTOMDExtension"] = data["KESTOMDKind"] = quivra::GetFileExtension(path, true);
    if (need_meta) {
        data["KESTOMDTextContent"] = "content of " + path;
    }
    return data;
}

/// The effective id: the fake one where one is set, else the real one.
unsigned int EffectiveId(unsigned int Ids::*member, long system_call) {
    Locked state;
    return state->effective_ids ? (*state->effective_ids).*member
                                : static_cast<unsigned int>(syscall(system_call));
}

}  // namespace
}  // namespace fake

using fake::Begin;
using fake::Locked;
using fake::SetCode;

extern "C" {

uid_t geteuid() noexcept {
    return fake::EffectiveId(&fake::Ids::first, SYS_geteuid);
}

gid_t getegid() noexcept {
    return fake::EffectiveId(&fake::Ids::second, SYS_getegid);
}

int KLIBCErrGet() {
    return fake::LastCode();
}

const char* KLIBCErrorGetFile() {
    return fake::kErrorFile;
}

int KLIBCErrorGetLine() {
    return fake::kErrorLine;
}

int KESTOShareGet(const char* name, KESTOShare** share) {
    *share = nullptr;
    if (Begin("KESTOShareGet", std::string(name))) {
        return -1;
    }
    Locked state;
    const auto it = state->shares.find(name);
    if (it == state->shares.end()) {
        return SetCode(fake::kErrorNotFound);
    }
    auto* record = new KESTOShare{};
    std::snprintf(record->szName, sizeof(record->szName), "%s", name);
    std::snprintf(record->szPath, sizeof(record->szPath), "%s", it->second.path.c_str());
    record->ftp_privilege = it->second.ftp_privilege;
    *share = record;
    return 0;
}

void KESTOShareFree(KESTOShare* share) {
    Begin("KESTOShareFree", std::string(share == nullptr ? "null" : share->szName));
    delete share;
}

int KESTOShareEnum(KLIBCSzList** list) {
    if (Begin("KESTOShareEnum")) {
        return -1;
    }
    Locked state;
    for (const auto& [name, share] : state->shares) {
        (*list)->texts.push_back(name);
    }
    return 0;
}

int KESTOShareNamePathGet(const char* full_path, char* name, int name_size, char* path,
                          int path_size) {
    if (Begin("KESTOShareNamePathGet", std::string(full_path))) {
        return -1;
    }
    Locked state;
    const std::pair<const std::string, fake::Share>* found = nullptr;
    for (const auto& entry : state->shares) {
        if (fake::IsAtOrBelow(full_path, entry.second.path) &&
            (found == nullptr || found->second.path.size() < entry.second.path.size())) {
            found = &entry;
        }
    }
    if (found == nullptr) {
        return SetCode(fake::kErrorNotFound);
    }
    const int copied = fake::CopyText(found->first, name, name_size);
    return copied < 0 ? copied : fake::CopyText(found->second.path, path, path_size);
}

int KESTOShareUserPrivGet(const char* user, const KESTOShare* share) {
    if (Begin("KESTOShareUserPrivGet", std::string(user), share)) {
        return -1;
    }
    Locked state;
    return state->shares[share->szName].privileges[user];
}

int KESTOShareIsShareRecycle(const char* path) {
    if (Begin("KESTOShareIsShareRecycle", std::string(path))) {
        return -1;
    }
    Locked state;
    const auto it = state->recycle_answers.find(path);
    if (it != state->recycle_answers.end()) {
        return it->second;
    }
    return std::any_of(state->shares.begin(), state->shares.end(), [&](const auto& entry) {
        return fake::IsAtOrBelow(path, entry.second.path + "/#recycle");
    });
}

int KLIBShareHideUnreadableGet(const KESTOShare* share, int* flag) {
    return fake::GetFlag("KLIBShareHideUnreadableGet", share, fake::ShareFlag::kHideUnreadable,
                         flag);
}

int KLIBShareIsEncryptionGet(const KESTOShare* share, int* flag) {
    return fake::GetFlag("KLIBShareIsEncryptionGet", share, fake::ShareFlag::kEncryption, flag);
}

int KLIBShareIsEncryptedGet(const KESTOShare* share, int* flag) {
    return fake::GetFlag("KLIBShareIsEncryptedGet", share, fake::ShareFlag::kEncrypted, flag);
}

int KLIBShareIsReadOnlyGet(const KESTOShare* share, int* flag) {
    return fake::GetFlag("KLIBShareIsReadOnlyGet", share, fake::ShareFlag::kReadOnly, flag);
}

int KLIBShareRecycleStatusGet(const KESTOShare* share, int* flag) {
    return fake::GetFlag("KLIBShareRecycleStatusGet", share, fake::ShareFlag::kRecycle, flag);
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
    Locked state;
    if (!state->space_enough) {
        SetCode(state->space_code);
    }
    return state->space_enough;
}

int KESTOGetFSType(const char* path, int flags) {
    if (Begin("KESTOGetFSType", std::string(path), flags)) {
        return -1;
    }
    Locked state;
    std::size_t longest = 0;
    int type = fake::kFSLocal;
    for (const auto& [top, its_type] : state->fs_types) {
        if (top.size() >= longest && fake::IsAtOrBelow(path, top)) {
            longest = top.size();
            type = its_type;
        }
    }
    return type;
}

int KESTOFSIsRemoteFS(int type) {
    return !Begin("KESTOFSIsRemoteFS", type) && type == fake::kFSRemote;
}

int KESTOFSIsImageFS(int type) {
    return !Begin("KESTOFSIsImageFS", type) && type == fake::kFSImage;
}

int KESTOFSDirIsMntPoint(const char* path) {
    if (Begin("KESTOFSDirIsMntPoint", std::string(path))) {
        return -1;
    }
    return Locked()->mount_points.count(path) > 0;
}

int KLIBFhsPathInSnapshot(const char* path, int* flag) {
    if (Begin("KLIBFhsPathInSnapshot", std::string(path))) {
        return -1;
    }
    Locked state;
    *flag = std::any_of(state->snapshot_paths.begin(), state->snapshot_paths.end(),
                        [&](const std::string& top) { return fake::IsAtOrBelow(path, top); });
    return 0;
}

int KESTOEAIsHiddenDir(const char* name) {
    if (Begin("KESTOEAIsHiddenDir", std::string(name))) {
        return -1;
    }
    static const std::set<std::string> hidden{"@eaDir", "#recycle", "#snapshot", "@tmp"};
    return hidden.count(name) > 0;
}

int KESTOACLPermGet(const char* path) {
    if (Begin("KESTOACLPermGet", std::string(path))) {
        return -1;
    }
    Locked state;
    const auto it = state->acls.find(path);
    return it == state->acls.end()
               ? KESTO_ACL_PERM_READ | KESTO_ACL_PERM_WRITE | KESTO_ACL_PERM_EXEC
               : it->second;
}

int KESTOUserGetByUID(unsigned int uid, KESTOUser** user) {
    *user = nullptr;
    if (Begin("KESTOUserGetByUID", static_cast<unsigned long long>(uid))) {
        return -1;
    }
    Locked state;
    for (const auto& [name, ids] : state->users) {
        if (ids.first == uid) {
            *user = new KESTOUser{"", ids.first, ids.second};
            std::snprintf((*user)->szName, sizeof((*user)->szName), "%s", name.c_str());
            return 0;
        }
    }
    return SetCode(fake::kErrorNotFound);
}

void KESTOUserFree(KESTOUser* user) {
    Begin("KESTOUserFree", std::string(user == nullptr ? "null" : user->szName));
    delete user;
}

bool ResetCredentialsByName(const char* user, bool switch_group) {
    if (Begin("ResetCredentialsByName", std::string(user), switch_group ? 1 : 0)) {
        return false;
    }
    Locked state;
    const auto it = state->users.find(user);
    if (it == state->users.end()) {
        SetCode(fake::kErrorNotFound);
        return false;
    }
    state->effective_ids = it->second;
    return true;
}

int KLIBGroupIsAdminGroupMem(const char* user, int flags) {
    if (Begin("KLIBGroupIsAdminGroupMem", std::string(user), flags)) {
        return -1;
    }
    return Locked()->administrators.count(user) > 0;
}

int KESTOServiceUserHomeIsEnabled(int kind, int flags) {
    if (Begin("KESTOServiceUserHomeIsEnabled", kind, flags)) {
        return -1;
    }
    return Locked()->home_kinds.count(kind) > 0;
}

int KESTORecycleHomeEnumRecyclePath(KLIBCSzList** list) {
    if (Begin("KESTORecycleHomeEnumRecyclePath")) {
        return -1;
    }
    Locked state;
    (*list)->texts.insert((*list)->texts.end(), state->home_recycle_paths.begin(),
                          state->home_recycle_paths.end());
    return 0;
}

KLIBCSzList* KLIBCSzListAlloc(int /*size*/) {
    return fake::MustFail("KLIBCSzListAlloc") ? nullptr : new KLIBCSzList;
}

void KLIBCSzListFree(KLIBCSzList* list) {
    delete list;
}

int KLIBCSzListPush(KLIBCSzList** list, const char* text) {
    (*list)->texts.emplace_back(text);
    return 0;
}

const char* KLIBCSzListGet(const KLIBCSzList* list, int position) {
    const auto index = static_cast<std::size_t>(position);  // a negative one is beyond every end
    return index < list->texts.size() ? list->texts[index].c_str() : nullptr;
}

int KLIBCSzListFind(const KLIBCSzList* list, const char* text) {
    const auto it = std::find(list->texts.begin(), list->texts.end(), text);
    return it == list->texts.end() ? SetCode(fake::kErrorNotFound)
                                   : static_cast<int>(it - list->texts.begin());
}

int KLIBServiceRestart(const char* name) {
    return fake::Service("KLIBServiceRestart", name);
}

int KLIBServiceStart(const char* name, int wait) {
    return fake::Service("KLIBServiceStart", name, &wait);
}

int KLIBServiceStop(const char* name, int wait) {
    return fake::Service("KLIBServiceStop", name, &wait);
}

int KLIBServicectlStart(const char* name, int mode) {
    return fake::Service("KLIBServicectlStart", name, &mode);
}

int KLIBServicectlStop(const char* name, int mode) {
    return fake::Service("KLIBServicectlStop", name, &mode);
}

int KESTOSMBIsEnableSpotlight() {
    return Begin("KESTOSMBIsEnableSpotlight") ? -1 : fake::IsSpotlightEnabled();
}

int KESTOSMBSetSpotlight(int enable) {
    if (Begin("KESTOSMBSetSpotlight", enable)) {
        return -1;
    }
    fake::SetSpotlight(enable != 0);
    return 0;
}

int KLIBCExecl(const char* program, int flags, ...) {
    std::vector<std::string> command{program};
    std::string text = std::string(program) + ", " + std::to_string(flags);
    va_list arguments;
    va_start(arguments, flags);
    while (const char* argument = va_arg(arguments, const char*)) {
        command.emplace_back(argument);
        text += ", " + command.back();
    }
    va_end(arguments);
    return Begin("KLIBCExecl", text) ? -1 : fake::RunProgram(command);
}

int KLIBCExec(const char* program, const char* const* argv) {
    std::vector<std::string> command{program};
    std::string text = program;
    for (; *argv != nullptr; ++argv) {
        command.emplace_back(*argv);
        text += ", " + command.back();
    }
    return Begin("KLIBCExec", text) ? -1 : fake::RunProgram(command);
}

}  // extern "C"

namespace KESTO {

namespace CONTENT_EXTRACT {

bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data) {
    const bool need_meta = cfg["need_meta"].asBool();
    if (Begin("ParseFile", full_path, std::string(need_meta ? "true" : "false"))) {
        return false;
    }
    Locked state;
    const auto it = state->documents.find(full_path);
    file_data =
        it == state->documents.end() ? fake::DefaultDocument(full_path, need_meta) : it->second;
    return true;
}

}  // namespace CONTENT_EXTRACT

namespace KESTOTIFYD {

MonitorQueue::MonitorQueue(const Json::Value& description) : description_(description) {}

const Json::Value& MonitorQueue::Description() const {
    return description_;
}

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& app,
                          MonitorQueueType type) {
    const std::string path = queue.Description()["queue"].asString();
    if (Begin("MonitorQueue::Upsert", path, app, type)) {
        return false;
    }
    Locked()->monitor_queues[{path, app}] = queue.Description()["config"];
    return true;
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& app,
                          MonitorQueueType type) {
    if (Begin("MonitorQueue::Delete", queue_path, app, type)) {
        return false;
    }
    Locked()->monitor_queues.erase({queue_path, app});
    return true;
}

}  // namespace KESTOTIFYD
}  // namespace KESTO
