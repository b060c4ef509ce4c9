#pragma once

#include <cstddef>
#include <map>
#include <string>
#include <unordered_map>

namespace kestotifyd {

/// Where the directories of one mount are, by file handle, at the position in the event stream that
/// has been processed. A directory that is not known yet is looked up on the disk, which may be
/// ahead of the stream: the renames that come later then find their result known already, and say
/// so, for what was reported in between had names that did not exist yet. Pure bookkeeping.
class HandlePaths {
  public:
    /// Empty when the handle is not known.
    std::string Find(const std::string& handle) const;

    /// Also forgets what else was at the path.
    void Set(const std::string& handle, const std::string& path);

    void Erase(const std::string& handle);
    void EraseBelow(const std::string& path);

    /// Moves the directory `handle` and all below it. True when something here was ahead of the
    /// rename, so that the directory's contents may have been reported under a wrong name.
    bool Rename(const std::string& handle, const std::string& from, const std::string& to);

    std::size_t Size() const { return by_handle_.size(); }
    void Clear();

  private:
    std::unordered_map<std::string, std::string> by_handle_;
    std::map<std::string, std::string> by_path_;
};

}  // namespace kestotifyd
