#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/uscript.h>

#include <algorithm>
#include <new>

#include "programs/kestoelasticd/engine/words.h"

namespace elasticd::engine {
namespace {

/// A mark that a reader leaves out when typing: an accent, not a vowel of an Indic script.
bool IsFoldedMark(UChar32 c) {
    if (c < 0x300 || u_charType(c) != U_NON_SPACING_MARK || c == 0x3099 || c == 0x309a) {
        return false;
    }
    UErrorCode status = U_ZERO_ERROR;
    const UScriptCode script = uscript_getScript(c, &status);
    return script == USCRIPT_INHERITED || script == USCRIPT_ARABIC || script == USCRIPT_HEBREW;
}

/// Accents are marks of their own only in the decomposed form.
std::string FoldUnicode(std::string_view text) {
    UErrorCode status = U_ZERO_ERROR;
    const icu::Normalizer2* case_fold = icu::Normalizer2::getNFKCCasefoldInstance(status);
    const icu::Normalizer2* decompose = icu::Normalizer2::getNFDInstance(status);
    const icu::Normalizer2* compose = icu::Normalizer2::getNFCInstance(status);
    if (U_FAILURE(status)) {
        throw std::bad_alloc();
    }
    const icu::StringPiece piece(text.data(), static_cast<std::int32_t>(text.size()));
    const icu::UnicodeString folded = decompose->normalize(
        case_fold->normalize(icu::UnicodeString::fromUTF8(piece), status), status);
    icu::UnicodeString kept;
    for (std::int32_t i = 0; i < folded.length(); i = folded.moveIndex32(i, 1)) {
        if (const UChar32 c = folded.char32At(i); !IsFoldedMark(c)) {
            kept.append(c);
        }
    }
    std::string out;
    compose->normalize(kept, status).toUTF8String(out);
    if (U_FAILURE(status)) {
        throw std::bad_alloc();
    }
    return out;
}

}  // namespace

void FoldTo(std::string& out, std::string_view text) {
    const bool ascii =
        std::all_of(text.begin(), text.end(), [](char c) { return (c & '\x80') == 0; });
    if (!ascii) {
        out = FoldUnicode(text);
        return;
    }
    out.assign(text);
    for (char& c : out) {
        c = c >= 'A' && c <= 'Z' ? static_cast<char>(c + ('a' - 'A')) : c;
    }
}

std::string Fold(std::string_view text) {
    std::string folded;
    FoldTo(folded, text);
    return folded;
}

}  // namespace elasticd::engine
