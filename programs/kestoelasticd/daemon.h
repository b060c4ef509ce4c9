#pragma once

#include <string>

#include "programs/kestoelasticd/service.h"

namespace elasticd {

struct DaemonOptions {
    std::string socket = "/var/run/kestoelasticd.sock";
    bool verbose = false;  ///< log to standard error, too
    ServiceOptions service;
};

/// Serves until SIGTERM or SIGINT; what is not committed then is dropped. The process's exit
/// status.
int RunDaemon(const DaemonOptions& options);

}  // namespace elasticd
