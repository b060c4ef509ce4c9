#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Compose the path of a share's change queue (a file) and of its index (a directory) from the
/// share's root path. Where the root exists, the directory that holds both is made when it is
/// missing: mode 0700, owned by the effective user, never through a symbolic link. Where it does
/// not exist or cannot be written, the path is composed all the same.
/// Negative when the buffer is too small, or with KESTO_ERR_UNSAFE_PLACE when a link, a file or a
/// directory of another user stands where that directory belongs.
int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size);
int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size);

#ifdef __cplusplus
}
#endif
