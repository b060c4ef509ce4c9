#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Compose the path of a share's change queue (a file) and of its index (a directory) from the
/// share's root path. Negative when the buffer is too small or the place is not safe to use.
int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size);
int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size);

#ifdef __cplusplus
}
#endif
