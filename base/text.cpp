#include "base/text.h"

#include <algorithm>
#include <array>
#include <cstdio>

namespace quivra::base {
namespace {

struct Decoded {
    char32_t code = 0;
    std::size_t length = 0;  ///< 0: no valid UTF-8 begins here
};

bool IsContinuation(char c) {
    return (static_cast<unsigned char>(c) & 0xC0U) == 0x80U;
}

/// The character at the front of a non-empty text. Overlong forms, surrogates and values beyond
/// Unicode are invalid.
Decoded DecodeUtf8(std::string_view text) {
    const auto lead = static_cast<unsigned char>(text[0]);
    if (lead < 0x80) {
        return {lead, 1};
    }
    const std::size_t length = lead >= 0xF5 ? 0 : lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
    if (lead < 0xC2 || length == 0 || text.size() < length) {
        return {};
    }
    char32_t code = lead & (0x7FU >> length);
    for (std::size_t i = 1; i < length; ++i) {
        if (!IsContinuation(text[i])) {
            return {};
        }
        code = (code << 6U) | (static_cast<unsigned char>(text[i]) & 0x3FU);
    }
    constexpr std::array<char32_t, 5> kSmallest = {0, 0, 0x80, 0x800, 0x10000};
    if (code < kSmallest[length] || code > 0x10FFFF || (code >= 0xD800 && code <= 0xDFFF)) {
        return {};
    }
    return {code, length};
}

/// Marks and overrides of the text direction, line separators: they show nothing and change how
/// the text around them reads.
bool IsDeceptive(char32_t code) {
    return (code >= 0x80 && code <= 0x9F) || code == 0x061C || code == 0x200E || code == 0x200F ||
           (code >= 0x2028 && code <= 0x202E) || (code >= 0x2066 && code <= 0x2069) ||
           code == 0xFEFF;
}

template <typename... Arguments>
std::string Printed(const char* format, Arguments... arguments) {
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), format, arguments...);
    return text.data();
}

std::string EscapeByte(unsigned char byte) {
    switch (byte) {
        case '\n':
            return "\\n";
        case '\r':
            return "\\r";
        case '\t':
            return "\\t";
        default:
            return Printed("\\x%02x", byte);
    }
}

}  // namespace

std::string EscapeControl(std::string_view bytes) {
    std::string text;
    text.reserve(bytes.size());
    while (!bytes.empty()) {
        const Decoded character = DecodeUtf8(bytes);
        const std::size_t length = std::max<std::size_t>(character.length, 1);
        if (character.length == 0 || character.code < 0x20 || character.code == 0x7F) {
            text += EscapeByte(static_cast<unsigned char>(bytes[0]));
        } else if (IsDeceptive(character.code)) {
            text += Printed("\\u%04x", static_cast<unsigned int>(character.code));
        } else {
            text.append(bytes.substr(0, length));
        }
        bytes.remove_prefix(length);
    }
    return text;
}

}  // namespace quivra::base
