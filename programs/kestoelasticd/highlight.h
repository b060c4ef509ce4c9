#pragma once

#include <string>

#include "programs/kestoelasticd/engine/schema.h"
#include "programs/kestoelasticd/query.h"

namespace elasticd {

struct HighlightStyle {
    std::string pre = "<b>";
    std::string post = "</b>";
    std::size_t length = 160;  ///< of the excerpt, in bytes, without the marks
};

/// An excerpt of `text` around the first of the asked words in it, with each of them marked; empty
/// when there is none. The excerpt is cut between characters.
std::string Highlight(const engine::FieldSettings& settings, const std::string& text,
                      const AskedWords& words, const HighlightStyle& style);

}  // namespace elasticd
