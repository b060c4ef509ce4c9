#include "programs/fileindexctl/shares.h"

#include <algorithm>
#include <array>
#include <climits>
#include <memory>
#include <set>
#include <stdexcept>

#include <kesto/fileidx.h>
#include <kesto/share.h>

#include "common/error.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "sdk/share.h"

namespace quivra::ctl {

namespace {

/// What the platform's call puts into a list. Throws Error 502 when it fails.
std::vector<std::string> Listed(int (*call)(KLIBCSzList**), const char* name) {
    KLIBCSzList* list = KLIBCSzListAlloc(1024);
    const int result = list == nullptr ? -1 : call(&list);
    const std::unique_ptr<KLIBCSzList, decltype(&KLIBCSzListFree)> owner(list, KLIBCSzListFree);
    if (result < 0) {
        throw Error(Error::kSystemCallFailed, std::string(name) + " failed");
    }
    std::vector<std::string> texts;
    for (int i = 0; const char* text = KLIBCSzListGet(list, i); ++i) {
        texts.emplace_back(text);
    }
    return texts;
}

}  // namespace

std::vector<std::string> AllShares() {
    std::vector<std::string> names = Listed(KESTOShareEnum, "KESTOShareEnum");
    std::sort(names.begin(), names.end());
    return names;
}

std::vector<std::string> ProblemsOfShares() {
    return Listed(KESTOShareEnumProblems, "KESTOShareEnumProblems");
}

std::string RootOf(const std::string& share) {
    KESTOShare* found = nullptr;
    KESTOShareGet(share.c_str(), &found);
    const std::unique_ptr<KESTOShare, decltype(&KESTOShareFree)> owner(found, KESTOShareFree);
    return found == nullptr ? std::string() : found->szPath;
}

std::string ProblemOfPlace(const std::string& share) {
    const std::string root = RootOf(share);
    std::array<char, 2 * PATH_MAX> problem{};
    const bool is_told = !root.empty() && FILEIDXProblem(root.c_str(), problem.data(),
                                                         static_cast<int>(problem.size())) == 1;
    return is_told ? problem.data() : "";
}

void RequirePlaceOfIndex(const std::string& share) {
    const std::string problem = ProblemOfPlace(share);
    if (!problem.empty()) {
        throw std::runtime_error(problem);
    }
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
