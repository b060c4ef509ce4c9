#pragma once

#include <map>
#include <string>

namespace support {

/// What stands at each path of a share: the content of a file, "/" for a directory.
using Contents = std::map<std::string, std::string>;

/// Everything below `root` but @eaDir.
Contents ContentsOnDisk(const std::string& root);

/// What the share's index holds below `root`, as of its last commit. Throws quivra::Error.
Contents ContentsInIndex(const std::string& share, const std::string& root);

/// The lines in which two states differ, for a failure's message.
std::string Difference(const Contents& disk, const Contents& index);

}  // namespace support
