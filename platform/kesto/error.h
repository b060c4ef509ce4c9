#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Details of the last failed platform call of the calling thread: its code, and the source file
/// and line that reported it. 0, "" and 0 while none has failed. The text lives as long as the
/// process.
int KLIBCErrGet(void);
const char* KLIBCErrorGetFile(void);
int KLIBCErrorGetLine(void);

#ifdef __cplusplus
}
#endif
