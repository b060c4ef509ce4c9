#pragma once

#include <string>
#include <vector>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

/// Parses the arguments (without the program's name), runs the command and returns the exit
/// status. Whatever goes wrong becomes one sentence on the session's error stream; nothing is
/// thrown.
int Run(const std::vector<std::string>& arguments, Session& session);

}  // namespace quivra::ctl
