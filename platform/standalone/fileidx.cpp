#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <sys/stat.h>
#include <syslog.h>

#include <map>
#include <mutex>
#include <string>

#include "base/file.h"
#include "base/private_directory.h"
#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

using quivra::base::PrivateDirectory;

std::string DirectoryPath(const char* share_path) {
    return std::string(share_path) + "/@eaDir/fileindex";
}

/// Logs what stands in the way of a share once, not with each of the questions for its paths, and
/// once more when it has been away in between.
void Report(const std::string& path, const std::string& problem) {
    static std::mutex mutex;
    static std::map<std::string, std::string> reported;  // one entry a share
    const std::lock_guard lock(mutex);
    if (problem.empty()) {
        reported.erase(path);
    } else if (reported[path] != problem) {
        reported[path] = problem;
        syslog(LOG_ERR, "The share is not indexed: %s", problem.c_str());
    }
}

/// Makes the directory where it is missing, and returns what somebody has to put right.
std::string Prepare(const std::string& path) {
    const quivra::base::KeepErrno keep_errno;
    const PrivateDirectory directory =
        PrivateDirectory::Open(path, PrivateDirectory::Make::kMissing);
    struct stat status {};
    if (directory.IsValid() && fstat(directory.Fd(), &status) == 0 &&
        (status.st_mode & 0777) != 0700) {
        fchmod(directory.Fd(), 0700);  // readers would learn of private files
    }
    Report(path, directory.Problem());
    return directory.Problem();
}

int CopyOut(const std::string& text, char* out, int out_size) {
    if (out == nullptr || out_size <= 0 || text.size() >= static_cast<std::size_t>(out_size)) {
        return SetError(KESTO_ERR_BUFFER_TOO_SMALL);
    }
    text.copy(out, text.size());
    out[text.size()] = '\0';
    return 0;
}

int Compose(const char* share_path, const char* name, char* out, int out_size) {
    if (share_path == nullptr || share_path[0] != '/') {
        return SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    const std::string path = DirectoryPath(share_path);
    // Before the directory is made: a call that fails leaves nothing behind.
    if (CopyOut(path + "/" + name, out, out_size) < 0) {
        return -1;
    }
    return Prepare(path).empty() ? 0 : SetError(KESTO_ERR_UNSAFE_PLACE);
}

}  // namespace
}  // namespace kesto

int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size) {
    return kesto::Compose(share_path, "queue", out, out_size);
}

int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size) {
    return kesto::Compose(share_path, "db", out, out_size);
}

int FILEIDXProblem(const char* share_path, char* out, int out_size) {
    if (share_path == nullptr || share_path[0] != '/') {
        return kesto::SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    const std::string problem = kesto::Prepare(kesto::DirectoryPath(share_path));
    return kesto::CopyOut(problem, out, out_size) < 0 ? -1 : !problem.empty();
}
