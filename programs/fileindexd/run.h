#pragma once

#include <string>
#include <vector>

#include "programs/daemon/program.h"

namespace fileindexd {

/// What the program was asked to be.
struct Options {
    std::vector<std::string> once;  ///< shares to process once
    std::string worker;             ///< the share of a worker process
    quivra::daemon::CommonOptions common;
};

/// A round over the shares of `once`, the worker of `worker`, or else the resident daemon. Returns
/// the exit status; throws what keeps the daemon from running.
int Run(const Options& options);

}  // namespace fileindexd
