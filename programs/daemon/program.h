#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>

namespace CLI {
class App;
}

/// What the mains of all daemons share.
namespace quivra::daemon {

struct CommonOptions {
    bool is_verbose = false;           ///< debug lines, and all lines on standard error too
    std::string state_directory = "";  ///< empty: the program keeps none
};

/// Adds "-v, --verbose" and, where `options` names a state directory (its default), "--state-dir".
/// `options` must outlive the parsing.
void AddOptions(CLI::App& app, CommonOptions& options);

/// Parses the command line. When it asks for help, or is wrong, the text has been printed and the
/// result is the exit status: 0 or 2.
std::optional<int> Parse(CLI::App& app, int argc, const char* const* argv);

/// Runs the program: opens the system log under its name, makes new files private to the user
/// (umask 077) and ignores SIGPIPE, then calls `body`. Returns its exit status; an exception that
/// leaves it is told on standard error, and the status is 1. To be called before any thread starts.
int RunProgram(const char* name, const CommonOptions& options, const std::function<int()>& body);

/// Ends the process with status 0 after that time, whatever its threads still do. For programs that
/// may be killed at any moment: a stop signal is obeyed within a second even while one waits for a
/// disk that does not answer. Takes SIGALRM. May be called in a signal handler.
void EndAtLatest(std::chrono::milliseconds after) noexcept;

/// How long a daemon that was told to stop may take before EndAtLatest: less than a second, with
/// some room for a loaded machine.
inline constexpr std::chrono::milliseconds kStopGrace{800};

}  // namespace quivra::daemon
