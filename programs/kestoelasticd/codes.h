#pragma once

namespace elasticd {

/// The codes that failed requests are answered with. The values are fixed: clients compare them.
/// docs/search-daemon.md has the same table.
enum Code : int {
    kOutOfMemory = 1400,       ///< memory is short; try again later
    kBusy = 1401,              ///< the index is being moved or compacted; try again later
    kBadRequest = 1402,        ///< no JSON object, or a member is missing or of the wrong type
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
};

}  // namespace elasticd
