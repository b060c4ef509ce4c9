#pragma once

#include <cstdint>
#include <string>

#include "common/error.h"
#include "common/export.h"

/// The one place that writes to the system log. Whatever a text holds, names of files included, a
/// line stays one line: control characters, bytes that are not valid UTF-8 and invisible characters
/// that change the direction of a text are written as escapes (\n, \x1b, \u202e).
namespace quivra {

namespace fileindex {

/// Debug lines are written only while this equals 7, the syslog debug priority. It starts at 7;
/// a host program may lower it at any time.
QUIVRA_EXPORT extern std::int32_t log_level;

/// The value of log_level at which debug lines are written.
inline constexpr std::int32_t kLogLevelDebug = 7;

}  // namespace fileindex

/// Where a log line comes from, "UNIT:LINE": a mark that leads to one place. Support tools search
/// for some of them; those are written out and keep their number when the code around them moves.
struct LogSite {
    const char* unit;  ///< the name of the source as it appears in the log
    int line;          ///< the line of the source, or a number that is fixed

    /// The source file and line of the call itself: LogError(LogSite::Here(), ...).
    static constexpr LogSite Here(const char* file = __builtin_FILE(),
                                  int line = __builtin_LINE()) {
        const char* name = file;
        for (; *file != '\0'; ++file) {
            name = *file == '/' ? file + 1 : name;
        }
        return {name, line};
    }
};

/// The name under which a source file logs where the file's own name will not do, because tools
/// know another one. Files that share a name begin at different thousands, so that a mark still
/// leads to one place.
struct LogUnit {
    const char* name;  ///< LogSite::unit
    int base;          ///< is added to the number of the line

    /// The place of the call itself.
    constexpr LogSite Here(int line = __builtin_LINE()) const { return {name, base + line}; }
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

/// Logs the failure of `condition` with the error's reason, then throws the error. For a condition
/// whose text in the log is given; else use QUIVRA_FAIL_IF.
[[noreturn]] QUIVRA_EXPORT void Fail(LogSite site, const char* condition, const Error& error);

/// The text of an errno value. Does not change errno.
QUIVRA_EXPORT std::string SystemErrorText(int error_number);

}  // namespace quivra

/// Where the condition holds, logs its own text with the error's reason and throws the error, which
/// is made only then. `unit` is a LogUnit.
#define QUIVRA_FAIL_IF(unit, condition, ...)                        \
    do {                                                            \
        if (condition) {                                            \
            ::quivra::Fail((unit).Here(), #condition, __VA_ARGS__); \
        }                                                           \
    } while (false)
