#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace quivra::ctl {

/// A name, path or other foreign text as it is printed for people, on a terminal and into a pipe
/// alike: with everything that could control a terminal, break a line or deceive the reader written
/// as an escape: control characters (\n, \t, \x1b), bytes that are no valid UTF-8 (\xff), and the
/// invisible characters that change the direction or the lines of a text (\u202e). The rest is
/// unchanged. Who needs the exact bytes asks for JSON, or for paths ended by NUL bytes.
std::string Shown(std::string_view bytes);

/// The number of terminal cells of a text, near enough for tables: one for each character.
std::size_t DisplayWidth(std::string_view text);

/// A progress bar of `width` cells, brackets included, for a share from 0 to 1.
std::string ProgressBar(double share, unsigned int width);

}  // namespace quivra::ctl
