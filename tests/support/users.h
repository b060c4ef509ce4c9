#pragma once

#include <sys/types.h>

#include <functional>
#include <string>

namespace support {

/// Whether processes can act as other users than root here. In a user namespace that an ordinary
/// user made there are none: files cannot be given away and seteuid fails.
bool HasOtherUsers();

/// What the body returns in a child process, where it may change what belongs to a process;
/// "crashed" when it does not come to its end.
std::string InChild(const std::function<std::string()>& body);

/// The same as an ordinary user of that id and group, without any of root's rights: for what an
/// attacker can do. Only where HasOtherUsers.
std::string AsUser(uid_t uid, const std::function<std::string()>& body);

/// A child process that does it again and again as that user, until the end of the scope: the
/// attacker's side of a race. It is ended with the test program, too.
class UserLoop {
  public:
    UserLoop(uid_t uid, const std::function<void()>& body);
    ~UserLoop();
    UserLoop(const UserLoop&) = delete;
    UserLoop& operator=(const UserLoop&) = delete;

  private:
    pid_t pid_;
};

}  // namespace support
