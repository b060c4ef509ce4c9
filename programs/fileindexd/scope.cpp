#include "programs/fileindexd/scope.h"

#include <algorithm>
#include <climits>

#include "common/json.h"
#include "common/util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexd/paths.h"

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
            if (IsBelow(folder->GetFullPath(), path)) {
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
                   return IsBelow(folder->GetFullPath(), one) ||
                          IsBelow(folder->GetFullPath(), other);
               });
    }

    std::string Describe(const std::string& root) const override {
        Json::Value rules(Json::arrayValue);
        for (const auto& folder : list_) {
            if (IsAtOrBelow(folder->GetFullPath(), root)) {
                Json::Value rule = folder->GetIndexCfg();
                rule["path"] = folder->GetFullPath().substr(root.size());  // the share may move
                rules.append(rule);
            }
        }
        return quivra::toString(rules);
    }

  private:
    /// Whether files in the directory may be indexed. The platform's answer is kept for the last
    /// directory, because files come directory by directory. A folder's own root was checked when
    /// it was chosen.
    bool MayHold(const std::string& directory) const {
        if (directory != last_directory_) {
            last_answer_ = folders_.IsFullPathHasOwnCfg(directory) ||
                           quivra::fileindex::CanFullPathBeIndexed(directory);
            last_directory_ = directory;
        }
        return last_answer_;
    }

    FolderMgr folders_;
    std::vector<std::shared_ptr<Folder>> list_;
    mutable std::string last_directory_;
    mutable bool last_answer_ = false;
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
