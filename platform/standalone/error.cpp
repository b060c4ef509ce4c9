#include <kesto/error.h>

#include <cstring>

#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

struct ErrorState {
    int code = 0;
    const char* file = "";
    int line = 0;
};

/// One for each thread, as errno is: a caller asks after its own call, whatever others do
/// meanwhile.
thread_local ErrorState last_error;

}  // namespace

int SetError(int code, const char* file, int line) {
    // The path of the build machine tells nobody anything, and lines of the log are compared.
    const char* slash = std::strrchr(file, '/');
    last_error = {code, slash == nullptr ? file : slash + 1, line};
    return -1;
}

}  // namespace kesto

int KLIBCErrGet() {
    return kesto::last_error.code;
}

const char* KLIBCErrorGetFile() {
    return kesto::last_error.file;
}

int KLIBCErrorGetLine() {
    return kesto::last_error.line;
}
