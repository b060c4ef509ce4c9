#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// Service control. 0, or negative on failure: KESTO_ERR_BAD_ARGUMENT for what cannot be a name,
/// KESTO_ERR_NOT_FOUND for a service that does not exist (to stop one succeeds),
/// KESTO_ERR_NOT_INSTALLED without a service manager, KESTO_ERR_COMMAND_FAILED when it fails. With
/// `wait` non-zero the call returns when the service has changed its state, else at once, without
/// learning how that went. Nothing is logged.
int KLIBServiceRestart(const char* name);
int KLIBServiceStart(const char* name, int wait);
int KLIBServiceStop(const char* name, int wait);

/// The mode in which package services are controlled.
#define KLIB_SERVICECTL_UPSTART 1

/// The same for a package's service; both wait. `mode` has no effect here.
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
