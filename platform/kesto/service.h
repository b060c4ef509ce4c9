#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Service control. Negative on failure, with the details in <kesto/error.h>. With `wait` non-zero
/// the call returns when the service has changed its state.
int KLIBServiceRestart(const char* name);
int KLIBServiceStart(const char* name, int wait);
int KLIBServiceStop(const char* name, int wait);

/// The mode in which package services are controlled.
#define KLIB_SERVICECTL_UPSTART 1

int KLIBServicectlStart(const char* name, int mode);
int KLIBServicectlStop(const char* name, int mode);

/// 1 when the file server's search integration is on, 0 when it is off, negative on failure.
int KESTOSMBIsEnableSpotlight(void);

/// Switches the file server's search integration. Negative on failure.
int KESTOSMBSetSpotlight(int enable);

#ifdef __cplusplus
}
#endif
