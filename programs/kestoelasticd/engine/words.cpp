#include "programs/kestoelasticd/engine/words.h"

#include <unicode/brkiter.h>
#include <unicode/uchar.h>
#include <unicode/uscript.h>
#include <unicode/utext.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <array>
#include <memory>
#include <new>

namespace elasticd::engine {
namespace {

/// Reads the character at `pos` and moves on. Negative for bytes that are no character.
UChar32 NextCharacter(std::string_view text, std::size_t& pos) {
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    UChar32 character = 0;
    U8_NEXT(bytes, pos, text.size(), character);
    return character;
}

enum AsciiClass : char { kOther, kLower, kUpper, kDigit };

constexpr std::array<AsciiClass, 256> kClasses = [] {
    std::array<AsciiClass, 256> classes{};
    for (std::size_t i = 0; i < 26; ++i) {
        classes['a' + i] = kLower;
        classes['A' + i] = kUpper;
    }
    for (std::size_t i = '0'; i <= '9'; ++i) {
        classes[i] = kDigit;
    }
    return classes;
}();

AsciiClass ClassOf(char c) {
    return kClasses[static_cast<unsigned char>(c)];
}

bool IsAscii(char c) {
    return (c & '\x80') == 0;
}

bool IsMark(UChar32 c) {
    return c >= 0x300 && (U_GET_GC_MASK(c) & U_GC_M_MASK) != 0;
}

/// Characters of no width that may stand within a word: folding drops them.
bool IsIgnorable(UChar32 c) {
    return c == 0xad || (c >= 0x200b && c <= 0x200d) || c == 0x2060 || c == 0xfeff;
}

bool IsWordCharacter(UChar32 c) {
    return c >= 0 &&
           ((U_GET_GC_MASK(c) & (U_GC_L_MASK | U_GC_N_MASK | U_GC_M_MASK)) != 0 || IsIgnorable(c));
}

bool IsPaired(UChar32 c) {
    if (c < 0x1100) {
        return false;
    }
    UErrorCode status = U_ZERO_ERROR;
    const UScriptCode script = uscript_getScript(c, &status);
    return script == USCRIPT_HAN || script == USCRIPT_HIRAGANA || script == USCRIPT_KATAKANA ||
           script == USCRIPT_HANGUL || c == 0x30fc || c == 0xff70;
}

/// Scripts whose words only a dictionary can tell apart.
bool NeedsDictionary(UChar32 c) {
    return (c >= 0x0e00 && c < 0x0f00) || (c >= 0x1000 && c < 0x10a0) ||
           (c >= 0x1780 && c < 0x1800);
}

void CheckIcu(UErrorCode status) {
    if (U_FAILURE(status)) {
        throw std::bad_alloc();  // with fixed data and checked arguments nothing else can fail
    }
}

/// Closes the text however its scope is left.
struct OpenText {
    explicit OpenText(std::string_view text) {
        UErrorCode status = U_ZERO_ERROR;
        utext_openUTF8(&utext, text.data(), static_cast<std::int64_t>(text.size()), &status);
        CheckIcu(status);
    }
    ~OpenText() { utext_close(&utext); }
    OpenText(const OpenText&) = delete;
    OpenText& operator=(const OpenText&) = delete;

    UText utext = UTEXT_INITIALIZER;
};

class Cutter {
  public:
    Cutter(std::string_view text, Purpose purpose, internal::WordFunction take, void* context)
        : text_(text), purpose_(purpose), take_(take), context_(context) {}

    /// Most text is ASCII and needs no help from ICU; a word that meets anything else is read again
    /// character by character.
    bool Run() {
        for (std::size_t pos = 0; pos < text_.size();) {
            if (IsAscii(text_[pos]) && ClassOf(text_[pos]) == kOther) {
                ++pos;
                continue;
            }
            const std::size_t begin = pos;
            while (pos < text_.size() && ClassOf(text_[pos]) != kOther) {
                ++pos;
            }
            const bool ascii = pos == text_.size() || IsAscii(text_[pos]);
            if (!(ascii ? AsciiWord(begin, pos) : ForeignWord(pos = begin))) {
                return false;
            }
        }
        return true;
    }

  private:
    bool Give(std::size_t begin, std::size_t end, Word::Kind kind) {
        FoldTo(folded_, text_.substr(begin, end - begin));
        return folded_.empty() || Give(folded_, begin, end, kind);
    }

    bool Give(std::string_view folded, std::size_t begin, std::size_t end, Word::Kind kind) {
        return take_(context_, {folded.substr(0, kMaxWord), begin, end, kind});
    }

    bool AsciiWord(std::size_t begin, std::size_t end) {
        folded_.assign(text_, begin, end - begin);
        bool upper_inside = false;
        for (std::size_t i = 0; i < folded_.size(); ++i) {
            if (ClassOf(folded_[i]) == kUpper) {
                folded_[i] = static_cast<char>(folded_[i] + ('a' - 'A'));
                upper_inside |= i > 0;
            }
        }
        return Give(folded_, begin, end, Word::Kind::kWhole) &&
               (!upper_inside || purpose_ == Purpose::kQuery || CamelParts(begin, end));
    }

