#pragma once

/// The words of the search daemon's protocol, for its clients and for the daemon. A request is
/// {"command": NAME, "data": {"id": INDEX, ...}}, or {"compound": [REQUEST...]}; a reply is
/// {"success": true, ...} or {"success": false, "error": {"code": CODE, "msg": TEXT}}. One of each
/// per connection, each after its length as a 4-byte number in the host's byte order. All names and
/// values are the wire's: they never change, and what was given once is given to nothing else.
namespace quivra::fileindex::elastic {

/// Where the daemon listens; root only.
inline constexpr const char* kSearchDaemonSocketPath = "/var/run/kestoelasticd.sock";

/// What a request can ask for; docs/search-daemon.md tells what each does.
namespace command {

inline constexpr const char* kIndexCreate = "index_create";
inline constexpr const char* kIndexDelete = "index_delete";
inline constexpr const char* kIndexPause = "index_pause";
inline constexpr const char* kIndexResume = "index_resume";
inline constexpr const char* kIndexConfigSet = "index_config_set";
/// Takes an index that was made anew into service again, see kIndexMadeAnew.
inline constexpr const char* kIndexAccept = "index_accept";
inline constexpr const char* kDocumentUpsertById = "document_upsert_by_id";
inline constexpr const char* kDocumentSetById = "document_set_by_id";
inline constexpr const char* kDocumentDelById = "document_del_by_id";
inline constexpr const char* kDocumentDelByQuery = "document_del_by_query";
inline constexpr const char* kDocumentGetByQuery = "document_get_by_query";
inline constexpr const char* kCommit = "commit";
/// How the daemon and each of its indexes are.
inline constexpr const char* kState = "state";

}  // namespace command

/// The codes of refused requests. The daemon also gives 505 when it cannot save its own list of
/// indexes.
enum Code : int {
    kOutOfMemory = 1400,       ///< memory is short; try again later
    kBusy = 1401,              ///< the index is being moved, made or deleted; try again later
    kBadRequest = 1402,        ///< not a JSON object, or a member is missing or of the wrong type
    kUnknownCommand = 1403,    ///< the command does not exist, or is not allowed in a compound
    kNoSuchIndex = 1404,       ///< no index has that id
    kIndexExists = 1405,       ///< the id, or the path, belongs to another index
    kBadMapping = 1406,        ///< the mapping document cannot be followed
    kPaused = 1407,            ///< writes are refused while the index is paused
    kNoSuchDocument = 1408,    ///< a "set" named a document that is not there
    kBadDocument = 1409,       ///< a required field is missing, a value does not fit its type...
    kBadQuery = 1410,          ///< the query cannot be followed
    kBatchLost = 1411,         ///< changes since the last commit were lost: repeat them
    kNoSpace = 1412,           ///< the index's file system is full, or nearly
    kIndexUnavailable = 1413,  ///< the index's files are missing or unreadable
    kPathRefused = 1414,       ///< the path cannot hold an index
    kEngineFailed = 1415,      ///< the search engine failed
    kReplyTooLarge = 1416,     ///< the result exceeds what one reply may hold: use "limit"
    kIndexMadeAnew = 1417,     ///< the index was found damaged or missing and is empty now: queue a
                               ///< reindex of the share, send "index_accept", then write
    kTooSlow = 1418,           ///< the query took longer than its "timeout", or the default
};

/// The fields of a document that code names. GetFileIndexMappings has all that are indexed in a way
/// of their own, GetMetadataKeys all that an extractor may add.
namespace field {

inline constexpr const char* kPath = "KESTOMDPath";  ///< the id
inline constexpr const char* kParent = "KESTOMDParent";
inline constexpr const char* kFSName = "KESTOMDFSName";
inline constexpr const char* kSearchFileName = "KESTOMDSearchFileName";
inline constexpr const char* kDisplayName = "KESTOMDDisplayName";
inline constexpr const char* kKind = "KESTOMDKind";
inline constexpr const char* kExtension = "KESTOMDExtension";
inline constexpr const char* kIsDir = "KESTOMDIsDir";
inline constexpr const char* kFSSize = "KESTOMDFSSize";
inline constexpr const char* kOwnerUserID = "KESTOMDOwnerUserID";
inline constexpr const char* kOwnerGroupID = "KESTOMDOwnerGroupID";
inline constexpr const char* kFSCreationDate = "KESTOMDFSCreationDate";
inline constexpr const char* kFSContentChangeDate = "KESTOMDFSContentChangeDate";
inline constexpr const char* kAttributeChangeDate = "KESTOMDAttributeChangeDate";
inline constexpr const char* kContentModificationDate = "KESTOMDContentModificationDate";
inline constexpr const char* kLastUsedDate = "KESTOMDLastUsedDate";
inline constexpr const char* kTextContent = "KESTOMDTextContent";
inline constexpr const char* kTitle = "KESTOMDTitle";
inline constexpr const char* kAuthors = "KESTOMDAuthors";
inline constexpr const char* kDescription = "KESTOMDDescription";
inline constexpr const char* kComment = "KESTOMDComment";
inline constexpr const char* kKeywords = "KESTOMDKeywords";

// The daemon keeps a field whose name begins with "@" as it is and returns it with hits, but never
// searches it.

/// The file as it was when it was read: inode, and the times of its last change of content and of
/// attributes in nanoseconds since the epoch. All integers.
inline constexpr const char* kInode = "@inode";
inline constexpr const char* kModifiedNs = "@modified_ns";
inline constexpr const char* kChangedNs = "@changed_ns";
/// Why the content that was wanted is not in the document, as a sentence; and whether that can
/// pass, so that another try makes sense.
inline constexpr const char* kContentError = "@content_error";
inline constexpr const char* kContentRetry = "@content_retry";

}  // namespace field

}  // namespace quivra::fileindex::elastic
