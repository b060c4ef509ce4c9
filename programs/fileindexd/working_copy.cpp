#include "programs/fileindexd/working_copy.h"

#include <fcntl.h>
#include <sys/stat.h>

namespace fileindexd {

std::optional<WorkingCopy> WorkingCopy::At(int directory, const std::string& name) {
    struct stat info {};
    if (fstatat(directory, name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) {
        return std::nullopt;
    }
    return WorkingCopy{info.st_ino, static_cast<std::uint64_t>(info.st_size),
                       info.st_mtim.tv_sec * std::int64_t{1000000000} + info.st_mtim.tv_nsec};
}

std::string WorkingCopy::Identity() const {
    return std::to_string(inode) + ":" + std::to_string(size) + ":" + std::to_string(modified);
}

}  // namespace fileindexd
