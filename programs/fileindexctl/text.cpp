#include "programs/fileindexctl/text.h"

#include <algorithm>

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

std::string ProgressBar(double share, unsigned int width) {
    const unsigned int cells = width < 2 ? 0 : width - 2;
    const double filled = std::clamp(share, 0.0, 1.0) * cells;
    const auto full = static_cast<unsigned int>(filled);
    return "[" + std::string(full, '#') + std::string(cells - full, '-') + "]";
}

}  // namespace quivra::ctl
