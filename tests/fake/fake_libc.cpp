#include "tests/fake/fake_libc.h"

#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <iterator>
#include <mutex>
#include <optional>

namespace fake {
namespace {

using std::chrono::microseconds;

struct State {
    std::mutex mutex;
    std::vector<std::string> log_lines;
    std::vector<microseconds> sleeps;
    std::function<void(microseconds)> on_sleep;
    std::optional<microseconds> now;  // since the epoch
};

State& GetState() {
    static State* state = new State;  // outlives every thread that still logs at exit
    return *state;
}

void Sleep(microseconds duration) {
    std::function<void(microseconds)> action;
    {
        State& state = GetState();
        const std::lock_guard lock(state.mutex);
        state.sleeps.push_back(duration);
        if (state.now) {
            *state.now += duration;
        }
        action = state.on_sleep;
    }
    if (action) {
        action(duration);
    }
}

void Log(const char* format, va_list arguments) {
    const int saved_errno = errno;
    va_list measured;
    va_copy(measured, arguments);
    const int length = std::vsnprintf(nullptr, 0, format, measured);
    va_end(measured);
    std::string line(static_cast<std::size_t>(std::max(length, 0)), '\0');
    errno = saved_errno;  // for %m
    std::vsnprintf(line.data(), line.size() + 1, format, arguments);
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    state.log_lines.push_back(line);
    errno = saved_errno;
}

}  // namespace

void ResetLibc() {
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    state.log_lines.clear();
    state.sleeps.clear();
    state.on_sleep = nullptr;
    state.now.reset();
}

std::vector<std::string> LogLines() {
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    return state.log_lines;
}

std::vector<std::string> LogLinesWith(const std::string& text) {
    std::vector<std::string> found;
    const std::vector<std::string> lines = LogLines();
    std::copy_if(lines.begin(), lines.end(), std::back_inserter(found),
                 [&](const std::string& line) { return line.find(text) != std::string::npos; });
    return found;
}

std::vector<microseconds> Sleeps() {
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    return state.sleeps;
}

void OnSleep(std::function<void(microseconds)> action) {
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    state.on_sleep = std::move(action);
}

void SetTime(std::int64_t seconds) {
    State& state = GetState();
    const std::lock_guard lock(state.mutex);
    state.now = std::chrono::seconds(seconds);
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
    time_t now = real.tv_sec;
    {
        fake::State& state = fake::GetState();
        const std::lock_guard lock(state.mutex);
        if (state.now) {
            now = std::chrono::duration_cast<std::chrono::seconds>(*state.now).count();
        }
    }
    if (out != nullptr) {
        *out = now;
    }
    return now;
}

}  // extern "C"
