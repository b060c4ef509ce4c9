#pragma once

namespace kesto {

/// Records the failure that <kesto/error.h> reports for this thread, with the caller's place, and
/// returns -1, so that a failing call reads `return SetError(code)`. Leaves errno alone.
int SetError(int code, const char* file = __builtin_FILE(), int line = __builtin_LINE());

}  // namespace kesto
