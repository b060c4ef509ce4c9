#pragma once

#include <kesto/share.h>

#include <string>

#include "common/export.h"

namespace quivra {
namespace sdk {

/// One shared folder as the platform knows it, for the length of one operation: the record is read
/// once, by the constructor. Objects of different threads do not disturb each other: what touches
/// the platform's share library runs under SDKMutex(), which no caller may hold meanwhile.
///
/// Unless stated otherwise, a platform call that fails is logged and thrown as Error 502 whose
/// reason names the call and the share.
class QUIVRA_EXPORT SDKShare {
  public:
    /// Error 800, with the name as its reason, when there is no such share.
    explicit SDKShare(const std::string& share_name);
    ~SDKShare();
    SDKShare(const SDKShare&) = delete;
    SDKShare& operator=(const SDKShare&) = delete;

    /// The full path of the share's root, as the platform gives it.
    std::string GetPath() const;

    /// Whether users see only what they may read. False when that cannot be told.
    bool IsHideUnReadable() const;

    /// Whether 100 MiB can still be written to the share. False only when the platform says that
    /// the volume is full or a quota is reached; a query that fails otherwise stops no indexing.
    bool IsSpaceEnough() const;

    /// The record's FTP privilege, and the user's right on the share (a KESTOSharePrivilege or a
    /// negative value): both as the platform gives them.
    unsigned int GetFTPPrivilege() const;
    int GetPrivilege(const std::string& user) const;

    /// Whether the share is of the encrypted kind, locked at the moment or not.
    bool IsEncryption() const;

    bool IsEnableRecycleBin() const;

    /// Where the share's change queue (a file) and its index database (a directory) live, whether
    /// they exist or not.
    std::string GetQueuePath() const;
    std::string GetDBPath() const;

    /// False for the excluded shares ("surveillance", "NetBackup"), for a locked encrypted share
    /// and for a read-only one.
    bool CanBeIndexed() const;

  private:
    KESTOShare* share_info_ = nullptr;
    std::string share_name_;
};

}  // namespace sdk
}  // namespace quivra
