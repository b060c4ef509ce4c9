#include "platform/standalone/text_content.h"

#include <iconv.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <optional>

#include "base/file.h"

namespace kesto {
namespace {

constexpr std::size_t kFirstBlock = 64U << 10;
constexpr std::string_view kReplacement = "\xef\xbf\xbd";
constexpr std::string_view kUtf8Mark = "\xef\xbb\xbf";
constexpr std::string_view kUtf16Marks[] = {"\xff\xfe", "\xfe\xff"};
/// Formats that may be all ASCII; their text is not what a reader sees.
constexpr std::string_view kNotPlain[] = {"%PDF-", "{\\rtf", "%!PS"};

bool IsUtf16(std::string_view raw) {
    return raw.starts_with(kUtf16Marks[0]) || raw.starts_with(kUtf16Marks[1]);
}

/// Control characters that text files hold by right: \a to \r and escape.
bool IsStrayControl(unsigned char c) {
    return (c < 0x20 && (c < '\a' || c > '\r') && c != 0x1b) || c == 0x7f;
}

/// The length of the UTF-8 character at the start of `text`: 0 when it is faulty, nothing when the
/// text ends within it.
std::optional<std::size_t> CharacterLength(std::string_view text) {
    const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
    const unsigned char first = byte(0);
    if (first < 0x80) {
        return 1;
    }
    const std::size_t length = first >= 0xc2 && first <= 0xdf   ? 2
                               : first >= 0xe0 && first <= 0xef ? 3
                               : first >= 0xf0 && first <= 0xf4 ? 4
                                                                : 0;
    for (std::size_t i = 1; i < length; ++i) {
        if (i == text.size()) {
            return std::nullopt;
        }
        // Over-long forms, surrogates and what lies beyond U+10FFFF show in the second byte.
        const unsigned char low = i > 1 ? 0x80 : first == 0xe0 ? 0xa0 : first == 0xf0 ? 0x90 : 0x80;
        const unsigned char high = i > 1           ? 0xbf
                                   : first == 0xed ? 0x9f
                                   : first == 0xf4 ? 0x8f
                                                   : 0xbf;
        if (byte(i) < low || byte(i) > high) {
            return 0;
        }
    }
    return length;
}

/// Copies the text with its faulty bytes replaced. Nothing when more bytes are faulty than
/// characters beyond ASCII are sound: then it is not UTF-8.
std::optional<std::string> RepairUtf8(std::string_view raw) {
    std::string text;
    text.reserve(raw.size());
    std::size_t sound = 0;
    std::size_t faulty = 0;
    while (!raw.empty()) {
        const std::optional<std::size_t> length = CharacterLength(raw);
        if (!length) {
            break;
        }
        sound += *length > 1 ? 1U : 0U;
        faulty += *length == 0 ? 1U : 0U;
        text += *length == 0 ? kReplacement : raw.substr(0, *length);
        raw.remove_prefix(std::max<std::size_t>(*length, 1));
    }
    if (faulty > sound) {
        return std::nullopt;
    }
    return text;
}

/// Converts with iconv; units that have no meaning in the encoding are replaced.
std::string Convert(const char* encoding, std::size_t unit, std::string_view raw) {
    const iconv_t converter = iconv_open("UTF-8", encoding);
    if (reinterpret_cast<std::intptr_t>(converter) == -1) {
        return {};
    }
    std::string text;
    std::array<char, 4096> buffer;
    char* in = const_cast<char*>(raw.data());  // iconv's interface; it only reads
    std::size_t left = raw.size();
    bool is_done = false;
    while (!is_done && text.size() <= kMaxTextSize) {
        char* out = buffer.data();
        std::size_t room = buffer.size();
        is_done = iconv(converter, &in, &left, &out, &room) != static_cast<std::size_t>(-1);
        const int error = is_done ? 0 : errno;
        text.append(buffer.data(), out);
        if (error == EILSEQ && left >= unit) {
            text += kReplacement;
            in += unit;
            left -= unit;
        } else if (error != E2BIG) {
            is_done = true;  // the rest is a cut-off character
        }
    }
    iconv_close(converter);
    return text;
}

/// Shortens to at most kMaxTextSize bytes, at a character's boundary.
void Shorten(std::string& text) {
    if (text.size() > kMaxTextSize) {
        std::size_t end = kMaxTextSize;
        while ((static_cast<unsigned char>(text[end]) & 0xc0) == 0x80) {
            --end;
        }
        text.resize(end);
    }
}

}  // namespace

bool IsTextBeginning(std::string_view block) {
    if (IsUtf16(block)) {
        return true;
    }
    if (std::any_of(std::begin(kNotPlain), std::end(kNotPlain),
                    [&](std::string_view mark) { return block.starts_with(mark); }) ||
        block.find('\0') != std::string_view::npos) {
        return false;
    }
    const auto strays = std::count_if(block.begin(), block.end(), [](char c) {
        return IsStrayControl(static_cast<unsigned char>(c));
    });
    return static_cast<std::size_t>(strays) * 50 <= block.size();
}

std::string DecodeText(std::string_view raw) {
    std::string text;
    if (IsUtf16(raw)) {
        const bool is_little = raw.starts_with(kUtf16Marks[0]);
        text = Convert(is_little ? "UTF-16LE" : "UTF-16BE", 2, raw.substr(2));
    } else {
        if (raw.starts_with(kUtf8Mark)) {
            raw.remove_prefix(kUtf8Mark.size());
        }
        std::optional<std::string> utf8 = RepairUtf8(raw);
        text = utf8 ? std::move(*utf8) : Convert("WINDOWS-1252", 1, raw);
    }
    Shorten(text);
    std::replace_if(
        text.begin(), text.end(),
        [](char c) { return IsStrayControl(static_cast<unsigned char>(c)); }, ' ');
    return text;
}

TextResult ReadText(int fd, std::string& text) {
    std::string raw;
    if (lseek(fd, 0, SEEK_SET) != 0 || !quivra::base::ReadUpTo(fd, kFirstBlock, raw)) {
        return TextResult::kReadFailed;
    }
    // A film costs one block of reading, not its first megabytes.
    if (!IsTextBeginning(raw)) {
        return TextResult::kNoText;
    }
    if (!quivra::base::ReadUpTo(fd, kMaxTextSize - raw.size(), raw)) {
        return TextResult::kReadFailed;
    }
    text = DecodeText(raw);
    return TextResult::kText;
}

}  // namespace kesto
