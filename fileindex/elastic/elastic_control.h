#pragma once

#include <json/json.h>

#include <span>
#include <string>
#include <string_view>

#include "common/export.h"

/// The client of the search daemon, which keeps one index per share. A document stands for one
/// file or directory and is identified by its full path.
///
/// Every call opens a connection of its own to /var/run/kestoelasticd.sock and may be made from
/// any thread. All but IndexQuery wait, for as long as it takes, while the daemon is busy (codes
/// 1400 and 1401): they sleep 15 to 19 minutes and send the request again; after the tenth repeat
/// administrators are notified once per call. All throw quivra::Error:
///   913   the daemon cannot be reached, or its reply is cut off or missing
///   120   the daemon refused the request, but its error object is malformed
///   any   the daemon's own code, "Request failed, msg=" and its message
/// Changes of documents become visible to queries, and durable, with IndexCommit.
namespace quivra::fileindex::elastic {

/// The fields of a document, with their types, analyzers and flags, as index_create sends them.
/// Throws Error 502 if the built-in text cannot be parsed.
QUIVRA_EXPORT Json::Value GetFileIndexMappings();

/// The name of the share's index: "fileindex_" and the share name as it stands.
QUIVRA_EXPORT std::string GetFileIndexID(const std::string& share);

/// The 130 metadata keys that a document may carry, in their fixed order. Lives as long as the
/// library is loaded.
QUIVRA_EXPORT std::span<const std::string_view> GetMetadataKeys();

/// Creates the share's index, empty, in the share's index directory. Throws Error 800 or 502 when
/// the share cannot be looked up; nothing is sent then.
QUIVRA_EXPORT void ShareIndexCreate(const std::string& share);

/// Deletes the share's index with all documents; one that does not exist is not an error.
QUIVRA_EXPORT void ShareIndexDelete(const std::string& share);

/// Makes the index refuse changes and let go of its files, and takes it back into service.
QUIVRA_EXPORT void ShareIndexPause(const std::string& share);
QUIVRA_EXPORT void ShareIndexResume(const std::string& share);

/// Gives the index of `share_from` the name of `share_to`'s, and moves it to `db_path`.
QUIVRA_EXPORT void ShareIndexRename(const std::string& share_from, const std::string& share_to,
                                    const std::string& db_path);

/// Moves the share's index to `db_path`.
QUIVRA_EXPORT void ShareIndexMigrate(const std::string& share, const std::string& db_path);

/// Removes one document; one that is not there is not an error.
QUIVRA_EXPORT void IndexDel(const std::string& share, const std::string& full_path);

/// Removes every document below the directory. The directory's own document stays.
QUIVRA_EXPORT void IndexDelDir(const std::string& share, const std::string& dir_path);

/// Adds or replaces the document of a file or directory: its attributes and, with `need_meta`,
/// its content and embedded metadata. Throws Error 914 ("Parse failed, path=...") when it cannot
/// be examined; nothing is sent then.
QUIVRA_EXPORT void IndexUpsert(const std::string& share, const std::string& full_path,
                               bool need_meta);

/// Refreshes the attributes in a document and keeps its content. Throws Error 914 as IndexUpsert.
QUIVRA_EXPORT void IndexAttr(const std::string& share, const std::string& full_path);

/// Moves the document at `old_path`, and every document below it, to `new_path`, with all they
/// hold. Throws Error 916 (reason: the reply) when the daemon lists no descendants, and Error 120
/// when it lists one without name or parent; the document itself has moved by then. A descendant
/// that the daemon refuses to move is logged and stays.
QUIVRA_EXPORT void IndexRename(const std::string& share, const std::string& new_path,
                               const std::string& old_path);

/// Makes all changes since the last commit visible and durable. When that fails because the
/// share's volume is full, the share is marked as needing a reindex and Error 1003 ("Share (NAME)
/// space not enough") is thrown; else the daemon's own error.
QUIVRA_EXPORT void IndexCommit(const std::string& share);

/// Runs one query on the share's index: `query` is the "query" of document_get_by_query, `reply`
/// becomes the daemon's whole reply, {"success": true, "data": [hit...], "total": N}. One attempt:
/// a busy daemon is reported at once. `reply` is unspecified after an error.
QUIVRA_EXPORT void IndexQuery(Json::Value& reply, const std::string& share,
                              const Json::Value& query);

}  // namespace quivra::fileindex::elastic
