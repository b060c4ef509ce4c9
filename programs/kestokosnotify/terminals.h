#pragma once

#include <functional>
#include <string>

namespace notify {

/// Writes the text to the terminal of every logged-in user that `is_recipient` names, and returns
/// how many took it. One that does not take it at once (stopped output, a dead connection) is left
/// out: no terminal can hold the caller up.
int WriteToTerminals(const std::string& text,
                     const std::function<bool(const std::string& user)>& is_recipient);

}  // namespace notify
