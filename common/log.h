#pragma once

#include <cstdint>
#include <string>

#include "common/error.h"
#include "common/export.h"

namespace quivra {

namespace fileindex {

/// Debug lines are written only while this equals 7, the syslog debug priority. It starts at 7;
/// a host program may lower it at any time.
QUIVRA_EXPORT extern std::int32_t log_level;

/// The value of log_level at which debug lines are written.
inline constexpr std::int32_t kLogLevelDebug = 7;

}  // namespace fileindex

/// Where a log line comes from: the name of the source unit ("optree") and a line number. Support
/// tools search for these marks, so a site keeps its number when the code around it moves.
struct LogSite {
    const char* unit;
    int line;
};

/// Writes "UNIT:LINE (PID, EUID) TEXT" to the system log at error priority, TEXT being made as by
/// printf. When errno is set, " [err: <its text>]" is appended and errno is reset to 0.
QUIVRA_EXPORT void LogError(LogSite site, const char* format, ...)
    __attribute__((format(printf, 2, 3)));

/// Writes "UNIT:LINE TEXT" to the system log at error priority; errno is neither shown nor changed.
QUIVRA_EXPORT void LogTrace(LogSite site, const char* format, ...)
    __attribute__((format(printf, 2, 3)));

/// Writes the failure line "Failed [CONDITION], reason: REASON" as LogError does.
QUIVRA_EXPORT void LogFailure(LogSite site, const char* condition, const std::string& reason);

/// Logs the failure of `condition` with the error's reason, then throws the error.
[[noreturn]] QUIVRA_EXPORT void Fail(LogSite site, const char* condition, const Error& error);

/// The text of an errno value. Does not change errno.
QUIVRA_EXPORT std::string SystemErrorText(int error_number);

}  // namespace quivra
