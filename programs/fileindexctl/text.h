#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace quivra::ctl {

/// The text with everything that could control a terminal or deceive its reader written as an
/// escape: control characters (\n, \t, \x1b), bytes that are no valid UTF-8 (\xff), and the
/// invisible characters that change the direction or the lines of a text (\u202e). The rest is
/// unchanged.
std::string EscapeControl(std::string_view bytes);

/// The number of terminal cells of a text, near enough for tables: one for each character.
std::size_t DisplayWidth(std::string_view text);

/// A progress bar of `width` cells, brackets included, for a share from 0 to 1.
std::string ProgressBar(double share, unsigned int width);

}  // namespace quivra::ctl
