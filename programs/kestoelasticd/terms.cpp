#include "programs/kestoelasticd/terms.h"

#include <sodium.h>
#include <xapian.h>

#include <algorithm>
#include <charconv>
#include <cmath>

#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

constexpr std::size_t kDigestSize = 16;

std::string Digest(std::string_view text) {
    std::string digest(kDigestSize, '\0');
    crypto_generichash(reinterpret_cast<unsigned char*>(digest.data()), digest.size(),
                       reinterpret_cast<const unsigned char*>(text.data()), text.size(), nullptr,
                       0);
    return digest;
}

std::string Prefixed(char letter, std::string_view text) {
    std::string term(1, letter);
    return term.append(text);
}

template <typename T>
std::optional<T> ParseNumber(const std::string& text) {
    T number{};
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) {
        return std::nullopt;
    }
    return number;
}

std::optional<bool> ReadBool(const Json::Value& value) {
    if (value.isString()) {
        const std::string text = value.asString();
        return text == "true"    ? std::optional(true)
               : text == "false" ? std::optional(false)
                                 : std::nullopt;
    }
    const std::optional<std::int64_t> number = ReadInt(value);
    return number && (*number == 0 || *number == 1) ? std::optional(*number == 1) : std::nullopt;
}

}  // namespace

std::optional<std::int64_t> ReadInt(const Json::Value& value) {
    if (value.isBool()) {
        return value.asBool() ? 1 : 0;
    }
    if (value.isString()) {
        return ParseNumber<std::int64_t>(value.asString());
    }
    return value.isInt64() ? std::optional(value.asInt64()) : std::nullopt;
}

std::optional<double> ReadDouble(const Json::Value& value) {
    if (value.isString()) {
        const std::optional<double> number = ParseNumber<double>(value.asString());
        return number && std::isfinite(*number) ? number : std::nullopt;
    }
    return value.isNumeric() ? std::optional(value.asDouble()) : std::nullopt;
}

std::string IdTerm(std::string_view id) {
    return Prefixed('Q', Digest(id));
}

std::string FolderTerm(std::string_view folder) {
    return Prefixed('P', Digest(folder));
}

std::string AllTerm(std::string_view token) {
    return FitTerm(Prefixed('A', token));
}

std::string FieldPrefix(unsigned int number) {
    constexpr unsigned int kSmall = 0x7f;
    std::string prefix(1, 'F');
    if (number < kSmall) {
        prefix += static_cast<char>(number + 1);
    } else {
        const unsigned int rest = number - kSmall;
        prefix += static_cast<char>(0x80 | (rest / kSmall));
        prefix += static_cast<char>(rest % kSmall + 1);
    }
    return prefix;
}

unsigned int FieldSlot(unsigned int number) {
    return number + 1;
}

std::string FitTerm(std::string term) {
    // The database writes a zero byte as two.
    const auto zeros = std::count(term.begin(), term.end(), '\0');
    if (term.size() + static_cast<std::size_t>(zeros) <= kMaxTermSize) {
        return term;
    }
    const std::string digest = Digest(term);
    std::string hex(2 * digest.size() + 1, '\0');
    sodium_bin2hex(hex.data(), hex.size(), reinterpret_cast<const unsigned char*>(digest.data()),
                   digest.size());
    hex.pop_back();
    std::size_t kept = std::min(kKeptOfTerm, term.size());
    if (zeros > 0) {
        kept = std::min(kept, std::max<std::size_t>(term.find('\0'), 3));
    }
    return term.substr(0, kept) + hex;
}

std::string EncodeInt(std::int64_t number) {
    const std::uint64_t ordered = static_cast<std::uint64_t>(number) ^ (std::uint64_t{1} << 63);
    std::string text(sizeof(ordered), '\0');
    for (std::size_t i = 0; i < text.size(); ++i) {
        text[i] = static_cast<char>(ordered >> (8 * (text.size() - 1 - i)));
    }
    return text;
}

std::string EncodeDouble(double number) {
    return Xapian::sortable_serialise(number);
}

std::optional<std::string> EncodeNumber(FieldType type, const Json::Value& value) {
    if (type == FieldType::kDouble) {
        const std::optional<double> number = ReadDouble(value);
        return number ? std::optional(EncodeDouble(*number)) : std::nullopt;
    }
    if (type == FieldType::kBool) {
        const std::optional<bool> flag = ReadBool(value);
        return flag ? std::optional<std::string>(*flag ? "1" : "0") : std::nullopt;
    }
    const std::optional<std::int64_t> number = ReadInt(value);
    return number ? std::optional(EncodeInt(*number)) : std::nullopt;
}

void FieldTable::Load(const std::string& text) {
    Json::Value names;
    FieldTable loaded;
    if (!quivra::fromString(names, text.empty() ? "[]" : text) || !names.isArray()) {
        throw quivra::Error(kIndexUnavailable, "The index's field table is damaged");
    }
    for (const Json::Value& name : names) {
        loaded.FindOrAdd(name.asString());
    }
    *this = std::move(loaded);
}

std::string FieldTable::Save() const {
    Json::Value names(Json::arrayValue);
    for (const std::string& name : names_) {
        names.append(name);
    }
    return quivra::toString(names);
}

std::optional<unsigned int> FieldTable::Find(const std::string& name) const {
    const auto found = numbers_.find(name);
    return found == numbers_.end() ? std::nullopt : std::optional(found->second);
}

unsigned int FieldTable::FindOrAdd(const std::string& name) {
    if (const std::optional<unsigned int> number = Find(name)) {
        return *number;
    }
    if (names_.size() >= kMaxFields || name.size() > kMaxNameSize || name.empty()) {
        throw quivra::Error(kBadDocument, names_.size() >= kMaxFields
                                              ? "The index has too many different fields"
                                              : "A field's name is empty or too long");
    }
    const auto number = static_cast<unsigned int>(names_.size());
    names_.push_back(name);
    numbers_.emplace(name, number);
    return number;
}

}  // namespace elasticd
