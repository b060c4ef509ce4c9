#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace quivra::fileindex {

/// One indexed folder: where it is, which kinds of content are indexed in it, and whether it is
/// paused. Handled through shared pointers; a FolderMgr and its callers share the objects. Not for
/// use from several threads: the const getters fill caches.
class QUIVRA_EXPORT Folder {
  public:
    /// `path` is a share path. Nothing is checked here.
    Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video,
           bool photo, bool paused);

    /// Reads the stored form (see GetData); "paused" and "volume_to_be_clean" may be missing.
    /// Throws Error 120 ("Missing property: ...", "Not a string...", "Not an object...").
    explicit Folder(const Json::Value& data);

    /// The share path, as it is stored.
    const std::string& GetPath() const { return path_; }
    /// What the entry is called in lists.
    const std::string& GetName() const { return name_; }
    /// The volume whose index data is still to be cleaned for this folder; empty for none.
    const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }
    /// Which kinds of content are indexed; names and attributes of all files are.
    bool GetDocument() const { return document_; }
    bool GetAudio() const { return audio_; }
    bool GetVideo() const { return video_; }
    bool GetPhoto() const { return photo_; }
    /// Whether the folder's share is paused. The pause of all indexing is StatusMgr's.
    bool GetPaused() const { return paused_; }
    void SetPaused(bool paused) { paused_ = paused; }

    /// The name of the folder's share, computed once. Throws Error 120 when the path does not begin
    /// with "/". The reference holds until SetShare or the object's end.
    const std::string& GetShare() const;

    /// Moves the folder to another share. A full path that was already computed is kept, so build
    /// a new object to learn the new one. Throws Error 120 as GetShare; nothing has changed then.
    void SetShare(const std::string& share);

    /// The folder's full path, asked of the platform once. Throws Error 120 or 800 (unknown share).
    const std::string& GetFullPath() const;

    /// The stored form: {"path", "name", "document", "audio", "video", "photo", "paused",
    /// "volume_to_be_clean"}.
    Json::Value GetData() const;

    /// The content switches alone: {"document", "audio", "video", "photo"}.
    Json::Value GetIndexCfg() const;

    /// Whether changes below this folder still wait in the share's queue. Reads the queue. Throws
    /// what GetFullPath, the share's queue path and a malformed queue line do.
    bool IsIndexing() const;

    /// Sets out["text"] to "error" (and out["desc"] to "invalid_path"; also when the share is
    /// gone), "need_reindex", "finished", "paused" or "processing"; other members of `out` stay.
    /// Throws as IsIndexing and CanPathBeIndexed do otherwise, and Error 504 when the status file
    /// cannot be read.
    void GetStatus(Json::Value& out) const;

    /// GetData and, under "additional", the items that are asked for: an array of names, of which
    /// "status" is the one known. Throws Error 120 for anything else, and as GetStatus.
    Json::Value GetDataWithAdditional(const Json::Value& additionals) const;

  private:
    std::string path_;
    std::string name_;
    std::string volume_to_be_clean_;
    bool document_ = false;
    bool audio_ = false;
    bool video_ = false;
    bool photo_ = false;
    bool paused_ = false;
    mutable std::string share_;      // empty: not computed yet
    mutable std::string full_path_;  // empty: not computed yet
};

}  // namespace quivra::fileindex
