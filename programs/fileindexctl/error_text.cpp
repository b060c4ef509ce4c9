#include "programs/fileindexctl/error_text.h"

#include <algorithm>
#include <array>

#include "common/util.h"

namespace quivra::ctl {
namespace {

/// Where the reason of an error tells more than the table can.
enum class Reason { kLeaveOut, kTell };

struct ErrorText {
    int code;
    const char* cause;
    const char* remedy;
    Reason reason;
};

/// Codes of the search daemon that a user can do something about; docs/search-daemon.md has all.
enum SearchDaemonCode : int {
    kNoSuchIndex = 1404,
    kIndexExists = 1405,
    kIndexPaused = 1407,
    kBadQuery = 1410,
    kNoSpace = 1412,
    kIndexUnavailable = 1413,
    kReplyTooLarge = 1416,
};

/// Every code that the library throws of itself, then the search daemon's.
constexpr std::array kErrorTexts = {
    ErrorText{Error::kBadArgument, "a value is missing or wrong", "check the names and paths given",
              Reason::kTell},
    ErrorText{Error::kSystemCallFailed, "a system call failed", "see the system log",
              Reason::kTell},
    ErrorText{Error::kCredentialsFailed, "the rights of root could not be taken",
              "run the command as root", Reason::kTell},
    ErrorText{Error::kLoadFailed, "a configuration file is damaged",
              "repair it, or move it away to start without it", Reason::kTell},
    ErrorText{Error::kSaveFailed, "a configuration file could not be written",
              "run the command as root and check the space on the system volume", Reason::kTell},
    ErrorText{Error::kLockFailed, "another program holds the lock for too long",
              "try again later, as root", Reason::kTell},
    ErrorText{Error::kNoSuchShare, "no share has that name or holds that path",
              "see 'fileindexctl share list' for the shares of /etc/kesto/shares.conf",
              Reason::kLeaveOut},
    ErrorText{Error::kTooManyFolders, "the limit of 1000 indexed folders is reached",
              "delete some, or index a folder above them", Reason::kLeaveOut},
    ErrorText{Error::kDuplicateFolder, "it is already indexed",
              "use 'fileindexctl folder set' to change it", Reason::kLeaveOut},
    ErrorText{Error::kNoSuchFolder, "it is not among the indexed folders",
              "see 'fileindexctl folder list' for them", Reason::kLeaveOut},
    ErrorText{Error::kPathNotIndexable, "it may not be indexed",
              "'fileindexctl why' tells the reason", Reason::kLeaveOut},
    ErrorText{Error::kMalformedEvent, "the change queue holds a damaged line",
              "it is skipped when the queue is processed; try again then", Reason::kTell},
    ErrorText{Error::kChannelFailed, "the search daemon does not answer",
              "run this as root, and start the daemon with 'service kestoelasticd start'",
              Reason::kTell},
    ErrorText{Error::kParseFailed, "the file could not be read",
              "check that it exists and the disk is sound", Reason::kTell},
    ErrorText{Error::kQueryWithoutData, "the search daemon answered without data",
              "restart it with 'service kestoelasticd restart'", Reason::kTell},
    ErrorText{Error::kSpaceNotEnough, "there is no space left for the index",
              "free space on the share's volume", Reason::kTell},
    ErrorText{Error::kDaemonOutOfMemory, "the search daemon is short of memory",
              "try again in a few minutes", Reason::kTell},
    ErrorText{Error::kDaemonBusy, "the search daemon is moving or compacting the index",
              "try again in a few minutes", Reason::kTell},
    ErrorText{Error::kPathLookupFailed, "the path is not canonical",
              "give it absolute, without '.', '..', doubled or trailing '/'", Reason::kTell},
    ErrorText{kNoSuchIndex, "it has no index",
              "choose a folder of it with 'fileindexctl folder add'", Reason::kLeaveOut},
    ErrorText{kIndexExists, "its index belongs to another share",
              "'fileindexctl share clear' forgets one that is gone", Reason::kTell},
    ErrorText{kIndexPaused, "its index is paused", "'fileindexctl share resume' goes on with it",
              Reason::kLeaveOut},
    ErrorText{kBadQuery, "the search daemon cannot follow the query",
              "see 'fileindexctl search --help'", Reason::kTell},
    ErrorText{kNoSpace, "the volume of the index is full", "free space there", Reason::kTell},
    ErrorText{kIndexUnavailable, "the files of its index are missing or unreadable",
              "check that its volume is mounted", Reason::kTell},
    ErrorText{kReplyTooLarge, "there are too many hits for one answer", "use --limit",
              Reason::kLeaveOut},
};

constexpr ErrorText kIndexerAway = {
    Error::kSystemCallFailed, "the indexing daemon does not answer",
    "run this as root, and start the daemon with 'service pkg-Quivra-fileindexd start'",
    Reason::kTell};

/// The channel to the indexing daemon shares its code with system calls; its reasons are its own.
bool IsIndexerAway(const Error& error) {
    return error.code == Error::kSystemCallFailed &&
           (StringStartWith(error.reason, "write failed, ") ||
            StringStartWith(error.reason, "read failed, "));
}

const ErrorText* Find(int code) {
    const auto* const it =
        std::find_if(kErrorTexts.begin(), kErrorTexts.end(),
                     [code](const ErrorText& text) { return text.code == code; });
    return it == kErrorTexts.end() ? nullptr : it;
}

}  // namespace

std::string DescribeError(const std::string& doing, const Error& error) {
    const ErrorText* text = IsIndexerAway(error) ? &kIndexerAway : Find(error.code);
    std::string sentence = "cannot " + doing + ": ";
    if (text == nullptr) {
        sentence += error.reason.empty() ? "the search daemon refused it" : error.reason;
        sentence += "; see the search daemon's log";
    } else {
        sentence += text->cause;
        if (text->reason == Reason::kTell && !error.reason.empty()) {
            sentence += " (" + error.reason + ")";
        }
        sentence += std::string("; ") + text->remedy;
    }
    return sentence + " [" + std::to_string(static_cast<int>(error.code)) + "]";
}

bool HasErrorText(int code) {
    return Find(code) != nullptr;
}

}  // namespace quivra::ctl
