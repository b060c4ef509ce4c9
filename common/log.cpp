#include "common/log.h"

#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "base/text.h"

namespace quivra {

namespace fileindex {
std::int32_t log_level = kLogLevelDebug;
}

namespace {

std::string Format(const char* format, va_list arguments) {
    // Measured first, because lines hold whole requests; a fixed buffer would cut them.
    va_list measured;
    va_copy(measured, arguments);
    const int length = std::vsnprintf(nullptr, 0, format, measured);
    va_end(measured);
    if (length <= 0) {
        return std::string();
    }
    std::string text(static_cast<std::size_t>(length), '\0');
    std::vsnprintf(text.data(), text.size() + 1, format, arguments);
    return text;
}

}  // namespace

void LogError(LogSite site, const char* format, ...) {
    const int saved_errno = errno;
    va_list arguments;
    va_start(arguments, format);
    const std::string text = Format(format, arguments);
    va_end(arguments);
    const std::string tail =
        saved_errno == 0 ? std::string() : " [err: " + SystemErrorText(saved_errno) + "]";
    // A user's file name may hold line breaks: it must not pass for a line of its own.
    syslog(LOG_ERR, "%s:%d (%d, %u) %s", site.unit, site.line, getpid(), geteuid(),
           base::EscapeControl(text + tail).c_str());
    errno = 0;  // so that the next failure does not show this one's cause
}

void LogTrace(LogSite site, const char* format, ...) {
    const int saved_errno = errno;
    va_list arguments;
    va_start(arguments, format);
    const std::string text = Format(format, arguments);
    va_end(arguments);
    syslog(LOG_ERR, "%s:%d %s", site.unit, site.line, base::EscapeControl(text).c_str());
    errno = saved_errno;
}

void LogFailure(LogSite site, const char* condition, const std::string& reason) {
    LogError(site, "Failed [%s], reason: %s", condition, reason.c_str());
}

void Fail(LogSite site, const char* condition, const Error& error) {
    LogFailure(site, condition, error.reason);
    throw error;
}

std::string SystemErrorText(int error_number) {
    // Unlike strerror, safe for threads, and the same in every locale.
    const char* const text = strerrordesc_np(error_number);
    return text != nullptr ? text : "Unknown error " + std::to_string(error_number);
}

}  // namespace quivra
