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

thread_local ErrorState last_error;

}  // namespace

int SetError(int code, std::source_location where) {
    const char* slash = std::strrchr(where.file_name(), '/');
    last_error = {code, slash == nullptr ? where.file_name() : slash + 1,
                  static_cast<int>(where.line())};
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
