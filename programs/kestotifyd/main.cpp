#include <signal.h>
#include <syslog.h>

#include <cstdio>
#include <exception>

#include "common/log.h"
#include "programs/kestotifyd/monitor.h"
#include "programs/kestotifyd/options.h"

int main(int argc, char** argv) {
    int status = 0;
    const auto options = kestotifyd::ParseOptions(argc, argv, status);
    if (!options) {
        return status;
    }
    openlog("kestotifyd", LOG_PID | (options->is_verbose ? LOG_PERROR : 0), LOG_DAEMON);
    quivra::fileindex::log_level =
        options->is_verbose ? quivra::fileindex::kLogLevelDebug : LOG_ERR;

    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    sigprocmask(SIG_BLOCK, &signals, nullptr);  // read by the monitor's loop
    signal(SIGPIPE, SIG_IGN);
    try {
        kestotifyd::Monitor(*options).Run();
    } catch (const std::exception& error) {
        std::fprintf(stderr, "kestotifyd: %s\n", error.what());
        return 1;
    }
    return 0;
}
