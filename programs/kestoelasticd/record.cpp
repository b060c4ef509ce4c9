#include "programs/kestoelasticd/record.h"

#include <zstd.h>

#include <charconv>
#include <new>

#include "common/json.h"

namespace elasticd {
namespace {

constexpr int kTextCompressionLevel = 1;
constexpr unsigned long long kMaxTextSize = 1ULL << 30;

void AppendNumber(std::string& out, std::size_t number) {
    for (; number >= 0x80; number >>= 7) {
        out += static_cast<char>(0x80 | (number & 0x7f));
    }
    out += static_cast<char>(number);
}

bool TakeNumber(std::string_view& in, std::size_t& number) {
    number = 0;
    for (unsigned int shift = 0; !in.empty() && shift < 63; shift += 7) {
        const auto byte = static_cast<unsigned char>(in.front());
        in.remove_prefix(1);
        number |= static_cast<std::size_t>(byte & 0x7f) << shift;
        if (byte < 0x80) {
            return true;
        }
    }
    return false;
}

void AppendEscaped(std::string& out, unsigned char c) {
    constexpr char kHex[] = "0123456789abcdef";
    switch (c) {
        case '"':
            out += "\\\"";
            break;
        case '\\':
            out += "\\\\";
            break;
        case '\n':
            out += "\\n";
            break;
        case '\t':
            out += "\\t";
            break;
        default:
            out += "\\u00";
            out += kHex[c >> 4];
            out += kHex[c & 0xf];
    }
}

}  // namespace

std::string EncodeRecord(const Record& record) {
    std::string encoded;
    for (const auto& [number, text] : record) {
        AppendNumber(encoded, number);
        AppendNumber(encoded, text.size());
        encoded += text;
    }
    return encoded;
}

void WalkRecord(std::string_view encoded,
                const std::function<void(unsigned int, std::string_view)>& take) {
    std::size_t number = 0;
    std::size_t size = 0;
    while (TakeNumber(encoded, number) && TakeNumber(encoded, size) && size <= encoded.size()) {
        take(static_cast<unsigned int>(number), encoded.substr(0, size));
        encoded.remove_prefix(size);
    }
}

Record DecodeRecord(std::string_view encoded) {
    Record record;
    WalkRecord(encoded, [&](unsigned int number, std::string_view text) { record[number] = text; });
    return record;
}

void AppendJsonText(std::string& out, std::string_view text) {
    out += '"';
    std::size_t done = 0;
    for (std::size_t pos = 0; pos < text.size(); ++pos) {
        const auto c = static_cast<unsigned char>(text[pos]);
        if (c < 0x20 || c == '"' || c == '\\') {
            out.append(text, done, pos - done);
            AppendEscaped(out, c);
            done = pos + 1;
        }
    }
    out.append(text, done, text.size() - done);
    out += '"';
}

void AppendJson(std::string& out, const Json::Value& value) {
    if (value.isString()) {
        const char* begin = nullptr;
        const char* end = nullptr;
        value.getString(&begin, &end);
        AppendJsonText(out, std::string_view(begin, static_cast<std::size_t>(end - begin)));
    } else if (value.isInt64() && value.type() != Json::realValue) {
        char digits[24];
        const auto result = std::to_chars(digits, digits + sizeof(digits), value.asInt64());
        out.append(digits, result.ptr);
    } else {
        out += quivra::toString(value);
    }
}

std::string PackText(std::string_view text) {
    std::string packed(ZSTD_compressBound(text.size()), '\0');
    const std::size_t size = ZSTD_compress(packed.data(), packed.size(), text.data(), text.size(),
                                           kTextCompressionLevel);
    if (ZSTD_isError(size) != 0) {
        throw std::bad_alloc();
    }
    packed.resize(size);
    return packed;
}

std::string UnpackText(std::string_view packed) {
    const unsigned long long size = ZSTD_getFrameContentSize(packed.data(), packed.size());
    if (size > kMaxTextSize) {  // the values for "unknown" and "error" are above it, too
        return std::string();
    }
    std::string text(size, '\0');
    const std::size_t got = ZSTD_decompress(text.data(), text.size(), packed.data(), packed.size());
    return ZSTD_isError(got) != 0 ? std::string() : text;
}

}  // namespace elasticd
