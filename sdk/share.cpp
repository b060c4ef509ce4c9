#include "sdk/share.h"

#include <kesto/error.h>
#include <kesto/fileidx.h>
#include <kesto/filesystem.h>

#include <algorithm>
#include <array>

#include "common/error.h"
#include "common/log.h"
#include "common/mutex.h"
#include "sdk/credentials.h"

namespace quivra {
namespace sdk {
namespace {

constexpr LogUnit kLog{"share", 0};

constexpr unsigned long long kSpaceNeeded = 100ULL << 20;

/// Shares that are never indexed, whatever their flags.
constexpr std::array<const char*, 2> kExcludedShares{"surveillance", "NetBackup"};

[[noreturn]] void FailCall(LogSite site, const char* condition, const std::string& reason) {
    Fail(site, condition, Error(Error::kSystemCallFailed, reason));
}

}  // namespace

SDKShare::SDKShare(const std::string& share_name) : share_name_(share_name) {
    const LockMutex lock(SDKMutex());
    if (0 > KESTOShareGet(share_name.c_str(), &share_info_) || !share_info_) {
        Fail(kLog.Here(), "0 > KESTOShareGet(share_name.c_str(), &share_info_) || !share_info_",
             Error(Error::kNoSuchShare, share_name));
    }
}

SDKShare::~SDKShare() {
    const LockMutex lock(SDKMutex());
    KESTOShareFree(share_info_);
}

std::string SDKShare::GetPath() const {
    return share_info_->szPath;
}

bool SDKShare::IsHideUnReadable() const {
    int is_hidden = 0;
    return 0 <= KLIBShareHideUnreadableGet(share_info_, &is_hidden) && is_hidden == 1;
}

bool SDKShare::IsSpaceEnough() const {
    const LockMutex lock(SDKMutex());
    if (KESTOQuotaIsEnough(0, share_info_->szPath, kSpaceNeeded) != 0) {
        return true;
    }
    const int code = KLIBCErrGet();
    return code != KESTO_ERR_QUOTA_EXCEEDED && code != KESTO_ERR_VOLUME_FULL;
}

unsigned int SDKShare::GetFTPPrivilege() const {
    return share_info_->ftp_privilege;
}

int SDKShare::GetPrivilege(const std::string& user) const {
    return KESTOShareUserPrivGet(user.c_str(), share_info_);
}

bool SDKShare::IsEncryption() const {
    int is_encryption = 0;
    const LockMutex lock(SDKMutex());
    if (0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption)) {
        FailCall(kLog.Here(), "0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption)",
                 "KLIBShareIsEncryptionGet failed, share=" + share_name_);
    }
    return is_encryption != 0;
}

bool SDKShare::IsEnableRecycleBin() const {
    int is_enabled = 0;
    const LockMutex lock(SDKMutex());
    if (0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled)) {
        FailCall(kLog.Here(), "0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled)",
                 "KLIBShareRecycleStatusGet failed, share=" + share_name_);
    }
    return is_enabled != 0;
}

std::string SDKShare::GetQueuePath() const {
    char path[4096] = "";
    const LockMutex lock(SDKMutex());
    if (0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))) {
        FailCall(kLog.Here(),
                 "0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))",
                 "FILEIDXQueuePathCompose failed, share=" + share_name_);
    }
    return path;
}

std::string SDKShare::GetDBPath() const {
    char path[4096] = "";
    const LockMutex lock(SDKMutex());
    if (0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))) {
        FailCall(kLog.Here(), "0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))",
                 "FILEIDXDBPathCompose failed, share=" + share_name_);
    }
    return path;
}

bool SDKShare::CanBeIndexed() const {
    int is_encrypted = 0;
    int is_readonly = 0;
    const LockMutex lock(SDKMutex());
    if (std::find(kExcludedShares.begin(), kExcludedShares.end(), share_name_) !=
        kExcludedShares.end()) {
        return false;
    }
    // The reasons' odd spelling is what support tools look for.
    if (0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted)) {
        FailCall(kLog.Here(), "0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted)",
                 "KLIBShareis_encryptedGet failed, share=" + share_name_);
    }
    if (0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly)) {
        FailCall(kLog.Here(), "0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly)",
                 "KLIBShareis_readonlyGet failed, share=" + share_name_);
    }
    return is_encrypted == 0 && is_readonly == 0;
}

}  // namespace sdk
}  // namespace quivra
