#pragma once

#include <string>
#include <vector>

namespace kesto {

/// Runs a program by its path with exactly these arguments (its own name not among them), no shell,
/// default signal handling and no descriptors but the standard three, and waits for it. With
/// `output` its standard output is collected there, up to 64 KiB, the rest being dropped.
/// The exit status, or -1 with the error set: KESTO_ERR_NOT_INSTALLED when there is no such
/// program, KESTO_ERR_SYSTEM when it could not be started, KESTO_ERR_COMMAND_FAILED when a signal
/// ended it. Works whatever the caller does about SIGCHLD, from any thread.
int RunProgram(const std::string& program, const std::vector<std::string>& arguments,
               std::string* output = nullptr);

}  // namespace kesto
