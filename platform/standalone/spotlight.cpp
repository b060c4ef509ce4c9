#include <kesto/error.h>
#include <kesto/service.h>

#include <algorithm>
#include <string>
#include <vector>

#include "platform/standalone/error_state.h"
#include "platform/standalone/run_program.h"

namespace {

/// Samba's own tools: one prints the configuration in force, the other changes the part of it that
/// lies in the registry.
constexpr const char* kTestParm = "/usr/bin/testparm";
constexpr const char* kNet = "/usr/bin/net";
constexpr const char* kParameter = "spotlight";

/// 0, or -1 with the error set when the tool is missing or reports a failure.
int RunTool(const char* program, const std::vector<std::string>& arguments,
            std::string* output = nullptr) {
    const int status = kesto::RunProgram(program, arguments, output);
    return status <= 0 ? status : kesto::SetError(KESTO_ERR_COMMAND_FAILED);
}

}  // namespace

int KESTOSMBIsEnableSpotlight() {
    std::string value;
    const std::vector<std::string> arguments{"--suppress-prompt",
                                             std::string("--parameter-name=") + kParameter};
    const int result = RunTool(kTestParm, arguments, &value);
    return result < 0 ? result : value.starts_with("Yes");
}

int KESTOSMBSetSpotlight(int enable) {
    if (RunTool(kNet, {"conf", "setparm", "global", kParameter, enable != 0 ? "yes" : "no"}) < 0) {
        return -1;
    }
    // Without "include = registry" in smb.conf Samba takes the setting and does not use it.
    const int enabled = KESTOSMBIsEnableSpotlight();
    return enabled < 0 || enabled == (enable != 0) ? std::min(enabled, 0)
                                                   : kesto::SetError(KESTO_ERR_COMMAND_FAILED);
}
