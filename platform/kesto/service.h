#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Service control. Negative on failure: KESTO_ERR_NOT_INSTALLED without a service manager,
/// KESTO_ERR_COMMAND_FAILED when it refuses (no such service). With `wait` non-zero the call
/// returns when the service has changed its state, else at once, without learning how that went.
int KLIBServiceRestart(const char* name);
int KLIBServiceStart(const char* name, int wait);
int KLIBServiceStop(const char* name, int wait);

/// The mode in which package services are controlled.
#define KLIB_SERVICECTL_UPSTART 1

int KLIBServicectlStart(const char* name, int mode);
int KLIBServicectlStop(const char* name, int mode);

/// 1 when the file server's search integration is on, 0 when it is off, negative on failure (the
/// file server is not installed).
int KESTOSMBIsEnableSpotlight(void);

/// Switches the file server's search integration. Negative on failure.
int KESTOSMBSetSpotlight(int enable);

#ifdef __cplusplus
}
#endif
