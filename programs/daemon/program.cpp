#include "programs/daemon/program.h"

#include <sys/stat.h>
#include <sys/time.h>
#include <syslog.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <cstdio>
#include <exception>

#include "common/log.h"

namespace quivra::daemon {

void AddOptions(CLI::App& app, CommonOptions& options) {
    app.add_flag("-v,--verbose", options.is_verbose, "Log in detail, also to standard error");
    if (!options.state_directory.empty()) {
        app.add_option("--state-dir", options.state_directory,
                       "Directory for what is remembered across runs")
            ->capture_default_str();
    }
}

std::optional<int> Parse(CLI::App& app, int argc, const char* const* argv) {
    try {
        app.parse(argc, argv);
        return std::nullopt;
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : 2;
    }
}

int RunProgram(const char* name, const CommonOptions& options, const std::function<int()>& body) {
    openlog(name, LOG_PID | (options.is_verbose ? LOG_PERROR : 0), LOG_DAEMON);
    fileindex::log_level = options.is_verbose ? fileindex::kLogLevelDebug : LOG_ERR;
    // Names and content of everybody's files go through these programs.
    umask(077);
    // A client that has gone is a failed write, not an end.
    std::signal(SIGPIPE, SIG_IGN);
    try {
        return body();
    } catch (const std::exception& error) {
        std::fprintf(stderr, "%s: %s\n", name, error.what());
        return 1;
    }
}

void EndAtLatest(std::chrono::milliseconds after) noexcept {
    struct sigaction action {};
    action.sa_handler = [](int) { _exit(0); };
    sigaction(SIGALRM, &action, nullptr);
    sigset_t alarm;
    sigemptyset(&alarm);
    sigaddset(&alarm, SIGALRM);
    pthread_sigmask(SIG_UNBLOCK, &alarm, nullptr);
    itimerval timer{};
    timer.it_value.tv_sec = after.count() / 1000;
    timer.it_value.tv_usec = after.count() % 1000 * 1000;
    setitimer(ITIMER_REAL, &timer, nullptr);
}

}  // namespace quivra::daemon
