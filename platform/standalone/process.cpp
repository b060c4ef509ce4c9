#include <kesto/process.h>

#include <cstdarg>

#include "platform/standalone/run_program.h"

// The flags choose the platform's own execution environment (identity, log), which an ordinary
// machine does not have; the library always gives 187.
int KLIBCExecl(const char* program, int flags, ...) {
    std::vector<std::string> arguments;
    va_list list;
    va_start(list, flags);
    while (const char* argument = va_arg(list, const char*)) {
        arguments.emplace_back(argument);
    }
    va_end(list);
    return kesto::RunProgram(program, arguments);
}

int KLIBCExec(const char* program, const char* const* argv) {
    std::vector<std::string> arguments;
    for (; *argv != nullptr; ++argv) {
        arguments.emplace_back(*argv);
    }
    return kesto::RunProgram(program, arguments);
}
