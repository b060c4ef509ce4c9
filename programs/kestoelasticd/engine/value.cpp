#include "programs/kestoelasticd/engine/value.h"

#include <charconv>
#include <cmath>

namespace elasticd::engine {
namespace {

template <typename T>
std::optional<T> ParseNumber(const std::string& text) {
    T number{};
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) {
        return std::nullopt;
    }
    return number;
}

template <typename T>
std::string_view Digits(T number, char (&buffer)[40]) {
    const auto result = std::to_chars(buffer, buffer + sizeof(buffer), number);
    return {buffer, static_cast<std::size_t>(result.ptr - buffer)};
}

std::optional<std::int64_t> ToInt(const Value& value) {
    if (const auto* flag = std::get_if<bool>(&value)) {
        return *flag ? 1 : 0;
    }
    if (const auto* text = std::get_if<std::string>(&value)) {
        return ParseNumber<std::int64_t>(*text);
    }
    if (const auto* number = std::get_if<double>(&value)) {
        // 2^63 itself is the first that does not fit.
        const bool fits = *number == std::floor(*number) && std::abs(*number) < 0x1p63;
        return fits ? std::optional(static_cast<std::int64_t>(*number)) : std::nullopt;
    }
    const auto* number = std::get_if<std::int64_t>(&value);
    return number != nullptr ? std::optional(*number) : std::nullopt;
}

std::optional<double> ToDouble(const Value& value) {
    std::optional<double> number;
    if (const auto* text = std::get_if<std::string>(&value)) {
        number = ParseNumber<double>(*text);
    } else if (const auto* whole = std::get_if<std::int64_t>(&value)) {
        number = static_cast<double>(*whole);
    } else if (const auto* real = std::get_if<double>(&value)) {
        number = *real;
    }
    return number && std::isfinite(*number) ? number : std::nullopt;
}

std::optional<std::int64_t> ToBool(const Value& value) {
    if (const auto* text = std::get_if<std::string>(&value)) {
        return *text == "true"    ? std::optional<std::int64_t>(1)
               : *text == "false" ? std::optional<std::int64_t>(0)
                                  : std::nullopt;
    }
    const std::optional<std::int64_t> number = ToInt(value);
    return number && (*number == 0 || *number == 1) ? number : std::nullopt;
}

}  // namespace

void ForEachText(const Value& value, const std::function<void(std::string_view)>& take) {
    char buffer[40];
    if (const auto* text = std::get_if<std::string>(&value)) {
        take(*text);
    } else if (const auto* composite = std::get_if<Composite>(&value)) {
        for (const std::string& part : composite->texts) {
            take(part);
        }
    } else if (const auto* flag = std::get_if<bool>(&value)) {
        take(*flag ? "true" : "false");
    } else if (const auto* whole = std::get_if<std::int64_t>(&value)) {
        take(Digits(*whole, buffer));
    } else if (const auto* real = std::get_if<double>(&value)) {
        take(Digits(*real, buffer));
    }
}

std::optional<Value> ToNumber(FieldType type, const Value& value) {
    if (type == FieldType::kDouble) {
        const std::optional<double> number = ToDouble(value);
        return number ? std::optional<Value>(*number) : std::nullopt;
    }
    const std::optional<std::int64_t> number =
        type == FieldType::kBool ? ToBool(value) : ToInt(value);
    return number ? std::optional<Value>(*number) : std::nullopt;
}

}  // namespace elasticd::engine
