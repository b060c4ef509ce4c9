#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kesto {

/// As much text of one file as is ever taken, in bytes, as read and as given back.
inline constexpr std::size_t kMaxTextSize = 4U << 20;

/// Whether the beginning of a file looks like plain text: a UTF-16 byte order mark, or no NUL and
/// hardly any other control character, and not the mark of a format that only looks like text.
bool IsTextBeginning(std::string_view block);

/// The text of a plain-text file's raw bytes as valid UTF-8, at most kMaxTextSize bytes of it.
/// Knows UTF-8, UTF-16 with a byte order mark, and takes all else for Windows-1252. Single faulty
/// bytes become U+FFFD, control characters blanks, a character that is cut off at the end is
/// dropped.
std::string DecodeText(std::string_view raw);

enum class TextResult {
    kText,
    kNoText,      ///< the file holds something else than plain text
    kReadFailed,  ///< errno tells why
};

/// Takes the text of a plain-text file that is open for reading, from its beginning.
TextResult ReadText(int fd, std::string& text);

}  // namespace kesto
