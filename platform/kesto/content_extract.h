#pragma once

#include <json/json.h>

#include <string>

namespace KESTO {
namespace CONTENT_EXTRACT {

/// Describes one file-system object: a link as itself, never what it points to. `cfg` is
/// {"need_meta": bool}. `file_data` becomes an object with one member per metadata key: the names
/// that come from the path (bytes as they are), "KESTOMDIsDir", "KESTOMDFSSize", the owner's ids as
/// texts, and the dates as seconds since the epoch. With need_meta also content and embedded
/// metadata: here the text of plain-text files as "KESTOMDTextContent", valid UTF-8 of at most
/// 4 MiB.
///
/// Besides, the stand-alone platform tells which version of which file that is: "@inode",
/// "@modified_ns" and "@changed_ns" (nanoseconds since the epoch, modulo 2^64). Attributes and
/// content come from one descriptor and belong together. When content was wanted and could not be
/// read, "@content_error" is a sentence with the cause, and "@content_retry" is true where the
/// cause passes by itself: a lease, an I/O error, descriptors or memory that are short, a file that
/// changed while it was read.
///
/// The path is walked from "/", whether it lies in a share or not, and no component but the last
/// may be a link: who may write to a share could put one there at any moment. Never waits for
/// another process: FIFOs, devices and sockets are not opened.
///
/// False, with errno telling why, when the object cannot be examined: ELOOP or ENOTDIR for a link
/// on the way, EINVAL for a path with empty, "." or ".." parts. Any thread may call.
bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data);

}  // namespace CONTENT_EXTRACT
}  // namespace KESTO
