#include "programs/kestoelasticd/daemon.h"

#include <sys/resource.h>
#include <syslog.h>

#include <csignal>
#include <cstdio>
#include <exception>

#include "programs/support/frame_server.h"

namespace elasticd {
namespace {

/// Clients of one index wait for each other; enough workers keep the others' requests moving.
constexpr unsigned int kWorkers = 16;

support::FrameServer* signalled_server = nullptr;

void HandleSignals(support::FrameServer& server) {
    signalled_server = &server;
    struct sigaction stop {};
    stop.sa_handler = [](int) { signalled_server->Stop(); };
    sigaction(SIGTERM, &stop, nullptr);
    sigaction(SIGINT, &stop, nullptr);
    std::signal(SIGPIPE, SIG_IGN);
}

/// An index in use takes some thirty descriptors; shares may be many.
void RaiseDescriptorLimit() {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        limit.rlim_cur = limit.rlim_max;
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

}  // namespace

int RunDaemon(const DaemonOptions& options) {
    openlog("kestoelasticd", LOG_PID | (options.verbose ? LOG_PERROR : 0), LOG_DAEMON);
    RaiseDescriptorLimit();
    try {
        Service service(options.service);
        support::FrameServerOptions server_options;
        server_options.path = options.socket;
        server_options.workers = kWorkers;
        support::FrameServer server(
            server_options, [&](const std::string& request) { return service.Handle(request); });
        HandleSignals(server);
        server.Run();
        std::signal(SIGTERM, SIG_IGN);
        std::signal(SIGINT, SIG_IGN);
        return 0;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "kestoelasticd: %s\n", error.what());
        return 1;
    }
}

}  // namespace elasticd
