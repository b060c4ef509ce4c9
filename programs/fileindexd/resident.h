#pragma once

#include <functional>
#include <string>
#include <vector>

namespace fileindexd {

inline constexpr const char* kDaemonSocketPath = "/var/run/fileindexd.sock";

/// The resident daemon: serves its socket and supervises the workers until SIGTERM or SIGINT.
/// `worker_command` is the command line of a worker, to which the share's name is added. Throws
/// Error 506 when a daemon is running already, and what reading the configuration does.
void RunResident(const std::vector<std::string>& worker_command);

}  // namespace fileindexd
