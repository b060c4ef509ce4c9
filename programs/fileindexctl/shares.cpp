#include "programs/fileindexctl/shares.h"

#include <fstream>
#include <set>

#include "common/error.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

constexpr const char* kSharesCfgPath = "/etc/kesto/shares.conf";

/// The names of the sections. The platform has no call that lists its shares; whether it takes a
/// section for one is asked of it.
void CollectSections(std::set<std::string>& names) {
    std::ifstream file(kSharesCfgPath);
    for (std::string line; std::getline(file, line);) {
        const std::size_t begin = line.find_first_not_of(" \t");
        const std::size_t end = line.find(']');
        if (begin != std::string::npos && line[begin] == '[' && end != std::string::npos) {
            names.insert(line.substr(begin + 1, end - begin - 1));
        }
    }
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
    CollectSections(names);
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
