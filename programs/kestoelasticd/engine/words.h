#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <type_traits>

/// How text becomes words, the same for what is indexed, asked for and highlighted. Takes any
/// bytes: what is not valid UTF-8 separates words. What is indexed depends on it: a change needs a
/// new format of the index. Any thread may call.
namespace elasticd::engine {

struct Word {
    enum class Kind {
        kWhole,
        kPart,  ///< of the camelCase word given just before; stands at the same place
        kPair,  ///< two neighbours of a run of CJK or Hangul
        kLast,  ///< the last character of such a run, or its only one
    };

    std::string_view text;  ///< folded; valid during the call only
    std::size_t begin;      ///< the bytes of the text that it stands for
    std::size_t end;
    Kind kind;
};

enum class Purpose {
    kIndex,  ///< all of the above
    kQuery,  ///< no parts; the last character only where the run has no other
};

/// Longer words are cut; both sides do.
inline constexpr std::size_t kMaxWord = 255;

namespace internal {
using WordFunction = bool (*)(void* context, const Word& word);
bool CutWords(std::string_view text, Purpose purpose, WordFunction take, void* context);
}  // namespace internal

/// Calls `take` (bool(const Word&)) for each word, until it returns false; then it does, too.
/// Whatever is not a letter or digit separates; letters and digits stay together. Runs of Chinese,
/// Japanese and Korean give all pairs of neighbours, since nothing separates their words.
template <typename Take>
bool CutWords(std::string_view text, Purpose purpose, Take&& take) {
    return internal::CutWords(
        text, purpose,
        [](void* context, const Word& word) {
            return (*static_cast<std::remove_reference_t<Take>*>(context))(word);
        },
        &take);
}

/// Calls `take` (bool(std::string_view)) for each stretch between blanks, until it returns false.
bool SplitAtBlanks(std::string_view text, bool (*take)(void* context, std::string_view stretch),
                   void* context);
template <typename Take>
bool SplitAtBlanks(std::string_view text, Take&& take) {
    return SplitAtBlanks(
        text,
        [](void* context, std::string_view stretch) {
            return (*static_cast<std::remove_reference_t<Take>*>(context))(stretch);
        },
        &take);
}

/// The text without differences of case, accents, width and compatibility forms.
std::string Fold(std::string_view text);
void FoldTo(std::string& out, std::string_view text);

/// The number of bytes of the UTF-8 character at `pos` (1 where there is no valid one).
std::size_t CharacterSize(std::string_view text, std::size_t pos);

}  // namespace elasticd::engine
