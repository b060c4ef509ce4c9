#include <kesto/error.h>
#include <kesto/service.h>

#include <unistd.h>

#include <string>
#include <vector>

#include "base/file.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/run_program.h"

namespace {

/// Works with systemd and without.
constexpr const char* kServiceManager = "/usr/sbin/service";
/// Ends at once and leaves the program that it started behind.
constexpr const char* kDetacher = "/usr/bin/setsid";

constexpr const char* kSystemctl = "/usr/bin/systemctl";
/// There exactly where systemd runs the machine.
constexpr const char* kSystemdDirectory = "/run/systemd/system";
constexpr const char* kScripts = "/etc/init.d/";

/// Names become file names and arguments of scripts.
bool IsServiceName(const std::string& name) {
    constexpr const char* kAllowed =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_.@";
    return !name.empty() && name[0] != '-' && name[0] != '.' &&
           name.find_first_not_of(kAllowed) == name.npos;
}

/// Whether there is such a service. Asked first, because the manager's complaint about one that is
/// missing would come up on the caller's terminal or in its log, with each change of a folder.
bool Exists(const std::string& name) {
    const quivra::base::KeepErrno keep_errno;
    if (access(kSystemdDirectory, F_OK) != 0) {
        return access((kScripts + name).c_str(), X_OK) == 0;
    }
    std::string state;
    return kesto::RunProgram(kSystemctl, {"show", "--property=LoadState", "--value", name},
                             &state) != 0 ||
           state != "not-found\n";
}

int Control(const char* name, const std::string& action, bool wait) {
    if (name == nullptr || !IsServiceName(name)) {
        return kesto::SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    if (!Exists(name)) {
        // What does not exist has stopped.
        return action == "stop" ? 0 : kesto::SetError(KESTO_ERR_NOT_FOUND);
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
