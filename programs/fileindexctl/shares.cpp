#include "programs/fileindexctl/shares.h"

#include <ini.h>

#include <set>

#include "common/error.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

constexpr const char* kSharesCfgPath = "/etc/kesto/shares.conf";

int CollectSection(void* sections, const char* section, const char* /*name*/,
                   const char* /*value*/) {
    static_cast<std::set<std::string>*>(sections)->insert(section);
    return 1;
}

bool IsShare(const std::string& name) {
    try {
        const sdk::SDKShare share(name);
        return true;
    } catch (const Error&) {
        return false;
    }
}

}  // namespace

std::vector<std::string> AllShares() {
    std::set<std::string> names = fileindex::FolderMgr().GetIndexedShares();
    ini_parse(kSharesCfgPath, CollectSection, &names);
    std::erase_if(names, [](const std::string& name) { return !IsShare(name); });
    return {names.begin(), names.end()};
}

std::vector<std::string> SearchableShares() {
    if (IsFileExist(fileindex::kFileIndexFoldersCfgPath)) {
        const std::set<std::string> names = fileindex::FolderMgr().GetIndexedShares();
        return {names.begin(), names.end()};
    }
    std::vector<std::string> names = AllShares();
    std::erase_if(names, [](const std::string& name) {
        return !IsDirExist(sdk::SDKShare(name).GetDBPath(), false);
    });
    return names;
}

}  // namespace quivra::ctl
