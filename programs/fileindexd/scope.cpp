#include "programs/fileindexd/scope.h"

#include <algorithm>
#include <climits>
#include <unordered_map>

#include "base/path.h"
#include "common/json.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"

namespace fileindexd {

using quivra::fileindex::FileType;
using quivra::fileindex::Folder;
using quivra::fileindex::FolderMgr;

namespace {

class WholeShareScope : public Scope {
  public:
    bool Covers(const std::string&, bool) const override { return true; }
    bool NeedsMeta(const std::string& path) const override {
        return quivra::fileindex::GetFileTypeByFullPath(path) != FileType::kOther;
    }
    std::vector<std::string> RootsWithin(const std::string& path) const override { return {path}; }
    bool HaveSameRules(const std::string&, const std::string&) const override { return true; }
    std::string Describe(const std::string&) const override { return "whole"; }
};

ContentClasses ClassesOf(const Folder& folder) {
    return {folder.GetDocument(), folder.GetAudio(), folder.GetVideo(), folder.GetPhoto()};
}

/// Answers of the platform that are kept, because files come directory by directory.
constexpr std::size_t kMaxKnown = 4096;

/// A volume, a share and what lies near its root: the recycle bins of homes do.
constexpr int kDecidingDepth = 6;

/// The beginning of the path that decides whether the directory may hold what is indexed: its
/// first components, and all up to the last that may be the name of a recycle bin or of snapshots
/// (these begin with "#").
std::string DecidingPart(const std::string& directory) {
    std::size_t end = 0;
    for (int depth = 0; depth < kDecidingDepth && end < directory.size(); ++depth) {
        end = std::min(directory.find('/', end + 1), directory.size());
    }
    if (const std::size_t marked = directory.rfind("/#"); marked != std::string::npos) {
        end = std::max(end, std::min(directory.find('/', marked + 1), directory.size()));
    }
    return directory.substr(0, end);
}

class FolderScope : public Scope {
  public:
    FolderScope() {
        unsigned int total = 0;
        folders_.List(list_, total, 0, UINT_MAX, "path", "");
    }

    bool Covers(const std::string& path, bool is_dir) const override {
        return folders_.IsFullPathIndexed(path) &&
               MayHold(is_dir || folders_.IsFullPathHasOwnCfg(path) ? path : quivra::Dirname(path));
    }

    bool NeedsMeta(const std::string& path) const override {
        return folders_.IsFullPathNeedMeta(path);
    }

    std::vector<std::string> RootsWithin(const std::string& path) const override {
        if (folders_.IsFullPathIndexed(path)) {
            return {path};
        }
        std::vector<std::string> roots;
        for (const auto& folder : list_) {
            if (quivra::base::IsBelow(folder->GetFullPath(), path)) {
                roots.push_back(folder->GetFullPath());
            }
        }
        return roots;  // nested folders come again and are found unchanged
    }

    bool HaveSameRules(const std::string& one, const std::string& other) const override {
        const auto rule_one = folders_.GetMostSuitableCfg(one);
        const auto rule_other = folders_.GetMostSuitableCfg(other);
        return rule_one != nullptr && rule_other != nullptr &&
               ClassesOf(*rule_one) == ClassesOf(*rule_other) &&
               std::none_of(list_.begin(), list_.end(), [&](const auto& folder) {
                   return quivra::base::IsBelow(folder->GetFullPath(), one) ||
                          quivra::base::IsBelow(folder->GetFullPath(), other);
               });
    }

    std::string Describe(const std::string& root) const override {
        Json::Value rules(Json::arrayValue);
        for (const auto& folder : list_) {
            if (quivra::base::IsAtOrBelow(folder->GetFullPath(), root)) {
                Json::Value rule = folder->GetIndexCfg();
                rule["path"] = folder->GetFullPath().substr(root.size());  // the share may move
                rules.append(rule);
            }
        }
        return quivra::toString(rules);
    }

  private:
    /// Whether files in the directory may be indexed. A folder's own root was checked when it was
    /// chosen. The question resolves the path, so it costs more with every level, and is asked of
    /// the part only that can make a difference: below it ShareTree leads past no mount, no link
    /// and no name of the system's own.
    bool MayHold(const std::string& directory) const {
        const std::string asked = DecidingPart(directory);
        if (const auto known = may_hold_.find(asked); known != may_hold_.end()) {
            return known->second;
        }
        if (may_hold_.size() >= kMaxKnown) {
            may_hold_.clear();
        }
        const bool may_hold =
            folders_.IsFullPathHasOwnCfg(asked) || quivra::fileindex::CanFullPathBeIndexed(asked);
        return may_hold_.emplace(asked, may_hold).first->second;
    }

    FolderMgr folders_;
    std::vector<std::shared_ptr<Folder>> list_;
    mutable std::unordered_map<std::string, bool> may_hold_;
};

}  // namespace

bool ContentClasses::Has(FileType type) const {
    switch (type) {
        case FileType::kDocument:
            return document;
        case FileType::kAudio:
            return audio;
        case FileType::kVideo:
            return video;
        case FileType::kImage:
            return photo;
        default:
            return false;
    }
}

bool ContentClasses::Includes(const ContentClasses& other) const {
    return (document || !other.document) && (audio || !other.audio) && (video || !other.video) &&
           (photo || !other.photo);
}

void ContentClasses::Add(const ContentClasses& other) {
    document |= other.document;
    audio |= other.audio;
    video |= other.video;
    photo |= other.photo;
}

std::unique_ptr<Scope> WholeShare() {
    return std::make_unique<WholeShareScope>();
}

std::unique_ptr<Scope> LoadScope() {
    if (!quivra::IsFileExist(quivra::fileindex::kFileIndexFoldersCfgPath)) {
        return WholeShare();
    }
    return std::make_unique<FolderScope>();
}

}  // namespace fileindexd
