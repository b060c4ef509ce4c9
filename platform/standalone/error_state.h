#pragma once

#include <source_location>

namespace kesto {

/// Records the failure that <kesto/error.h> reports for this thread, with the caller's place, and
/// answers -1, so that a failing call reads `return SetError(code)`. Leaves errno alone.
int SetError(int code, std::source_location where = std::source_location::current());

}  // namespace kesto
