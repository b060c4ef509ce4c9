#include "programs/kestoelasticd/analyzer.h"

#include <unicode/brkiter.h>
#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/uscript.h>
#include <unicode/utext.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <array>
#include <memory>
#include <new>

namespace elasticd {
namespace {

/// Ends a word by the standard; some versions of ICU take it for a letter.
constexpr char kSeparator = '@';

bool IsAscii(std::string_view text) {
    return std::all_of(text.begin(), text.end(), [](char c) { return (c & '\x80') == 0; });
}

bool IsAsciiBlank(char c) {
    return c == ' ' || (c >= '\t' && c <= '\r');
}

/// Reads the character at `pos` and moves on. Negative for bytes that are no character.
UChar32 NextCharacter(std::string_view text, std::size_t& pos) {
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    UChar32 character = 0;
    U8_NEXT(bytes, pos, text.size(), character);
    return character;
}

bool IsCjk(UChar32 c) {
    return c >= 0x2e80 &&
           (c == 0x30fc || uscript_hasScript(c, USCRIPT_HAN) ||
            uscript_hasScript(c, USCRIPT_HIRAGANA) || uscript_hasScript(c, USCRIPT_KATAKANA));
}

/// A mark that a reader leaves out when typing: an accent, not a vowel of an Indic script.
bool IsFoldedMark(UChar32 c) {
    if (c < 0x300 || u_charType(c) != U_NON_SPACING_MARK || c == 0x3099 || c == 0x309a) {
        return false;
    }
    UErrorCode status = U_ZERO_ERROR;
    const UScriptCode script = uscript_getScript(c, &status);
    return script == USCRIPT_INHERITED || script == USCRIPT_ARABIC || script == USCRIPT_HEBREW;
}

void CheckIcu(UErrorCode status) {
    if (U_FAILURE(status)) {
        throw std::bad_alloc();  // with fixed data and checked arguments nothing else can fail
    }
}

std::string FoldUnicode(std::string_view text) {
    UErrorCode status = U_ZERO_ERROR;
    const icu::Normalizer2* case_fold = icu::Normalizer2::getNFKCCasefoldInstance(status);
    const icu::Normalizer2* decompose = icu::Normalizer2::getNFDInstance(status);
    const icu::Normalizer2* compose = icu::Normalizer2::getNFCInstance(status);
    CheckIcu(status);
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
    CheckIcu(status);
    return out;
}

void FoldTo(std::string& out, std::string_view text) {
    if (IsAscii(text)) {
        out.assign(text);
        for (char& c : out) {
            c = c >= 'A' && c <= 'Z' ? static_cast<char>(c + ('a' - 'A')) : c;
        }
    } else {
        out = FoldUnicode(text);
    }
}

enum CharClass : char { kOther, kLetter, kDigit, kUnderscore, kInWord, kInNumber, kInBoth };

constexpr std::array<CharClass, 128> kClasses = [] {
    std::array<CharClass, 128> classes{};
    for (char c = 'a'; c <= 'z'; ++c) {
        classes[static_cast<std::size_t>(c)] = kLetter;
        classes[static_cast<std::size_t>(c - 'a' + 'A')] = kLetter;
    }
    for (char c = '0'; c <= '9'; ++c) {
        classes[static_cast<std::size_t>(c)] = kDigit;
    }
    classes['_'] = kUnderscore;
    classes[','] = classes[';'] = kInNumber;
    classes['.'] = classes['\''] = kInBoth;
    return classes;
}();

CharClass ClassAt(std::string_view text, std::size_t pos) {
    return pos < text.size() ? kClasses[static_cast<std::size_t>(text[pos] & 0x7f)] : kOther;
}

/// Whether the punctuation at `pos` stands within a word ("o'clock") or a number ("3.14").
bool JoinsNeighbours(std::string_view text, std::size_t pos) {
    const CharClass before = ClassAt(text, pos - 1);
    const CharClass own = ClassAt(text, pos);
    return before == ClassAt(text, pos + 1) &&
           ((before == kLetter && own == kInBoth) || (before == kDigit && own >= kInNumber));
}

class StandardTokenizer {
  public:
    StandardTokenizer(Purpose purpose, std::string_view text, const TokenSink& sink)
        : purpose_(purpose), text_(text), sink_(sink) {}

    /// The text is taken in stretches between blanks: those that are plain ASCII, most of all
    /// text, need no help from ICU.
    bool Run() {
        std::size_t pos = 0;
        bool go_on = true;
        while (go_on && SkipBlanks(pos)) {
            const std::size_t begin = pos;
            bool ascii = ReadStretch(pos);
            if (!ascii) {
                pos = begin;
                ReadForeignStretches(pos);
            }
            go_on = ascii ? AsciiWords(begin, pos) : ForeignRuns(begin, pos);
        }
        return go_on;
    }

  private:
    bool SkipBlanks(std::size_t& pos) const {
        while (pos < text_.size() && IsAsciiBlank(text_[pos])) {
            ++pos;
        }
        return pos < text_.size();
    }

    /// Moves behind the stretch; whether it is plain ASCII.
    bool ReadStretch(std::size_t& pos) const {
        char bits = 0;
        for (; pos < text_.size() && !IsAsciiBlank(text_[pos]); ++pos) {
            bits = static_cast<char>(bits | text_[pos]);
        }
        return (bits & '\x80') == 0;
    }

    /// Moves behind all stretches that are not plain ASCII, blanks between them included.
    void ReadForeignStretches(std::size_t& pos) const {
        std::size_t next = pos;
        while (SkipBlanks(next) && !ReadStretch(next)) {
            pos = next;
        }
    }

