#include <kesto/error.h>
#include <kesto/process.h>
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

constexpr const char* kNotifyTool = "/usr/kesto/bin/kestokosnotify";
constexpr const char* kApplication = "KESTO.Quivra.Application";
constexpr const char* kRecipients = "@administrators";
constexpr const char* kTitleKey = "app:displayname";
constexpr int kExecFlags = 187;

/// The end marker of an argument list.
constexpr const char* kEnd = nullptr;

/// Whether the call succeeded; a failure is logged with the platform's details.
bool LogPlatformFailure(LogSite site, const char* call, int result) {
    if (result >= 0) {
        return true;
    }
    LogError(site, "%s failed: err=[0x%04X %s:%d]", call, static_cast<unsigned int>(KLIBCErrGet()),
             KLIBCErrorGetFile(), KLIBCErrorGetLine());
    return false;
}

void LogServiceFailure(LogSite site, const char* condition, int result) {
    if (result < 0) {
        LogError(site, "Failed [%s]", condition);
    }
}

/// The file server reads the switch when it starts.
void SwitchSearchIntegration(bool enable) {
    const int enabled = KESTOSMBIsEnableSpotlight();
    if (!LogPlatformFailure(unit::kServices.Here(), "KESTOSMBIsEnableSpotlight", enabled) ||
        (enabled != 0) == enable) {
        return;
    }
    if (LogPlatformFailure(unit::kServices.Here(), "KESTOSMBSetSpotlight",
                           KESTOSMBSetSpotlight(enable ? 1 : 0))) {
        LogPlatformFailure(unit::kServices.Here(), "KLIBServiceRestart",
                           KLIBServiceRestart(kFileServer));
    }
}

}  // namespace

void SwitchServices(bool enable) {
    SwitchSearchIntegration(enable);
    if (enable) {
        LogServiceFailure(unit::kServices.Here(),
                          "0 > KLIBServiceStart(\"kestocontentextractd\", TRUE)",
                          KLIBServiceStart(kExtractor, 1));
        LogServiceFailure(
            unit::kServices.Here(),
            "0 > KLIBServicectlStart(\"pkg-Quivra-fileindexd\", KLIB_SERVICECTL_UPSTART)",
            KLIBServicectlStart(kIndexer, KLIB_SERVICECTL_UPSTART));
    } else {
        LogServiceFailure(unit::kServices.Here(),
                          "0 > KLIBServiceStop(\"kestocontentextractd\", FALSE)",
                          KLIBServiceStop(kExtractor, 0));
        LogServiceFailure(
            unit::kServices.Here(),
            "0 > KLIBServicectlStop(\"pkg-Quivra-fileindexd\", KLIB_SERVICECTL_UPSTART)",
            KLIBServicectlStop(kIndexer, KLIB_SERVICECTL_UPSTART));
    }
}

void PrepareServices() {
    SwitchServices(!FolderMgr().GetFolders().empty());
}

int SendKOSNotify() {
    return KLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, "-b", "true", "-e", "false",
                      kRecipients, kTitleKey, "error:index_no_space",
                      "<a data-kesto-app=\"KESTO.Quivra.Application\" "
                      "data-kesto-fn=\"preference\">",
                      "</a>", kEnd);
}

int NotifyLackOfMemory() {
    return KLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, kRecipients, kTitleKey,
                      "error:lack_of_memory", kEnd);
}

}  // namespace quivra::fileindex
