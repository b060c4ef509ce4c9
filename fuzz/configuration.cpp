#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"

namespace {

using namespace quivra::fileindex;

void Store(const char* path, const std::string& text) {
    std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

/// What was read is written so that the same comes back.
void CheckRoundTrip(const std::string& text) {
    Json::Value value;
    Json::Value again;
    if (quivra::fromString(value, text) &&
        (!quivra::fromString(again, quivra::toString(value)) || again != value)) {
        std::abort();
    }
}

void UseFolders() {
    FolderMgr folder_mgr;
    std::vector<FolderMgr::FolderPtr> page;
    unsigned int total = 0;
    folder_mgr.List(page, total, 0, 10, "path", "desc");
    for (const auto& folder : page) {
        if (Folder(folder->GetData()).GetData() != folder->GetData()) {
            std::abort();
        }
    }
    folder_mgr.GetIndexedShares();
    folder_mgr.IsFullPathNeedMeta("/volume1/photo/a.txt");
}

void UseStatus() {
    const StatusMgr status;
    status.GetPauseInfo();
    status.GetShareStatus("photo");
}

void OnlyErrorsLeave(void (*use)()) {
    try {
        use();
    } catch (const quivra::Error&) {
    }
}

}  // namespace

// Any text as the folders file and as the status file: only Error may come out.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    log_level = 0;
    const std::string text(reinterpret_cast<const char*>(data), size);
    CheckRoundTrip(text);
    std::filesystem::create_directories(
        std::filesystem::path(kFileIndexFoldersCfgPath).parent_path());
    Store(kFileIndexFoldersCfgPath, text);
    Store(kFileIndexStatusCfgPath, text);
    OnlyErrorsLeave(UseFolders);
    OnlyErrorsLeave(UseStatus);
    return 0;
}
