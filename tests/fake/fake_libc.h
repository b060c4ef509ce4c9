#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <vector>

/// Takes the place of the C library's clock, sleeps and system log in the test program and in the
/// libraries that it loads. Linking the library `fake_libc` is all it takes.
namespace fake {

/// Back to the initial state: no log lines, no sleeps, the real clock.
void ResetLibc();

/// The lines given to syslog since the last reset, with %m expanded, oldest first. Safe to call
/// while other threads log.
std::vector<std::string> LogLines();

/// The lines that contain `text`.
std::vector<std::string> LogLinesWith(const std::string& text);

/// The sleeps asked for since the last reset (sleep, usleep, nanosleep). None takes real time; a
/// fixed clock moves on by each.
std::vector<std::chrono::microseconds> Sleeps();

/// Called in the place of each sleep, for a test that wants something to happen meanwhile.
void OnSleep(std::function<void(std::chrono::microseconds)> action);

/// Stops the clock that time() reads at that many seconds since the epoch.
void SetTime(std::int64_t seconds);

}  // namespace fake
