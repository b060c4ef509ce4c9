#include <kesto/error.h>
#include <kesto/service.h>

#include <algorithm>
#include <cctype>
#include <string>
#include <vector>

#include "platform/standalone/error_state.h"
#include "platform/standalone/run_program.h"

namespace {

/// Works with systemd and without.
constexpr const char* kServiceManager = "/usr/sbin/service";
/// Ends at once and leaves the program that it started behind.
constexpr const char* kDetacher = "/usr/bin/setsid";

/// Names become file names and arguments of scripts.
bool IsServiceName(const std::string& name) {
    return !name.empty() && name[0] != '-' && name[0] != '.' &&
           std::all_of(name.begin(), name.end(), [](unsigned char c) {
               return std::isalnum(c) != 0 || c == '-' || c == '_' || c == '.' || c == '@';
           });
}

int Control(const char* name, const char* action, bool wait) {
    if (name == nullptr || !IsServiceName(name)) {
        return kesto::SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    const std::vector<std::string> arguments{name, action};
    const std::vector<std::string> detached{"--fork", kServiceManager, name, action};
    const int status = wait ? kesto::RunProgram(kServiceManager, arguments)
                            : kesto::RunProgram(kDetacher, detached);
    return status <= 0 ? status : kesto::SetError(KESTO_ERR_COMMAND_FAILED);
}

}  // namespace

int KLIBServiceRestart(const char* name) {
    return Control(name, "restart", true);
}

int KLIBServiceStart(const char* name, int wait) {
    return Control(name, "start", wait != 0);
}

int KLIBServiceStop(const char* name, int wait) {
    return Control(name, "stop", wait != 0);
}

int KLIBServicectlStart(const char* name, int /*mode*/) {
    return Control(name, "start", true);
}

int KLIBServicectlStop(const char* name, int /*mode*/) {
    return Control(name, "stop", true);
}
