#include <kesto/error.h>
#include <kesto/filesystem.h>
#include <kesto/share.h>
#include <kesto/user.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <string_view>

#include "base/path.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/shares_conf.h"

namespace kesto {
namespace {

/// Copies a text with its NUL into the caller's buffer.
bool CopyText(std::string_view text, char* out, int size) {
    if (size <= 0 || text.size() >= static_cast<std::size_t>(size)) {
        return false;
    }
    std::copy(text.begin(), text.end(), out);
    out[text.size()] = '\0';
    return true;
}

template <std::size_t kSize>
void CopyField(std::string_view text, char (&out)[kSize]) {
    CopyText(text, out, static_cast<int>(kSize));  // what is too long made no share
}

/// 1 when the path is, or lies in, the directory `name` in the root of its share, 0 when not,
/// negative when the shares cannot be read.
int IsInShareDirectory(const char* path, const char* name) {
    const auto shares = LoadShares();
    if (shares == nullptr) {
        return -1;
    }
    // Of the innermost share: "#recycle" in a directory above its root is a name like any other.
    const ShareConf* share = FindShareOfPath(*shares, path);
    return share != nullptr && quivra::base::IsAtOrBelow(path, share->path + "/" + name);
}

int ReadFlag(const KESTOShare* share, int KESTOShare::*field, int* flag) {
    if (share == nullptr || flag == nullptr) {
        return SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    *flag = share->*field;
    return 0;
}

/// The right that "NAME:rw NAME:ro" gives the user.
KESTOSharePrivilege ListedPrivilege(std::string_view users, std::string_view user) {
    while (const std::optional<UserRight> entry = NextUser(users)) {
        if (entry->name == user) {
            return entry->right == "rw"   ? KESTO_SHARE_PRIV_WRITE
                   : entry->right == "ro" ? KESTO_SHARE_PRIV_READ
                                          : KESTO_SHARE_PRIV_NONE;
        }
    }
    return KESTO_SHARE_PRIV_NONE;
}

}  // namespace
}  // namespace kesto

using kesto::SetError;

int KESTOShareGet(const char* name, KESTOShare** share) {
    *share = nullptr;
    const auto shares = kesto::LoadShares();
    if (shares == nullptr) {
        return -1;
    }
    const kesto::ShareConf* found = kesto::FindShare(*shares, name);
    if (found == nullptr) {
        return SetError(KESTO_ERR_NO_SUCH_SHARE);
    }
    auto* record = new KESTOShare{};  // zeroed, so that each text is ended
    kesto::CopyField(found->name, record->szName);
    kesto::CopyField(found->path, record->szPath);
    kesto::CopyField(found->users, record->szUsers);
    record->ftp_privilege = found->ftp_privilege;
    record->read_only = found->read_only;
    record->hide_unreadable = found->hide_unreadable;
    record->encryption = found->encryption;
    record->encrypted = found->encrypted;
    record->recycle = found->recycle;
    *share = record;
    return 0;
}

void KESTOShareFree(KESTOShare* share) {
    delete share;
}

int KESTOShareEnum(KLIBCSzList** list) {
    const auto shares = kesto::LoadShares();
    if (shares == nullptr) {
        return -1;
    }
    for (const kesto::ShareConf& share : *shares) {
        if (KLIBCSzListPush(list, share.name.c_str()) < 0) {
            return -1;
        }
    }
    return 0;
}

int KESTOShareNamePathGet(const char* full_path, char* name, int name_size, char* path,
                          int path_size) {
    const auto shares = kesto::LoadShares();
    if (shares == nullptr) {
        return -1;
    }
    const kesto::ShareConf* share = kesto::FindShareOfPath(*shares, full_path);
    if (share == nullptr) {
        return SetError(KESTO_ERR_NO_SUCH_SHARE);
    }
    if (!kesto::CopyText(share->name, name, name_size) ||
        !kesto::CopyText(share->path, path, path_size)) {
        return SetError(KESTO_ERR_BUFFER_TOO_SMALL);
    }
    return 0;
}

int KESTOShareUserPrivGet(const char* user, const KESTOShare* share) {
    if (share == nullptr) {
        return SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    // First, because an administrator has the right whatever the share's list says.
    const int admin = KLIBGroupIsAdminGroupMem(user, 0);
    if (admin != 0) {
        return admin < 0 ? admin : KESTO_SHARE_PRIV_WRITE;
    }
    return kesto::ListedPrivilege(share->szUsers, user);
}

int KESTOShareIsShareRecycle(const char* path) {
    return kesto::IsInShareDirectory(path, "#recycle");
}

int KLIBFhsPathInSnapshot(const char* path, int* flag) {
    const int is_in = kesto::IsInShareDirectory(path, "#snapshot");
    *flag = is_in == 1;
    return is_in < 0 ? is_in : 0;
}

int KESTOEAIsHiddenDir(const char* name) {
    static constexpr const char* kHiddenNames[] = {"@eaDir", "#recycle", "#snapshot", "@tmp"};
    return std::any_of(std::begin(kHiddenNames), std::end(kHiddenNames),
                       [&](const char* hidden) { return std::strcmp(hidden, name) == 0; });
}

int KLIBShareHideUnreadableGet(const KESTOShare* share, int* flag) {
    return kesto::ReadFlag(share, &KESTOShare::hide_unreadable, flag);
}

int KLIBShareIsEncryptionGet(const KESTOShare* share, int* flag) {
    return kesto::ReadFlag(share, &KESTOShare::encryption, flag);
}

int KLIBShareIsEncryptedGet(const KESTOShare* share, int* flag) {
    return kesto::ReadFlag(share, &KESTOShare::encrypted, flag);
}

int KLIBShareIsReadOnlyGet(const KESTOShare* share, int* flag) {
    return kesto::ReadFlag(share, &KESTOShare::read_only, flag);
}

int KLIBShareRecycleStatusGet(const KESTOShare* share, int* flag) {
    return kesto::ReadFlag(share, &KESTOShare::recycle, flag);
}
