#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

namespace fileindexd {

/// A request to the resident daemon: {"type": NAME, "data": ...}.
struct Command {
    enum class Type {
        kPause,
        kResume,
        kSettingChanged,
        kWorkerCreate,
        kWorkerDelete,
        kState,   ///< how the shares are
        kFailed,  ///< what could not be read
        kRetry,   ///< try that again
    };

    Type type = Type::kResume;
    std::string share;             ///< of all but kPause, kResume and kState
    std::int64_t resume_time = 0;  ///< of kPause; see quivra::fileindex::StatusMgr
};

/// Throws Error 120 for a text that is no command, with a reason for the client.
Command ParseCommand(const std::string& request);

/// {"success": true}
std::string SuccessReply();
/// {"success": true, "data": DATA}
std::string DataReply(const Json::Value& data);
/// {"success": false, "error": {"code": CODE, "msg": MESSAGE}}
std::string ErrorReply(int code, const std::string& message);

}  // namespace fileindexd
