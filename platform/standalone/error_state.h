#pragma once

namespace kesto {

/// Records the failure that <kesto/error.h> reports for this thread, and answers -1, so that a
/// failing call reads `return SetError(code, __FILE__, __LINE__)`. `file` must be a literal.
int SetError(int code, const char* file, int line);

}  // namespace kesto