    /// Whether a part of camelCase begins there: "fileIndex", "HTTPServer", "v2Beta".
    bool IsCamelBorder(std::size_t pos, std::size_t end) const {
        return ClassOf(text_[pos]) == kUpper &&
               (ClassOf(text_[pos - 1]) != kUpper ||
                (pos + 1 < end && ClassOf(text_[pos + 1]) == kLower));
    }

    bool CamelParts(std::size_t begin, std::size_t end) {
        std::size_t start = begin;
        for (std::size_t pos = begin + 1; pos <= end; ++pos) {
            if (pos < end ? IsCamelBorder(pos, end) : start > begin) {
                const std::string_view part =
                    std::string_view(folded_).substr(start - begin, pos - start);
                if (!Give(part, start, pos, Word::Kind::kPart)) {
                    return false;
                }
                start = pos;
            }
        }
        return true;
    }

    /// A run of characters that are cut the same way, from `pos` on; moves behind it.
    bool ForeignWord(std::size_t& pos) {
        const std::size_t begin = pos;
        const UChar32 first = NextCharacter(text_, pos);
        if (!IsWordCharacter(first)) {
            return true;
        }
        const bool paired = IsPaired(first);
        bool dictionary = NeedsDictionary(first);
        bool ascii = first < 0x80;
        while (pos < text_.size()) {
            std::size_t next = pos;
            const UChar32 c = NextCharacter(text_, next);
            if (!IsWordCharacter(c) || (!IsMark(c) && !IsIgnorable(c) && IsPaired(c) != paired)) {
                break;
            }
            dictionary |= NeedsDictionary(c);
            ascii &= c < 0x80;
            pos = next;
        }
        return ascii        ? AsciiWord(begin, pos)
               : paired     ? PairedRun(begin, pos)
               : dictionary ? DictionaryWords(begin, pos)
                            : Give(begin, pos, Word::Kind::kWhole);
    }

    /// Behind the character at `pos` and the marks on it.
    std::size_t AfterCharacter(std::size_t pos, std::size_t end) const {
        NextCharacter(text_, pos);
        while (pos < end) {
            std::size_t next = pos;
            const UChar32 c = NextCharacter(text_, next);
            if (!IsMark(c) && !IsIgnorable(c)) {
                break;
            }
            pos = next;
        }
        return pos;
    }

    bool PairedRun(std::size_t begin, std::size_t end) {
        for (std::size_t pos = begin; pos < end;) {
            const std::size_t next = AfterCharacter(pos, end);
            const bool last = next == end;
            if (last && purpose_ == Purpose::kQuery && pos != begin) {
                break;
            }
            const std::size_t after = last ? next : AfterCharacter(next, end);
            if (!Give(pos, after, last ? Word::Kind::kLast : Word::Kind::kPair)) {
                return false;
            }
            pos = next;
        }
        return true;
    }

    bool DictionaryWords(std::size_t begin, std::size_t end) {
        UErrorCode status = U_ZERO_ERROR;
        static thread_local const std::unique_ptr<icu::BreakIterator> words(
            icu::BreakIterator::createWordInstance(icu::Locale::getRoot(), status));
        CheckIcu(status);
        OpenText run(text_.substr(begin, end - begin));
        words->setText(&run.utext, status);
        CheckIcu(status);
        std::int32_t start = words->first();
        for (std::int32_t stop = words->next(); stop != icu::BreakIterator::DONE;
             start = stop, stop = words->next()) {
            if (!Give(begin + static_cast<std::size_t>(start),
                      begin + static_cast<std::size_t>(stop), Word::Kind::kWhole)) {
                return false;
            }
        }
        return true;
    }

    const std::string_view text_;
    const Purpose purpose_;
    const internal::WordFunction take_;
    void* const context_;
    std::string folded_;
};

}  // namespace

bool internal::CutWords(std::string_view text, Purpose purpose, WordFunction take, void* context) {
    return Cutter(text, purpose, take, context).Run();
}

bool SplitAtBlanks(std::string_view text, bool (*take)(void* context, std::string_view stretch),
                   void* context) {
    std::size_t start = 0;
    const auto give = [&](std::size_t end) {
        return end == start || take(context, text.substr(start, end - start));
    };
    for (std::size_t pos = 0; pos < text.size();) {
        const std::size_t before = pos;
        const UChar32 c = NextCharacter(text, pos);
        if (c >= 0 && u_isUWhiteSpace(c)) {
            if (!give(before)) {
                return false;
            }
            start = pos;
        }
    }
    return give(text.size());
}

std::size_t CharacterSize(std::string_view text, std::size_t pos) {
    std::size_t next = pos;
    NextCharacter(text, next);
    return next - pos;
}

}  // namespace elasticd::engine
