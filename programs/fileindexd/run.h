#pragma once

#include <string>
#include <vector>

namespace fileindexd {

/// What the program was asked to be.
struct Options {
    std::vector<std::string> once;  ///< shares to process once
    std::string worker;             ///< the share of a worker process
    bool verbose = false;
};

/// A round over the shares of `once`, the worker of `worker`, or else the resident daemon. Returns
/// the exit status; failures are told on standard error.
int Run(const Options& options);

}  // namespace fileindexd
