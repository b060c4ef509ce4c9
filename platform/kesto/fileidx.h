#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Compose the path of a share's change queue (a file) and of its index (a directory) from the
/// share's root path. Where the root exists, the directory that holds both is made when it is
/// missing: mode 0700, owned by the effective user, never through a symbolic link. Where it does
/// not exist or cannot be written, the path is composed all the same.
/// Negative when the buffer is too small, or with KESTO_ERR_UNSAFE_PLACE when a link, a file or a
/// directory that other users own or may write to stands where that directory belongs; that is
/// logged once. Any thread may call. The path is for show and for opening the directory anew: what
/// it leads to may be another directory in the next moment.
int FILEIDXQueuePathCompose(const char* share_path, char* out, int out_size);
int FILEIDXDBPathCompose(const char* share_path, char* out, int out_size);

/// Tells in one sentence what stands in the way of the share's directory and what to do about it
/// ("PATH is not a directory; remove it"): for programs to show behind KESTO_ERR_UNSAFE_PLACE. An
/// addition of the stand-alone platform that the library does not call. 1 with the sentence, 0 with
/// an empty text when nothing is in the way, negative when the buffer is too small.
int FILEIDXProblem(const char* share_path, char* out, int out_size);

#ifdef __cplusplus
}
#endif
