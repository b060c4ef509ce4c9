#pragma once

#include <stdexcept>
#include <string>

#include "common/export.h"

namespace quivra {

/// The one exception type that leaves the library. A copy carries the same code, reason and text.
class QUIVRA_EXPORT Error : public std::runtime_error {
  public:
    /// The numeric values are fixed: other programs compare them. Every other integer is a code
    /// that the search daemon reported, passed through as it stands.
    enum ErrorCode : int {
        kBadArgument = 120,         ///< a required value is missing or has the wrong type
        kSystemCallFailed = 502,    ///< a system or platform call failed
        kCredentialsFailed = 503,   ///< switching the effective user failed
        kLoadFailed = 504,          ///< a configuration file could not be loaded
        kSaveFailed = 505,          ///< a configuration file could not be saved
        kLockFailed = 506,          ///< an inter-process lock file could not be taken
        kNoSuchShare = 800,         ///< the platform does not know the share
        kTooManyFolders = 900,      ///< the list of indexed folders would exceed its maximum
        kDuplicateFolder = 901,     ///< an indexed folder with that path already exists
        kNoSuchFolder = 902,        ///< the requested indexed folder does not exist
        kPathNotIndexable = 903,    ///< the path may not be indexed
        kMalformedEvent = 906,      ///< a change-queue line is not JSON
        kChannelFailed = 913,       ///< the channel to the search daemon failed
        kParseFailed = 914,         ///< the content extraction of a file failed
        kQueryWithoutData = 916,    ///< a search-daemon query came back without a data array
        kSpaceNotEnough = 1003,     ///< the share's volume has no room for index work
        kDaemonOutOfMemory = 1400,  ///< the search daemon is short of memory: retried
        kDaemonBusy = 1401,         ///< the search daemon moves or compacts the index: retried
        kPathLookupFailed = 9999,   ///< a path is not a canonical absolute path
    };

    /// what() becomes "Quivra error, code=CODE" and, unless the reason is empty, ",
    /// reason=[REASON]".
    explicit Error(ErrorCode code, const std::string& reason = std::string());
    explicit Error(int code, const std::string& reason = std::string());

    ErrorCode code;      ///< may be any integer, see above
    std::string reason;  ///< empty when the thrower gave none
};

}  // namespace quivra
