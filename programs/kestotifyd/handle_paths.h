#pragma once

#include <cstddef>
#include <map>
#include <string>
#include <unordered_map>

namespace kestotifyd {

/// Where the directories of one mount are, by file handle, at the position in the event stream that
/// has been processed. A directory that is not known yet is looked up on the disk, which may be
/// ahead of the stream: then what is reported about it has a name that does not exist yet, or is
/// still another object's. The contradiction with a known place, or with a later rename, shows
/// this. From there to the end of the stream nothing is remembered, and IsAhead tells that the
/// result of every rename must be looked at again: whatever has a wrong name lies below one. Pure
/// bookkeeping.
class HandlePaths {
  public:
    /// Empty when the handle is not known.
    std::string Find(const std::string& handle) const;

    /// A directory is at the path: found on the disk, or told by the stream.
    void Set(const std::string& handle, const std::string& path);

    void Erase(const std::string& handle);
    void EraseBelow(const std::string& path);

    /// The directory was moved, with all below it.
    void Rename(const std::string& handle, const std::string& from, const std::string& to);

    bool IsAhead() const { return is_ahead_; }

    /// Something else has shown that the disk is ahead, or that the paths are not to be trusted.
    void BecomeAhead();

    /// The stream has been processed to its end: the disk is ahead no more.
    void Settle();

    /// Memory taken by the paths, in bytes, more or less.
    std::size_t Size() const { return size_; }
    void Clear();

  private:
    void Insert(const std::string& handle, const std::string& path);

    std::unordered_map<std::string, std::string> by_handle_;
    std::map<std::string, std::string> by_path_;
    std::size_t size_ = 0;
    bool is_ahead_ = false;
};

}  // namespace kestotifyd
