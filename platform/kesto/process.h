#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Runs a program with the given arguments (char*, closed by a null pointer; the program's own name
/// is not among them), without a shell and without inherited descriptors beyond the standard three,
/// and waits for it. The exit status, or negative when it could not be started or was killed.
/// `flags` is the platform's own and has no effect here.
int KLIBCExecl(const char* program, int flags, ...);

/// The same with an array of arguments that a null pointer closes.
int KLIBCExec(const char* program, const char* const* argv);

#ifdef __cplusplus
}
#endif
