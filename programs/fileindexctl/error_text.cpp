#include "programs/fileindexctl/error_text.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <string_view>

#include "fileindex/elastic/protocol.h"

namespace quivra::ctl {

namespace elastic = fileindex::elastic;

namespace {

/// Where the reason of an error tells more than the table can.
enum class Reason { kLeaveOut, kTell };

struct ErrorText {
    int code;
    const char* cause;
    const char* remedy;
    Reason reason;
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
              "check the space on the system volume", Reason::kTell},
    ErrorText{Error::kLockFailed, "another program holds the lock for too long",
              "try again when that one has ended", Reason::kLeaveOut},
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
    ErrorText{Error::kChannelFailed, "kestoelasticd is not running or does not reply",
              "start it with 'service kestoelasticd start'", Reason::kLeaveOut},
    ErrorText{Error::kParseFailed, "the file could not be read",
              "check that it exists and the disk is sound", Reason::kTell},
    ErrorText{Error::kQueryWithoutData, "kestoelasticd replied without data",
              "restart it with 'service kestoelasticd restart'", Reason::kLeaveOut},
    ErrorText{Error::kSpaceNotEnough, "there is no space left for the index",
              "free space on the share's volume", Reason::kTell},
    ErrorText{Error::kDaemonOutOfMemory, "kestoelasticd is short of memory",
              "try again in a few minutes", Reason::kTell},
    ErrorText{Error::kDaemonBusy, "kestoelasticd is moving or compacting the index",
              "try again in a few minutes", Reason::kTell},
    ErrorText{Error::kPathLookupFailed, "the path is not canonical",
              "give it absolute, without '.', '..', doubled or trailing '/'", Reason::kTell},
    ErrorText{elastic::kNoSuchIndex, "it has no index",
              "choose a folder of it with 'fileindexctl folder add'", Reason::kLeaveOut},
    ErrorText{elastic::kIndexExists, "its index belongs to another share",
              "'fileindexctl share clear' forgets one that is gone", Reason::kTell},
    ErrorText{elastic::kPaused, "its index is paused",
              "'fileindexctl share resume' goes on with it", Reason::kLeaveOut},
    ErrorText{elastic::kBadQuery, "kestoelasticd cannot follow the query",
              "see 'fileindexctl search --help'", Reason::kTell},
    ErrorText{elastic::kNoSpace, "the volume of the index is full", "free space there",
              Reason::kTell},
    ErrorText{elastic::kIndexUnavailable, "the files of its index are missing or unreadable",
              "check that its volume is mounted", Reason::kLeaveOut},
    ErrorText{elastic::kIndexMadeAnew, "its index was damaged or missing and is made anew",
              "'fileindexctl status' shows how far it is", Reason::kLeaveOut},
    ErrorText{elastic::kReplyTooLarge, "there are too many hits for one reply", "use --limit",
              Reason::kLeaveOut},
};

/// Code 502 stands for every system and platform call: what failed is told by the reason alone.
struct CallText {
    const char* reason_begins;
    ErrorText text;
};

constexpr const char* kIndexerAway = "fileindexd is not running or does not reply";
constexpr const char* kStartIndexer = "start it with 'service pkg-Quivra-fileindexd start'";

constexpr std::array kCallTexts = {
    CallText{"write failed, ",
             {Error::kSystemCallFailed, kIndexerAway, kStartIndexer, Reason::kLeaveOut}},
    CallText{"read failed, ",
             {Error::kSystemCallFailed, kIndexerAway, kStartIndexer, Reason::kLeaveOut}},
    CallText{"MonitorQueue::",
             {Error::kSystemCallFailed, "the registration with the file monitor cannot be saved",
              "check that /var/lib/kesto/monitor can be written and has space", Reason::kLeaveOut}},
    CallText{"FILEIDX",
             {Error::kSystemCallFailed, "the place of its queue and index cannot be used",
              "'fileindexctl status' tells what stands there", Reason::kLeaveOut}},
    CallText{"open failed, ",
             {Error::kLockFailed, "the lock file cannot be opened", "see the system log",
              Reason::kTell}},
};

const ErrorText* FindCall(const Error& error) {
    const auto* const it =
        std::find_if(kCallTexts.begin(), kCallTexts.end(), [&error](const CallText& call) {
            return error.code == call.text.code && error.reason.starts_with(call.reason_begins);
        });
    return it == kCallTexts.end() ? nullptr : &it->text;
}

const ErrorText* Find(int code) {
    const auto* const it =
        std::find_if(kErrorTexts.begin(), kErrorTexts.end(),
                     [code](const ErrorText& text) { return text.code == code; });
    return it == kErrorTexts.end() ? nullptr : it;
}

const ErrorText* Find(const Error& error) {
    const ErrorText* call = FindCall(error);
    return call == nullptr ? Find(static_cast<int>(error.code)) : call;
}

std::string Cause(const ErrorText* text, const Error& error) {
    constexpr std::string_view kDaemonSays = "Request failed, msg=";
    const std::string reason = error.reason.starts_with(kDaemonSays)
                                   ? error.reason.substr(kDaemonSays.size())
                                   : error.reason;
    if (text == nullptr) {
        return reason.empty() ? "kestoelasticd refused it" : reason;
    }
    const bool tells = text->reason == Reason::kTell && !reason.empty();
    return text->cause + (tells ? " (" + reason + ")" : std::string());
}

std::string Code(const Error& error) {
    return " [" + std::to_string(static_cast<int>(error.code)) + "]";
}

}  // namespace

std::string DescribeCause(const Error& error) {
    return Cause(Find(error), error) + Code(error);
}

std::string Reworded(const std::string& text) {
    constexpr std::string_view kBegin = "Quivra error, code=";
    constexpr std::string_view kReason = ", reason=[";
    int code = 0;
    if (!text.starts_with(kBegin)) {
        return text;
    }
    const char* const end = text.data() + text.size();
    const auto parsed = std::from_chars(text.data() + kBegin.size(), end, code);
    std::string reason(parsed.ptr, end);
    if (reason.starts_with(kReason) && reason.ends_with("]")) {
        reason = reason.substr(kReason.size(), reason.size() - kReason.size() - 1);
    }
    return DescribeCause(Error(code, reason));
}

std::string DescribeError(const std::string& doing, const Error& error) {
    const ErrorText* text = Find(error);
    return "cannot " + doing + ": " + Cause(text, error) + "; " +
           (text == nullptr ? "see the system log" : text->remedy) + Code(error);
}

bool IsIndexerAway(const Error& error) {
    const ErrorText* call = FindCall(error);
    return call != nullptr && call->cause == kIndexerAway;
}

bool HasErrorText(int code) {
    return Find(code) != nullptr;
}

}  // namespace quivra::ctl
