#include "fileindex/queue_directory.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "base/file.h"
#include "base/path.h"
#include "base/queue_file.h"
#include "common/log.h"

namespace quivra::fileindex {
namespace {

bool LiesInSystemDirectory(const std::string& path) {
    return path.find("/@eaDir/") != path.npos;
}

}  // namespace

QueueDirectory::QueueDirectory(const std::string& queue_path)
    : queue_name_(base::Name(queue_path)), copy_name_(base::WorkingCopy(queue_name_)) {
    const std::string path(base::Directory(queue_path));
    if (LiesInSystemDirectory(queue_path)) {
        private_ = base::PrivateDirectory::Open(path);
    } else {
        plain_.Reset(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    }
    error_ = IsValid() ? 0 : errno;
}

bool QueueDirectory::IsMissing() const {
    return private_.Problem().empty() && (error_ == ENOENT || error_ == ENOTDIR);
}

std::string QueueDirectory::Reason() const {
    return private_.Problem().empty() ? SystemErrorText(error_) : private_.Problem();
}

bool QueueDirectory::HasFile(const std::string& name) const {
    struct stat status {};
    return IsValid() && fstatat(Fd(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
           S_ISREG(status.st_mode);
}

base::UniqueFd QueueDirectory::OpenFile(const std::string& path) {
    if (!LiesInSystemDirectory(path)) {
        return base::UniqueFd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    }
    const QueueDirectory directory(path);
    if (!directory.IsValid()) {
        return base::UniqueFd();
    }
    return base::OpenRegular(directory.Fd(), directory.QueueName(), O_RDONLY);
}

}  // namespace quivra::fileindex
