#pragma once

#include <cstdint>
#include <string>

#include "common/export.h"
#include "common/mutex.h"

namespace quivra {
namespace sdk {

/// The mutex that serialises every call into the platform's user, group and share libraries, which
/// are not safe for concurrent use. It is held for single calls, never across operations.
QUIVRA_EXPORT Mutex& SDKMutex();

/// Runs a scope as another user: the destructor goes back when the effective ids have changed.
/// The effective identity belongs to the whole process, so no two threads may hold differing
/// objects at once.
///
/// MIND: an object made with a user's name does NOT go back to the user before. Its end applies the
/// named user once more, so a process that has built SDKCredentials("root") is root from then on,
/// and so is one that has saved a folder set or changed a status (FolderMgr::Save, StatusMgr). This
/// is how the interface is meant. A host that serves users must not call those while it acts as one
/// of them: let it do so in a child process or a helper of its own, or keep a default-constructed
/// SDKCredentials around the call, whose end returns to the user at its start.
class QUIVRA_EXPORT SDKCredentials {
  public:
    /// Notes the effective user, to return to it. Error 503 when the platform does not know it.
    SDKCredentials();

    /// Switches to `user` as AsUser does. The user to return to is `user` as well: when the ids
    /// differ from those before at the end of the scope, `user`'s credentials are applied again.
    /// Error 503 as AsUser.
    explicit SDKCredentials(const std::string& user);

    /// A failure to go back is logged and ends the process: it must not go on as somebody else.
    ~SDKCredentials();
    SDKCredentials(const SDKCredentials&) = delete;
    SDKCredentials& operator=(const SDKCredentials&) = delete;

    /// Makes `user` the effective user, with its groups; an administrator becomes "root". Error 503
    /// on failure; the identity is the old one then.
    void AsUser(const std::string& user);

  private:
    std::uint32_t euid_;
    std::uint32_t egid_;
    std::string username_;
};

}  // namespace sdk
}  // namespace quivra
