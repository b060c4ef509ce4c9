#include "sdk/credentials.h"

#include <kesto/error.h>
#include <kesto/user.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <exception>
#include <memory>

#include "common/error.h"
#include "common/log.h"

namespace quivra {
namespace sdk {
namespace {

constexpr LogUnit kLog{"credentials", 0};

/// The reason's text starts as many characters late as the platform's error code says: an oddity
/// of the reasons in use, which support tools know. A code beyond the text leaves nothing.
std::string LookupFailedReason(int code) {
    const std::string text = "KESTOUserGetByUID failed, err=";
    return text.substr(std::min(static_cast<std::size_t>(std::max(code, 0)), text.size()));
}

}  // namespace

Mutex& SDKMutex() {
    static Mutex mutex;
    return mutex;
}

SDKCredentials::SDKCredentials() : euid_(geteuid()), egid_(getegid()) {
    const LockMutex lock(SDKMutex());
    KESTOUser* user_info = nullptr;
    QUIVRA_FAIL_IF(kLog, 0 > KESTOUserGetByUID(euid_, &user_info) || !user_info,
                   Error(Error::kCredentialsFailed, LookupFailedReason(KLIBCErrGet())));
    const std::unique_ptr<KESTOUser, void (*)(KESTOUser*)> owner(user_info, KESTOUserFree);
    username_ = user_info->szName;
}

SDKCredentials::SDKCredentials(const std::string& user)
    : euid_(geteuid()), egid_(getegid()), username_(user) {
    AsUser(user);
}

SDKCredentials::~SDKCredentials() {
    const LockMutex lock(SDKMutex());
    if (geteuid() == euid_ && getegid() == egid_) {
        return;
    }
    if (!ResetCredentialsByName(username_.c_str(), true)) {
        LogFailure(kLog.Here(), "!ResetCredentialsByName(username_)",
                   Error(Error::kCredentialsFailed).what());
        std::terminate();
    }
}

void SDKCredentials::AsUser(const std::string& user) {
    const LockMutex lock(SDKMutex());
    const bool is_admin = KLIBGroupIsAdminGroupMem(user.c_str(), 0) == 1;
    const std::string target_username = is_admin ? "root" : user;
    if (!ResetCredentialsByName(target_username.c_str(), true)) {
        Fail(kLog.Here(), "!ResetCredentialsByName(target_username)",
             Error(Error::kCredentialsFailed));
    }
}

}  // namespace sdk
}  // namespace quivra
