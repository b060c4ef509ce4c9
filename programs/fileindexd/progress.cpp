#include "programs/fileindexd/progress.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/json.h"
#include "common/log.h"

namespace fileindexd {

namespace {

std::string Identity(const WorkingCopy& copy) {
    return std::to_string(copy.inode) + ":" + std::to_string(copy.size) + ":" +
           std::to_string(copy.modified);
}

}  // namespace

std::optional<WorkingCopy> WorkingCopy::At(const std::string& path) {
    struct statx info {};
    if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME,
              &info) != 0) {
        return std::nullopt;
    }
    WorkingCopy copy{info.stx_ino, info.stx_size,
                     info.stx_mtime.tv_sec * std::int64_t{1000000000} + info.stx_mtime.tv_nsec,
                     std::nullopt};
    if ((info.stx_mask & STATX_BTIME) != 0) {
        copy.created = info.stx_btime.tv_sec;
    }
    return copy;
}

Progress::Progress(std::string path, const WorkingCopy& copy)
    : path_(std::move(path)), copy_(copy) {
    Json::Value stored;
    std::string written_for;
    long long steps = 0;
    if (!quivra::fromFile(stored, path_)) {
        return;
    }
    quivra::GetJsonValue(written_for, stored, "copy", false);
    quivra::GetJsonValue(steps, stored, "steps", false);
    if (written_for == Identity(copy_) && steps > 0) {
        steps_ = static_cast<std::size_t>(steps);
    }
}

void Progress::Store(std::size_t steps) {
    Json::Value stored;
    stored["copy"] = Identity(copy_);
    stored["steps"] = Json::UInt64(steps);
    if (!quivra::toFile(stored, path_)) {
        quivra::Fail({"progress", __LINE__}, "!toFile(stored, path_)",
                     quivra::Error(quivra::Error::kSaveFailed, "Failed to save " + path_));
    }
    steps_ = steps;
}

void Progress::Remove() {
    unlink(path_.c_str());
}

}  // namespace fileindexd
