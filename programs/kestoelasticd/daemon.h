#pragma once

#include <string>

#include "programs/kestoelasticd/service.h"

namespace elasticd {

struct DaemonOptions {
    std::string socket = "/var/run/kestoelasticd.sock";
    ServiceOptions service;
};

/// Serves until SIGTERM or SIGINT; what is not committed then is dropped. Returns the process's
/// exit status; throws what opening the state directory and the socket does.
int RunDaemon(const DaemonOptions& options);

}  // namespace elasticd
