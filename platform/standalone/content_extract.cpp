#include <fcntl.h>
#include <kesto/content_extract.h>
#include <sys/stat.h>

#include <algorithm>
#include <cctype>
#include <cerrno>

#include "platform/standalone/paths.h"
#include "platform/standalone/text_content.h"

namespace {

/// The lower-case extension: what stands behind the last "." of the name. A directory has one too,
/// as a rename gives it one.
std::string ExtensionOf(std::string_view name) {
    const std::size_t dot = name.rfind('.');
    std::string extension(dot == std::string_view::npos ? "" : name.substr(dot + 1));
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return extension;
}

Json::Value Seconds(const struct statx_timestamp& time) {
    return Json::Int64{time.tv_sec};
}

void AddNames(const std::string& full_path, Json::Value& data) {
    const std::string name(kesto::LastComponent(full_path));
    data["KESTOMDPath"] = full_path;
    data["KESTOMDParent"] = full_path.substr(0, full_path.rfind('/'));
    data["KESTOMDFSName"] = name;
    data["KESTOMDDisplayName"] = name;
    data["KESTOMDExtension"] = data["KESTOMDKind"] = ExtensionOf(name);
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
}

}  // namespace

namespace KESTO {
namespace CONTENT_EXTRACT {

bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data) {
    if (full_path.find('\0') != std::string::npos) {
        errno = EINVAL;
        return false;
    }
    struct statx status {};
    if (statx(AT_FDCWD, full_path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT,
              STATX_BASIC_STATS | STATX_BTIME, &status) != 0) {
        return false;
    }
    file_data = Json::Value(Json::objectValue);
    AddNames(full_path, file_data);
    AddAttributes(status, file_data);
    std::string text;
    if (cfg.isObject() && cfg["need_meta"] == true && S_ISREG(status.stx_mode) &&
        kesto::ReadText(full_path, text)) {
        file_data["KESTOMDTextContent"] = text;
    }
    return true;
}

}  // namespace CONTENT_EXTRACT
}  // namespace KESTO
