#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>

#include "programs/kestoelasticd/mapping.h"

/// Turns text into the tokens that are indexed and searched. Everything here takes any bytes: what
/// is no valid UTF-8 counts as U+FFFD. Safe from any thread.
namespace elasticd {

struct Token {
    std::string_view text;  ///< as it is indexed; valid during the call only
    std::size_t begin;      ///< the bytes of the analysed text that it stands for
    std::size_t end;
    unsigned int position;  ///< counted from 1; a CJK character and the pair it opens share one
};

/// Takes a token; false ends the analysis.
using TokenSink = std::function<bool(const Token&)>;

enum class Purpose {
    kIndex,  ///< a CJK run gives its characters and all pairs of neighbours
    kQuery,  ///< it gives the pairs only, or the character when it stands alone
};

/// - kKeyword: the whole text is one token.
/// - kWhiteSpace: splits at blanks, keeps case and accents.
/// - kStandard: splits at Unicode word boundaries and folds each word; CJK becomes pairs.
/// False when the sink ended the analysis.
bool Analyze(Analyzer analyzer, Purpose purpose, std::string_view text, const TokenSink& sink);

/// The text without differences of case, accents, width and compatibility forms.
std::string Fold(std::string_view text);

/// The number of bytes of the UTF-8 character at `pos` (1 where there is no valid one).
std::size_t CharacterSize(std::string_view text, std::size_t pos);

}  // namespace elasticd
