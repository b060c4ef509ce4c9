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
class QUIVRA_EXPORT SDKCredentials {
  public:
    /// Notes the effective user, to return to it. Error 503 when the platform does not know it.
    SDKCredentials();

    /// Switches to `user` as AsUser does. The user to return to is `user` as well: when the ids
    /// differ from those before at the end of the scope, `user`'s credentials are applied again.
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
