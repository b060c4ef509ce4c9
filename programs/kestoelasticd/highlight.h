#pragma once

#include <set>
#include <string>

#include "programs/kestoelasticd/mapping.h"

namespace elasticd {

struct HighlightStyle {
    std::string pre = "<b>";
    std::string post = "</b>";
    std::size_t length = 160;  ///< of the excerpt, in bytes, without the marks
};

/// An excerpt of `text` around the first of the folded `words` in it, with each of them marked;
/// empty when there is none. The excerpt is cut between characters.
std::string Highlight(const FieldSettings& settings, const std::string& text,
                      const std::set<std::string>& words, const HighlightStyle& style);

}  // namespace elasticd
