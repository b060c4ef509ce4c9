#include "programs/kestoelasticd/daemon.h"

#include <malloc.h>
#include <sys/resource.h>

#include "programs/daemon/frame_server.h"

namespace elasticd {
namespace {

/// Clients that change one index wait for each other, and a search may take seconds: enough workers
/// keep the others' requests moving.
constexpr unsigned int kWorkers = 32;

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
    const quivra::daemon::Signals signals;
    quivra::daemon::ServiceManager manager;
    RaiseDescriptorLimit();
    // Any worker may get the next request: an arena for each would keep as many times the memory.
    mallopt(M_ARENA_MAX, 2);
    Service service(options.service);
    quivra::daemon::FrameServerOptions server_options;
    server_options.path = options.socket;
    server_options.workers = kWorkers;
    quivra::daemon::FrameServer server(
        server_options, [&](const std::string& request) { return service.Handle(request); });
    server.RunMain(signals, manager);
    return 0;
}

}  // namespace elasticd
