#pragma once

#include <string>
#include <vector>

namespace notify {

/// One notice, as the command line gives it.
struct Notice {
    std::string application;             ///< who sends it ("KESTO.Quivra.Application")
    std::string recipient;               ///< a user, or "@administrators" for all of them
    std::string title;                   ///< message key
    std::string message;                 ///< message key
    std::vector<std::string> arguments;  ///< for the message's places
};

/// Writes the notice to the system log and, without its tags, to the recipients' terminals. Returns
/// the number of terminals that took it.
int Send(const Notice& notice);

}  // namespace notify
