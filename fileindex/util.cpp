#include "fileindex/util.h"

#include <algorithm>
#include <array>
#include <iterator>

#include <kesto/filesystem.h>
#include <kesto/share.h>
#include <kesto/string_list.h>
#include <kesto/user.h>

#include "common/error.h"
#include "common/log.h"
#include "common/mutex.h"
#include "common/util.h"
#include "sdk/credentials.h"
#include "sdk/share.h"

namespace quivra::fileindex {
namespace {

constexpr LogUnit kLog{"util", 0};

constexpr const char* kHomesShare = "homes";
constexpr int kHomeKinds[] = {KESTO_USER_HOME_DOMAIN, KESTO_USER_HOME_DIRECTORY,
                              KESTO_USER_HOME_LOCAL};
constexpr int kRecycleListSize = 1024;

constexpr const char* kSystemPreservedNames[] = {".TemporaryItems", ".KESTOPPSDB", ".DS_Store"};

bool Contains(const std::string& text, const char* part) {
    return text.find(part) != std::string::npos;
}

struct SzList {
    KLIBCSzList* list = KLIBCSzListAlloc(kRecycleListSize);

    SzList() = default;
    ~SzList() { KLIBCSzListFree(list); }
    SzList(const SzList&) = delete;
    SzList& operator=(const SzList&) = delete;
};

bool IsHomeRecyclePath(const std::string& share_name, const std::string& full_path) {
    SzList recycle;  // the platform grows the list, so its place may change
    if (recycle.list == nullptr || share_name != kHomesShare) {
        return false;
    }
    const LockMutex lock(sdk::SDKMutex());
    const bool enabled = std::any_of(std::begin(kHomeKinds), std::end(kHomeKinds), [](int kind) {
        return KESTOServiceUserHomeIsEnabled(kind, 0) == 1;
    });
    return enabled && KESTORecycleHomeEnumRecyclePath(&recycle.list) == 0 &&
           KLIBCSzListFind(recycle.list, full_path.c_str()) >= 0;
}

/// Asked only for paths that have the name in them: the platform looks the share up once more.
bool IsShareRecyclePath(const std::string& full_path) {
    const LockMutex lock(sdk::SDKMutex());
    return KESTOShareIsShareRecycle(full_path.c_str()) == 1;
}

}  // namespace

void GetShareNameByPath(std::string& share_name, const std::string& share_path) {
    if (share_path.empty() || share_path.front() != '/') {
        Fail(kLog.Here(), "1 > share_path.size() || '/' != share_path.at(0)",
             Error(Error::kBadArgument, share_path));
    }
    share_name = share_path.substr(1, share_path.find('/', 1) - 1);
}

void GetFullPath(std::string& full_path, const std::string& share_path) {
    std::string share_name;
    GetShareNameByPath(share_name, share_path);
    const sdk::SDKShare share(share_name);
    // Beside the share's root, not below it: the share path begins with the share's own name.
    full_path = Dirname(share.GetPath()) + share_path;
}

void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                                const std::string& full_path) {
    std::array<char, sizeof(KESTOShare::szName)> name{};
    std::array<char, sizeof(KESTOShare::szPath)> path{};
    int result = 0;
    {
        const LockMutex lock(sdk::SDKMutex());
        result = KESTOShareNamePathGet(full_path.c_str(), name.data(), name.size(), path.data(),
                                       path.size());
    }
    if (result < 0) {
        Fail(kLog.Here(),
             "0 > KESTOShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName), "
             "szSharePath, sizeof(szSharePath))",
             Error(Error::kSystemCallFailed,
                   "KESTOShareNamePathGet failed, full_path=" + full_path));
    }
    share_name = name.data();
    share_path = path.data();
}

bool IsFullPathInRecycleBin(const std::string& full_path) {
    std::string share_name;
    std::string share_path;
    GetShareNamePathByFullPath(share_name, share_path, full_path);
    const sdk::SDKShare share(share_name);
    if (Contains(full_path, "#recycle") && IsShareRecyclePath(full_path) &&
        share.IsEnableRecycleBin()) {
        return true;
    }
    return IsHomeRecyclePath(share_name, full_path);
}

bool CanPathBeIndexed(const std::string& share_path) {
    std::string full_path;
    GetFullPath(full_path, share_path);
    return CanFullPathBeIndexed(full_path);
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share) {
    // With a "/" at both ends, so that photo is not found in photos.
    const std::size_t pos = (path + "/").find("/" + old_share + "/");
    if (pos == std::string::npos) {
        Fail(kLog.Here(), "string::npos == pos",
             Error(Error::kBadArgument, "Cannot find share: " + old_share));
    }
    return path.substr(0, pos + 1) + new_share + path.substr(pos + 1 + old_share.size());
}

bool IsSystemPreservedFileName(const std::string& name) {
    return KESTOEAIsHiddenDir(name.c_str()) == 1 ||
           std::find(std::begin(kSystemPreservedNames), std::end(kSystemPreservedNames), name) !=
               std::end(kSystemPreservedNames);
}

FileType GetFileTypeByFullPath(const std::string& full_path) {
    const auto& types = GetFileTypes();
    const auto it = types.find(GetFileExtension(full_path, true));
    return it == types.end() ? FileType::kOther : it->second;
}

}  // namespace quivra::fileindex
