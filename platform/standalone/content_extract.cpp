#include <fcntl.h>
#include <kesto/content_extract.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <iterator>

#include "base/file.h"
#include "base/path.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/text_content.h"

namespace {

using quivra::base::UniqueFd;

/// How often a file that changes under the reader is read again at once.
constexpr int kReadings = 3;
constexpr const char* kChanged = "the file changed while it was read";

Json::Value Seconds(const statx_timestamp& time) {
    return Json::Int64{time.tv_sec};
}

/// Modulo 2^64: a file's owner may give it any year, and versions must stay different.
Json::Value Nanoseconds(const statx_timestamp& time) {
    return static_cast<Json::Int64>(static_cast<std::uint64_t>(time.tv_sec) * 1'000'000'000 +
                                    time.tv_nsec);
}

void AddNames(const std::string& full_path, Json::Value& data) {
    const std::string name(quivra::base::Name(full_path));
    // A directory has an extension, too, as a rename gives it one.
    std::string extension(quivra::base::Extension(full_path));
    // By hand: in some locales tolower changes bytes of UTF-8 characters.
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
    data["KESTOMDPath"] = full_path;
    data["KESTOMDParent"] = full_path.substr(0, full_path.rfind('/'));
    data["KESTOMDFSName"] = name;
    data["KESTOMDDisplayName"] = name;
    data["KESTOMDExtension"] = data["KESTOMDKind"] = extension;
}

void AddAttributes(const struct statx& status, Json::Value& data) {
    data["KESTOMDIsDir"] = S_ISDIR(status.stx_mode);
    // The ids are names to the index, not amounts.
    data["KESTOMDOwnerUserID"] = std::to_string(status.stx_uid);
    data["KESTOMDOwnerGroupID"] = std::to_string(status.stx_gid);
    data["KESTOMDFSSize"] = Json::UInt64{status.stx_size};
    data["KESTOMDFSContentChangeDate"] = Seconds(status.stx_mtime);
    data["KESTOMDContentModificationDate"] = Seconds(status.stx_mtime);
    data["KESTOMDAttributeChangeDate"] = Seconds(status.stx_ctime);
    data["KESTOMDLastUsedDate"] = Seconds(status.stx_atime);
    if ((status.stx_mask & STATX_BTIME) != 0) {
        data["KESTOMDFSCreationDate"] = Seconds(status.stx_btime);
    }
    // Seconds do not tell two versions apart, nor two files of one name in exchanged directories.
    data["@inode"] = Json::UInt64{status.stx_ino};
    data["@modified_ns"] = Nanoseconds(status.stx_mtime);
    data["@changed_ns"] = Nanoseconds(status.stx_ctime);
}

bool Examine(const UniqueFd& object, struct statx& status) {
    return statx(object.Get(), "", AT_EMPTY_PATH | AT_NO_AUTOMOUNT, STATX_BASIC_STATS | STATX_BTIME,
                 &status) == 0;
}

bool IsSameVersion(const struct statx& one, const struct statx& other) {
    return one.stx_size == other.stx_size && one.stx_mtime.tv_sec == other.stx_mtime.tv_sec &&
           one.stx_mtime.tv_nsec == other.stx_mtime.tv_nsec &&
           one.stx_ctime.tv_sec == other.stx_ctime.tv_sec &&
           one.stx_ctime.tv_nsec == other.stx_ctime.tv_nsec;
}

/// Causes that pass by themselves, so that another try makes sense.
bool CanPass(int error) {
    static constexpr int kPassing[] = {EAGAIN, EINTR,   EIO,       EMFILE, ENFILE,
                                       ENOMEM, ENOBUFS, ETIMEDOUT, ESTALE, EBUSY};
    return std::find(std::begin(kPassing), std::end(kPassing), error) != std::end(kPassing);
}

void NoteFailure(const std::string& sentence, bool can_pass, Json::Value& data) {
    data["@content_error"] = sentence;
    if (can_pass) {
        data["@content_retry"] = true;
    }
}

void NoteCause(const char* what, int error, Json::Value& data) {
    // EAGAIN: a file server that has leased the file to a client is calling it back.
    const char* cause =
        error == EAGAIN ? "another program holds a lease on it" : strerrordesc_np(error);
    NoteFailure(std::string(what) + (cause == nullptr ? "unknown error" : cause), CanPass(error),
                data);
}

UniqueFd OpenForReading(const UniqueFd& object) {
    // Without leaving a trace in the access time, which only the owner may ask for.
    UniqueFd fd = quivra::base::OpenFound(object.Get(), O_RDONLY | O_NOATIME);
    if (!fd.IsValid() && errno == EPERM) {
        fd = quivra::base::OpenFound(object.Get(), O_RDONLY);
    }
    return fd;
}

/// Adds the file's text, and the attributes anew where it changed meanwhile, so that the two
/// belong to one version of it.
void AddContent(const UniqueFd& object, struct statx status, Json::Value& data) {
    const UniqueFd fd = OpenForReading(object);
    if (!fd.IsValid()) {
        return NoteCause("the file could not be opened: ", errno, data);
    }
    for (int reading = 0; reading < kReadings; ++reading) {
        std::string text;
        const kesto::TextResult result = kesto::ReadText(fd.Get(), text);
        struct statx now {};
        if (result == kesto::TextResult::kReadFailed || !Examine(object, now)) {
            return NoteCause("the file could not be read: ", errno, data);
        }
        if (IsSameVersion(status, now)) {
            if (result == kesto::TextResult::kText) {
                data["KESTOMDTextContent"] = text;
            }
            return;
        }
        status = now;
        AddAttributes(status, data);
    }
    NoteFailure(kChanged, true, data);
}

}  // namespace

namespace KESTO {
namespace CONTENT_EXTRACT {

bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data) {
    if (!quivra::base::IsCanonicalText(full_path)) {
        errno = EINVAL;
        return false;
    }
    // Everything below comes from this one descriptor: who may write to a share can exchange a
    // directory for a link to a private one between any two looks at the path.
    const UniqueFd object = quivra::base::FindObject(AT_FDCWD, full_path);
    struct statx status {};
    if (!object.IsValid() || !Examine(object, status)) {
        return false;
    }
    const quivra::base::KeepErrno keep_errno;
    file_data = Json::Value(Json::objectValue);
    AddNames(full_path, file_data);
    AddAttributes(status, file_data);
    if (cfg.isObject() && cfg["need_meta"] == true && S_ISREG(status.stx_mode)) {
        AddContent(object, status, file_data);
    }
    return true;
}

}  // namespace CONTENT_EXTRACT
}  // namespace KESTO
