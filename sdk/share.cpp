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

}  // namespace

SDKShare::SDKShare(const std::string& share_name) : share_name_(share_name) {
    const LockMutex lock(SDKMutex());
    QUIVRA_FAIL_IF(kLog, 0 > KESTOShareGet(share_name.c_str(), &share_info_) || !share_info_,
                   Error(Error::kNoSuchShare, share_name));
}

SDKShare::~SDKShare() {
    const LockMutex lock(SDKMutex());
    KESTOShareFree(share_info_);
}

std::string SDKShare::GetPath() const {
    return share_info_->szPath;
}

bool SDKShare::IsHideUnReadable() const {
    // Without the mutex, as the privileges below: these read the record alone.
    int is_hidden = 0;
    return 0 <= KLIBShareHideUnreadableGet(share_info_, &is_hidden) && is_hidden == 1;
}

bool SDKShare::IsSpaceEnough() const {
    const LockMutex lock(SDKMutex());
    // In doubt there is space: a quota that cannot be asked must not stop all indexing.
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
    QUIVRA_FAIL_IF(
        kLog, 0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption),
        Error(Error::kSystemCallFailed, "KLIBShareIsEncryptionGet failed, share=" + share_name_));
    return is_encryption != 0;
}

bool SDKShare::IsEnableRecycleBin() const {
    int is_enabled = 0;
    const LockMutex lock(SDKMutex());
    QUIVRA_FAIL_IF(
        kLog, 0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled),
        Error(Error::kSystemCallFailed, "KLIBShareRecycleStatusGet failed, share=" + share_name_));
    return is_enabled != 0;
}

std::string SDKShare::GetQueuePath() const {
    char path[4096] = "";
    const LockMutex lock(SDKMutex());
    QUIVRA_FAIL_IF(
        kLog, 0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path)),
        Error(Error::kSystemCallFailed, "FILEIDXQueuePathCompose failed, share=" + share_name_));
    return path;
}

std::string SDKShare::GetDBPath() const {
    char path[4096] = "";
    const LockMutex lock(SDKMutex());
    QUIVRA_FAIL_IF(
        kLog, 0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path)),
        Error(Error::kSystemCallFailed, "FILEIDXDBPathCompose failed, share=" + share_name_));
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
    QUIVRA_FAIL_IF(
        kLog, 0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted),
        Error(Error::kSystemCallFailed, "KLIBShareis_encryptedGet failed, share=" + share_name_));
    QUIVRA_FAIL_IF(
        kLog, 0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly),
        Error(Error::kSystemCallFailed, "KLIBShareis_readonlyGet failed, share=" + share_name_));
    return is_encrypted == 0 && is_readonly == 0;
}

}  // namespace sdk
}  // namespace quivra
