#include <kesto/error.h>
#include <kesto/service.h>

#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/operations/steps.h"

namespace quivra::fileindex {
namespace {

constexpr const char* kFileServer = "samba";
constexpr const char* kExtractor = "kestocontentextractd";
constexpr const char* kIndexer = "pkg-Quivra-fileindexd";

/// Whether the call succeeded; a failure is logged with the platform's details.
bool LogPlatformFailure(const char* call, int result) {
    if (result >= 0) {
        return true;
    }
    LogError(unit::kServices.Here(), "%s failed: err=[0x%04X %s:%d]", call,
             static_cast<unsigned int>(KLIBCErrGet()), KLIBCErrorGetFile(), KLIBCErrorGetLine());
    return false;
}

void LogServiceFailure(const char* condition, int result) {
    if (result < 0) {
        LogError(unit::kServices.Here(), "Failed [%s]", condition);
    }
}

/// The file server reads the switch when it starts.
void SwitchSearchIntegration(bool enable) {
    const int enabled = KESTOSMBIsEnableSpotlight();
    if (!LogPlatformFailure("KESTOSMBIsEnableSpotlight", enabled) || (enabled != 0) == enable) {
        return;
    }
    if (LogPlatformFailure("KESTOSMBSetSpotlight", KESTOSMBSetSpotlight(enable ? 1 : 0))) {
        LogPlatformFailure("KLIBServiceRestart", KLIBServiceRestart(kFileServer));
    }
}

}  // namespace

void SwitchServices(bool enable) {
    SwitchSearchIntegration(enable);
    if (enable) {
        LogServiceFailure("0 > KLIBServiceStart(\"kestocontentextractd\", TRUE)",
                          KLIBServiceStart(kExtractor, 1));
        LogServiceFailure(
            "0 > KLIBServicectlStart(\"pkg-Quivra-fileindexd\", KLIB_SERVICECTL_UPSTART)",
            KLIBServicectlStart(kIndexer, KLIB_SERVICECTL_UPSTART));
    } else {
        LogServiceFailure("0 > KLIBServiceStop(\"kestocontentextractd\", FALSE)",
                          KLIBServiceStop(kExtractor, 0));
        LogServiceFailure(
            "0 > KLIBServicectlStop(\"pkg-Quivra-fileindexd\", KLIB_SERVICECTL_UPSTART)",
            KLIBServicectlStop(kIndexer, KLIB_SERVICECTL_UPSTART));
    }
}

void PrepareServices() {
    SwitchServices(!FolderMgr().GetFolders().empty());
}

}  // namespace quivra::fileindex
