#include "tests/fake/fake_libc.h"

#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <optional>

namespace fake {
namespace {

using std::chrono::microseconds;

struct State {
    std::vector<std::string> log_lines;
    std::vector<microseconds> sleeps;
    std::function<void(microseconds)> on_sleep;
    std::optional<microseconds> now;  // since the epoch
};

class Locked {
  public:
    State* operator->() {
        static State* state = new State;  // outlives every thread that still logs at exit
        return state;
    }

  private:
    static inline std::mutex mutex_;
    std::lock_guard<std::mutex> lock_{mutex_};
};

void Sleep(microseconds duration) {
    std::function<void(microseconds)> action;
    {
        Locked state;
        state->sleeps.push_back(duration);
        if (state->now) {
            *state->now += duration;
        }
        action = state->on_sleep;
    }
    if (action) {
        action(duration);
    }
}

void Log(const char* format, va_list arguments) {
    const int saved_errno = errno;  // for %m, and for the caller
    char* line = nullptr;
    if (vasprintf(&line, format, arguments) >= 0) {
        Locked()->log_lines.emplace_back(line);
        std::free(line);
    }
    errno = saved_errno;
}

}  // namespace

void ResetLibc() {
    *Locked().operator->() = State();
}

std::vector<std::string> LogLines() {
    return Locked()->log_lines;
}

std::vector<std::string> LogLinesWith(const std::string& text) {
    std::vector<std::string> lines = LogLines();
    std::erase_if(lines, [&](const auto& line) { return line.find(text) == line.npos; });
    return lines;
}

std::vector<microseconds> Sleeps() {
    return Locked()->sleeps;
}

void OnSleep(std::function<void(microseconds)> action) {
    Locked()->on_sleep = std::move(action);
}

void SetTime(std::int64_t seconds) {
    Locked()->now = std::chrono::seconds(seconds);
}

}  // namespace fake

extern "C" {

void syslog(int /*priority*/, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    fake::Log(format, arguments);
    va_end(arguments);
}

// What a fortified build calls in the place of syslog.
void __syslog_chk(int /*priority*/, int /*flag*/, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    fake::Log(format, arguments);
    va_end(arguments);
}

unsigned int sleep(unsigned int seconds) {
    fake::Sleep(std::chrono::seconds(seconds));
    return 0;
}

int usleep(useconds_t duration) {
    fake::Sleep(std::chrono::microseconds(duration));
    return 0;
}

int nanosleep(const struct timespec* duration, struct timespec* /*remaining*/) {
    fake::Sleep(std::chrono::seconds(duration->tv_sec) +
                std::chrono::microseconds(duration->tv_nsec / 1000));
    return 0;
}

time_t time(time_t* out) noexcept {
    struct timespec real {};
    clock_gettime(CLOCK_REALTIME, &real);
    const auto fixed = fake::Locked()->now;
    const time_t now =
        fixed ? std::chrono::duration_cast<std::chrono::seconds>(*fixed).count() : real.tv_sec;
    if (out != nullptr) {
        *out = now;
    }
    return now;
}

}  // extern "C"
