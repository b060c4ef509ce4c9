#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Codes that KLIBCErrGet returns. The values are fixed: log lines carry them.
#define KESTO_ERR_SYSTEM 0x0100           /* a system call failed; errno says which way */
#define KESTO_ERR_BAD_ARGUMENT 0x0200     /* a null pointer, an empty or malformed name */
#define KESTO_ERR_BUFFER_TOO_SMALL 0x0300 /* the result does not fit the caller's buffer */
#define KESTO_ERR_NOT_FOUND 0x0400        /* not in the list that was searched */
#define KESTO_ERR_NO_SUCH_SHARE 0x1400    /* no share of that name, or none at that path */
#define KESTO_ERR_NO_SUCH_USER 0x1500     /* neither by that name nor by that id */
#define KESTO_ERR_UNSAFE_PLACE 0x1600     /* a link or somebody else's directory is in the way */
#define KESTO_ERR_NOT_INSTALLED 0x1700    /* the program that would do it is missing */
#define KESTO_ERR_COMMAND_FAILED 0x1800   /* it ran and reported a failure */
#define KESTO_ERR_VOLUME_FULL 0x2400      /* no room on the volume */
#define KESTO_ERR_QUOTA_EXCEEDED 0x2900   /* no room within the user's quota */

/// The code of the last failed platform call of the calling thread; 0 while none has failed. A call
/// that succeeds leaves it as it is.
int KLIBCErrGet(void);

/// The source file that reported that failure, "" while there was none. The text lives as long as
/// the process.
const char* KLIBCErrorGetFile(void);

/// The line in that file; 0 while there was no failure.
int KLIBCErrorGetLine(void);

#ifdef __cplusplus
}
#endif
