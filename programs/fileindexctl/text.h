#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace quivra::ctl {

/// A name, path or other foreign text as it is printed for people, on a terminal and into a pipe
/// alike: with everything that could control a terminal, break a line or deceive the reader written
/// as an escape: control characters (\n, \t, \x1b), bytes that are not valid UTF-8 (\xff), and the
/// invisible characters that change the direction or the lines of a text (\u202e). The rest is
/// unchanged. Who needs the exact bytes asks for JSON, or for paths ended by NUL bytes.
std::string Shown(std::string_view bytes);

/// The number of terminal cells of a text, near enough for tables: one for each character.
std::size_t DisplayWidth(std::string_view text);

/// A number of bytes for people: "512 bytes", "3.2 MB" (powers of 1000).
std::string Bytes(std::uint64_t count);

/// A number of seconds for people, in its largest unit: "2 minutes".
std::string Duration(std::int64_t seconds);

/// Seconds since the epoch in local time: "2026-11-21 22:10".
std::string LocalTime(std::int64_t seconds);

/// A number and its noun: "1 file", "2 files".
std::string Number(std::uint64_t value, const char* one, const char* many);

/// A progress bar of `width` cells, brackets included, for a share from 0 to 1.
std::string ProgressBar(double share, unsigned int width);

}  // namespace quivra::ctl
