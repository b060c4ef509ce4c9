#include "programs/fileindexctl/shares.h"

#include <algorithm>
#include <memory>
#include <set>

#include <kesto/share.h>

#include "common/error.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "sdk/share.h"

namespace quivra::ctl {

std::vector<std::string> AllShares() {
    KLIBCSzList* list = KLIBCSzListAlloc(1024);
    const int result = list == nullptr ? -1 : KESTOShareEnum(&list);
    const std::unique_ptr<KLIBCSzList, decltype(&KLIBCSzListFree)> owner(list, KLIBCSzListFree);
    if (result < 0) {
        throw Error(Error::kSystemCallFailed, "KESTOShareEnum failed");
    }
    std::vector<std::string> names;
    for (int i = 0; const char* name = KLIBCSzListGet(list, i); ++i) {
        names.emplace_back(name);
    }
    std::sort(names.begin(), names.end());
    return names;
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
