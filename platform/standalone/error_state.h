#pragma once

#include <cerrno>

namespace kesto {

/// Records the failure that <kesto/error.h> reports for this thread, with the caller's place, and
/// answers -1, so that a failing call reads `return SetError(code)`. Leaves errno alone.
int SetError(int code, const char* file = __builtin_FILE(), int line = __builtin_LINE());

/// Gives errno its old value back at the end of a scope: a call that succeeds must not leave the
/// errno of a try that did not matter, which would turn up in the caller's next log line.
class KeepErrno {
  public:
    KeepErrno() = default;
    ~KeepErrno() { errno = saved_; }
    KeepErrno(const KeepErrno&) = delete;
    KeepErrno& operator=(const KeepErrno&) = delete;

  private:
    const int saved_ = errno;
};

}  // namespace kesto
