#pragma once

#include <string>
#include <string_view>

namespace quivra::base {

/// The text with everything that could control a terminal, forge a line of a log or deceive its
/// reader written as an escape: control characters (\n, \t, \x1b), bytes that are not valid UTF-8
/// (\xff), and the invisible characters that change the direction or the lines of a text (\u202e).
/// The rest is unchanged, backslashes included.
std::string EscapeControl(std::string_view bytes);

}  // namespace quivra::base
