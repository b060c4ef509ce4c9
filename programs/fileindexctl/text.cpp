#include "programs/fileindexctl/text.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <ctime>

#include "base/text.h"

namespace quivra::ctl {

std::string Shown(std::string_view bytes) {
    return base::EscapeControl(bytes);
}

std::size_t DisplayWidth(std::string_view text) {
    return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), [](char c) {
        return (static_cast<unsigned char>(c) & 0xC0U) != 0x80U;  // continues no character
    }));
}

std::string Bytes(std::uint64_t count) {
    constexpr std::array kUnits = {"kB", "MB", "GB", "TB", "PB", "EB"};
    if (count < 1000) {
        return Number(count, "byte", "bytes");
    }
    auto value = static_cast<double>(count) / 1000;
    std::size_t unit = 0;
    // 999.95 would be printed as the next unit's 1000.0.
    while (value >= 999.95 && unit + 1 < kUnits.size()) {
        value /= 1000;
        ++unit;
    }
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.1f %s", value, kUnits[unit]);
    return text.data();
}

std::string Duration(std::int64_t seconds) {
    const auto value = static_cast<std::uint64_t>(std::max<std::int64_t>(seconds, 0));
    if (value < 60) {
        return Number(value, "second", "seconds");
    }
    if (value < 3600) {
        return Number((value + 30) / 60, "minute", "minutes");
    }
    return value < 172800 ? Number((value + 1800) / 3600, "hour", "hours")
                          : Number((value + 43200) / 86400, "day", "days");
}

std::string LocalTime(std::int64_t seconds) {
    std::array<char, 64> text{};
    const auto time = static_cast<std::time_t>(seconds);
    std::tm local{};
    if (localtime_r(&time, &local) == nullptr) {
        return std::to_string(seconds);
    }
    std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", &local);
    return text.data();
}

std::string Number(std::uint64_t value, const char* one, const char* many) {
    return std::to_string(value) + " " + (value == 1 ? one : many);
}

std::string ProgressBar(double share, unsigned int width) {
    const unsigned int cells = width < 2 ? 0 : width - 2;
    const double filled = std::clamp(share, 0.0, 1.0) * cells;
    const auto full = static_cast<unsigned int>(filled);
    return "[" + std::string(full, '#') + std::string(cells - full, '-') + "]";
}

}  // namespace quivra::ctl
