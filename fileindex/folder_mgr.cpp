#include "fileindex/folder_mgr.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/util.h"
#include "fileindex/util.h"
#include "sdk/credentials.h"

namespace quivra::fileindex {
namespace {

/// Below 1000 are marks that support tools know.
constexpr LogUnit kLog{"folder_mgr.cpp", 1000};

using FolderPtr = FolderMgr::FolderPtr;

bool Covers(const std::string* folder, const std::string& full_path) {
    return folder != nullptr && base::IsAtOrBelow(full_path, *folder);
}

bool (*OrderBy(const std::string& key))(const FolderPtr&, const FolderPtr&) {
    if (key == "document") {
        return [](const FolderPtr& a, const FolderPtr& b) {
            return a->GetDocument() < b->GetDocument();
        };
    }
    if (key == "audio") {
        return [](const FolderPtr& a, const FolderPtr& b) { return a->GetAudio() < b->GetAudio(); };
    }
    if (key == "video") {
        return [](const FolderPtr& a, const FolderPtr& b) { return a->GetVideo() < b->GetVideo(); };
    }
    if (key == "photo") {
        return [](const FolderPtr& a, const FolderPtr& b) { return a->GetPhoto() < b->GetPhoto(); };
    }
    if (key == "path") {
        return [](const FolderPtr& a, const FolderPtr& b) { return a->GetPath() < b->GetPath(); };
    }
    return [](const FolderPtr& a, const FolderPtr& b) { return a->GetName() < b->GetName(); };
}

}  // namespace

FolderMgr::FolderMgr() {
    Json::Value folders(Json::arrayValue);
    if (IsFileExist(kFileIndexFoldersCfgPath) && !fromFile(folders, kFileIndexFoldersCfgPath)) {
        Fail({"folder_mgr.cpp", 39},
             "IsFileExist(kFileIndexFoldersCfgPath) && "
             "!folders.fromFile(kFileIndexFoldersCfgPath)",
             Error(Error::kLoadFailed,
                   std::string("Cannot load json: ") + kFileIndexFoldersCfgPath));
    }
    // null and {} hold nothing that could be lost; anything else is not ours to overwrite.
    QUIVRA_FAIL_IF(kLog, !folders.isArray() && !folders.empty(),
                   Error(Error::kBadArgument, "Not an array" + AppendData(folders)));
    // More than the limit load, too: refusing them would take the settings away that are there.
    folders_.reserve(folders.size());
    for (const Json::Value& folder : folders) {
        folders_.push_back(std::make_shared<Folder>(folder));
    }
}

void FolderMgr::Save() const {
    Json::Value folders(Json::arrayValue);
    for (const FolderPtr& folder : folders_) {
        folders.append(folder->GetData());
    }
    // The front end may run as an administrator who may not write below /var/packages.
    const sdk::SDKCredentials as_root("root");
    if (!toFile(folders, kFileIndexFoldersCfgPath)) {
        Fail({"folder_mgr.cpp", 229}, "!folders.toFile(kFileIndexFoldersCfgPath)",
             Error(Error::kSaveFailed,
                   std::string("Failed to save json: ") + kFileIndexFoldersCfgPath));
    }
    if (chmod(kFileIndexFoldersCfgPath, 0644) == -1) {
        const std::string reason = "chmod failed, reason=" + SystemErrorText(errno);
        Fail({"folder_mgr.cpp", 231}, "-1 == chmod(kFileIndexFoldersCfgPath, 0644)",
             Error(Error::kSystemCallFailed, reason));
    }
}

void FolderMgr::Get(FolderPtr& out, const std::string& path) const {
    const auto it = std::find_if(folders_.begin(), folders_.end(), [&](const FolderPtr& folder) {
        return folder->GetPath() == path;
    });
    if (it == folders_.end()) {
        Fail({"folder_mgr.cpp", 101}, "it == folders_.end()", Error(Error::kNoSuchFolder, path));
    }
    out = *it;
}

bool FolderMgr::HasFolder(const std::string& path) const {
    return std::any_of(folders_.begin(), folders_.end(),
                       [&](const FolderPtr& folder) { return folder->GetPath() == path; });
}

void FolderMgr::Upsert(FolderPtr& diff, FolderPtr folder) {
    // Before the old entry goes: what governed the place is what the index holds now.
    diff = DiffCfg(folder, GetMostSuitableCfg(folder->GetFullPath()));
    RemovePath(folder->GetPath());
    folders_.push_back(std::move(folder));
    if (folders_.size() > kFileIndexFoldersMax) {
        Fail({"folder_mgr.cpp", 76}, "folders_.size() > kFileIndexFoldersMax",
             Error(Error::kTooManyFolders));
    }
}

void FolderMgr::Delete(FolderPtr& diff, const std::string& path) {
    std::string full_path;
    GetFullPath(full_path, path);
    const FolderPtr before = GetMostSuitableCfg(full_path);
    QUIVRA_FAIL_IF(kLog, before == nullptr, Error(Error::kNoSuchFolder, path));
    RemovePath(path);
    diff = DiffCfg(before, GetMostSuitableCfg(full_path));
}

void FolderMgr::DeleteByShare(const std::string& share) {
    std::vector<FolderPtr> kept;  // a malformed path throws: the set is to stay whole then
    std::copy_if(folders_.begin(), folders_.end(), std::back_inserter(kept),
                 [&](const FolderPtr& folder) { return folder->GetShare() != share; });
    folders_ = std::move(kept);
}

void FolderMgr::List(std::vector<FolderPtr>& out, unsigned int& total, unsigned int offset,
                     unsigned int limit, const std::string& sort_by,
                     const std::string& sort_direction) const {
    out = folders_;
    total = static_cast<unsigned int>(folders_.size());
    std::sort(out.begin(), out.end(), OrderBy(sort_by));
    if (sort_direction == "desc") {
        std::reverse(out.begin(), out.end());
    }
    out.erase(out.begin(), out.begin() + std::min(offset, total));
    if (out.size() > limit) {
        out.resize(limit);
    }
}

FolderPtr FolderMgr::DiffCfg(FolderPtr next, FolderPtr previous) {
    const auto changes = [&](bool (Folder::*get)() const) {
        return previous == nullptr || (next.get()->*get)() != (previous.get()->*get)();
    };
    return std::make_shared<Folder>(next->GetPath(), next->GetName(), changes(&Folder::GetDocument),
                                    changes(&Folder::GetAudio), changes(&Folder::GetVideo),
                                    changes(&Folder::GetPhoto), false);
}

const std::string* FolderMgr::FindFullPath(const Folder& folder) const {
    if (!gone_shares_.empty() && gone_shares_.contains(folder.GetShare())) {
        return nullptr;
    }
    try {
        return &folder.GetFullPath();
    } catch (const Error& error) {
        if (error.code != Error::kNoSuchShare) {
            throw;
        }
    }
    // One folder without a place must not make every question about the others fail.
    LogError(kLog.Here(),
             "Share %s is gone, so folder %s covers nothing; fileindexctl share rename, migrate or "
             "clear mends that",
             folder.GetShare().c_str(), folder.GetPath().c_str());
    gone_shares_.insert(folder.GetShare());
    return nullptr;
}

FolderPtr FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
    // A plain walk: a thousand folders are 30 us, and no order of theirs has to be kept up.
    const FolderPtr* best = nullptr;
    std::size_t best_size = 0;
    for (const FolderPtr& folder : folders_) {
        const std::string* own = FindFullPath(*folder);
        if (Covers(own, full_path) && own->size() > best_size) {
            best = &folder;
            best_size = own->size();
        }
    }
    return best == nullptr ? nullptr : *best;
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
    const FolderPtr cfg = GetMostSuitableCfg(full_path);
    if (cfg == nullptr) {
        return false;
    }
    switch (GetFileTypeByFullPath(full_path)) {
        case FileType::kDocument:
            return cfg->GetDocument();
        case FileType::kAudio:
            return cfg->GetAudio();
        case FileType::kVideo:
            return cfg->GetVideo();
        case FileType::kImage:
            return cfg->GetPhoto();
        case FileType::kOther:
            break;
    }
    return false;
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
    return std::any_of(folders_.begin(), folders_.end(), [&](const FolderPtr& folder) {
        const std::string* own = FindFullPath(*folder);
        return own != nullptr && *own == full_path;
    });
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
    return std::any_of(folders_.begin(), folders_.end(), [&](const FolderPtr& folder) {
        return Covers(FindFullPath(*folder), full_path);
    });
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
    // By the path alone, so that it also holds for a share that is gone.
    return std::any_of(folders_.begin(), folders_.end(), [&](const FolderPtr& folder) {
        std::string name;
        GetShareNameByPath(name, folder->GetPath());
        return name == share;
    });
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
    std::set<std::string> shares;
    for (const FolderPtr& folder : folders_) {
        shares.insert(folder->GetShare());
    }
    return shares;
}

void FolderMgr::RemovePath(const std::string& path) {
    std::erase_if(folders_, [&](const FolderPtr& folder) { return folder->GetPath() == path; });
}

}  // namespace quivra::fileindex