    bool Emit(std::size_t begin, std::size_t end) {
        FoldTo(folded_, text_.substr(begin, end - begin));
        return folded_.empty() || sink_({folded_, begin, end, position_});
    }

    bool EmitWord(std::size_t begin, std::size_t end) {
        ++position_;
        return Emit(begin, end);
    }

    bool AsciiWords(std::size_t begin, std::size_t end) {
        const std::string_view stretch = text_.substr(0, end);
        for (std::size_t pos = begin; pos < end;) {
            const std::size_t start = pos;
            bool has_content = false;
            for (CharClass c = ClassAt(stretch, pos);
                 pos < end && (c == kLetter || c == kDigit || c == kUnderscore ||
                               (pos > start && JoinsNeighbours(stretch, pos)));
                 c = ClassAt(stretch, ++pos)) {
                has_content |= c == kLetter || c == kDigit;
            }
            if (pos == start) {
                ++pos;
            } else if (has_content && !EmitWord(start, pos)) {
                return false;
            }
        }
        return true;
    }

    /// Splits text into runs of CJK, cut into pairs here, and of everything else, cut by ICU.
    bool ForeignRuns(std::size_t begin, std::size_t end) {
        const std::string_view stretch = text_.substr(0, end);
        for (std::size_t pos = begin; pos < end;) {
            const std::size_t start = pos;
            const bool cjk = IsCjk(NextCharacter(stretch, pos));
            if (stretch[start] == kSeparator) {
                continue;
            }
            for (std::size_t next = pos; next < end && stretch[pos] != kSeparator; pos = next) {
                const UChar32 c = NextCharacter(stretch, next);
                const bool mark = c >= 0 && (U_GET_GC_MASK(c) & U_GC_M_MASK) != 0;
                if (!mark && IsCjk(c) != cjk) {
                    break;
                }
            }
            if (!(cjk ? CjkRun(start, pos) : IcuWords(start, pos))) {
                return false;
            }
        }
        return true;
    }

    bool CjkRun(std::size_t begin, std::size_t end) {
        const std::string_view run = text_.substr(0, end);
        std::size_t next = begin;
        NextCjk(run, next);
        const bool single = next == end;
        for (std::size_t pos = begin; pos < end; pos = next) {
            next = pos;
            NextCjk(run, next);
            ++position_;
            if ((single || purpose_ == Purpose::kIndex) && !Emit(pos, next)) {
                return false;
            }
            std::size_t after = next;
            NextCjk(run, after);
            if (next < end && !Emit(pos, after)) {
                return false;
            }
        }
        return true;
    }

    /// Moves behind a character and the marks on it.
    static void NextCjk(std::string_view run, std::size_t& pos) {
        while (pos < run.size()) {
            std::size_t next = pos;
            const UChar32 c = NextCharacter(run, next);
            pos = next;
            if (next >= run.size()) {
                return;
            }
            const UChar32 following = NextCharacter(run, next);
            if (c < 0 || following < 0 || (U_GET_GC_MASK(following) & U_GC_M_MASK) == 0) {
                return;
            }
        }
    }

    bool IcuWords(std::size_t begin, std::size_t end) {
        UErrorCode status = U_ZERO_ERROR;
        static thread_local const std::unique_ptr<icu::BreakIterator> words(
            icu::BreakIterator::createWordInstance(icu::Locale::getRoot(), status));
        CheckIcu(status);
        UText utext = UTEXT_INITIALIZER;
        utext_openUTF8(&utext, text_.data() + begin, static_cast<std::int64_t>(end - begin),
                       &status);
        words->setText(&utext, status);
        CheckIcu(status);
        bool go_on = true;
        std::int32_t start = words->first();
        for (std::int32_t stop = words->next(); go_on && stop != icu::BreakIterator::DONE;
             start = stop, stop = words->next()) {
            if (words->getRuleStatus() >= UBRK_WORD_NUMBER) {
                go_on = EmitWord(begin + static_cast<std::size_t>(start),
                                 begin + static_cast<std::size_t>(stop));
            }
        }
        utext_close(&utext);
        return go_on;
    }

    const Purpose purpose_;
    const std::string_view text_;
    const TokenSink& sink_;
    unsigned int position_ = 0;
    std::string folded_;
};

bool SplitAtBlanks(std::string_view text, const TokenSink& sink) {
    unsigned int position = 0;
    std::size_t start = 0;
    const auto emit = [&](std::size_t end) {
        return end == start || sink({text.substr(start, end - start), start, end, ++position});
    };
    for (std::size_t pos = 0; pos < text.size();) {
        const std::size_t before = pos;
        const UChar32 c = NextCharacter(text, pos);
        if (c >= 0 && u_isUWhiteSpace(c)) {
            if (!emit(before)) {
                return false;
            }
            start = pos;
        }
    }
    return emit(text.size());
}

}  // namespace

bool Analyze(Analyzer analyzer, Purpose purpose, std::string_view text, const TokenSink& sink) {
    switch (analyzer) {
        case Analyzer::kKeyword:
            return text.empty() || sink({text, 0, text.size(), 1});
        case Analyzer::kWhiteSpace:
            return SplitAtBlanks(text, sink);
        case Analyzer::kStandard:
            break;
    }
    return StandardTokenizer(purpose, text, sink).Run();
}

std::string Fold(std::string_view text) {
    std::string folded;
    FoldTo(folded, text);
    return folded;
}

std::size_t CharacterSize(std::string_view text, std::size_t pos) {
    std::size_t next = pos;
    NextCharacter(text, next);
    return next - pos;
}

}  // namespace elasticd
