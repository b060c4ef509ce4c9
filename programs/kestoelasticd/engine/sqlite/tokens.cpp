#include "programs/kestoelasticd/engine/sqlite/tokens.h"

#include <sodium.h>

#include <charconv>

#include "programs/kestoelasticd/engine/words.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr char kGram = '\x02';
constexpr char kKeyword = '\x03';
constexpr char kNumber = '\x04';
constexpr char kScoped = '\x05';
constexpr std::string_view kBetween = "\x06";
constexpr char kEscape = '\x1b';

/// Two bytes that are never 0, at which the query language ends.
void AppendFieldNumber(std::string& out, unsigned int field) {
    out += static_cast<char>(1 + field / 255);
    out += static_cast<char>(1 + field % 255);
}

void AppendEscaped(std::string& out, std::string_view text) {
    for (const char c : text) {
        if (c == '\0' || c == kEscape) {
            out += kEscape;
        }
        out += c == '\0' ? '0' : c;
    }
}

std::string ScopePrefix(unsigned int scope) {
    std::string prefix;
    if (scope != kNoScope) {
        prefix += kScoped;
        AppendFieldNumber(prefix, scope);
    }
    return prefix;
}

std::string Digest(std::string_view text) {
    std::string digest(16, '\0');
    crypto_generichash(reinterpret_cast<unsigned char*>(digest.data()), digest.size(),
                       reinterpret_cast<const unsigned char*>(text.data()), text.size(), nullptr,
                       0);
    return digest;
}

/// Each character with its neighbour, and the last of each stretch between blanks alone, so that
/// every character begins a token and no phrase goes over a blank unless it is asked to.
template <typename Take>
int CutGrams(std::string_view folded, const std::string& prefix, bool with_last, Take&& take) {
    std::string token = prefix;
    int result = 0;
    const auto grams = [&](std::string_view word, bool last_too) {
        for (std::size_t pos = 0; pos < word.size() && result == 0;) {
            const std::size_t next = pos + CharacterSize(word, pos);
            const bool last = next >= word.size();
            const std::size_t end = last ? next : next + CharacterSize(word, next);
            if (!last || last_too || pos == 0) {
                token.resize(prefix.size());
                AppendEscaped(token, word.substr(pos, end - pos));
                result = take(token);
            }
            pos = next;
        }
    };
    std::string_view held;
    SplitAtBlanks(folded, [&](std::string_view word) {
        grams(held, true);
        held = word;
        return result == 0;
    });
    grams(held, with_last);
    return result;
}

/// Takes apart what ColumnText has built and gives it to FTS5 token by token.
class ColumnTokenizer {
  public:
    ColumnTokenizer(TokenFunction take, void* context) : take_(take), context_(context) {}

    int Run(std::string_view bytes) {
        int result = 0;
        for (bool first = true; result == 0 && bytes.size() >= kHead; first = false) {
            const char way = bytes[0];
            const auto field = static_cast<unsigned int>(TakeNumber(bytes, 1, 4));
            const std::size_t size = TakeNumber(bytes, 5, 4);
            bytes.remove_prefix(kHead);
            const std::string_view text = bytes.substr(0, size);
            bytes.remove_prefix(text.size());
            result = first || way == 't' ? 0 : take_(context_, kBetween, false);
            if (result == 0) {
                result = Stretch(way, field, text);
            }
        }
        return result;
    }

    static constexpr std::size_t kHead = 9;

  private:
    static std::size_t TakeNumber(std::string_view bytes, std::size_t at, std::size_t size) {
        std::size_t number = 0;
        for (std::size_t i = 0; i < size; ++i) {
            number = number << 8 | static_cast<unsigned char>(bytes[at + i]);
        }
        return number;
    }

    int Stretch(char way, unsigned int field, std::string_view text) {
        switch (way) {
            case 'w':
                return Words(text);
            case 'b':
            case 's':
                return ScopedWords(field, way == 'b', text);
            case 'g':
            case 'h':
                return CutGrams(
                    text, std::string(1, kGram) + (way == 'h' ? ScopePrefix(field) : ""), true,
                    [&](const std::string& token) { return take_(context_, token, false); });
            case 't':
                return take_(context_, text, false);
            default:
                return 0;
        }
    }

    int Words(std::string_view text) {
        int result = 0;
        CutWords(text, Purpose::kIndex, [&](const Word& word) {
            result = take_(context_, word.text, word.kind == Word::Kind::kPart);
            return result == 0;
        });
        return result;
    }

    int ScopedWords(unsigned int field, bool in_all, std::string_view text) {
        std::string token = ScopePrefix(field);
        const std::size_t prefix = token.size();
        int result = 0;
        CutWords(text, Purpose::kIndex, [&](const Word& word) {
            token.resize(prefix);
            token += word.text;
            result = take_(context_, token, word.kind == Word::Kind::kPart);
            if (result == 0 && in_all) {
                result = take_(context_, word.text, true);
            }
            return result == 0;
        });
        return result;
    }

    const TokenFunction take_;
    void* const context_;
};

}  // namespace

void ColumnText::Add(char way, unsigned int field, std::string_view text) {
    bytes_ += way;
    for (int shift = 24; shift >= 0; shift -= 8) {
        bytes_ += static_cast<char>(field >> shift);
    }
    for (int shift = 24; shift >= 0; shift -= 8) {
        bytes_ += static_cast<char>(text.size() >> shift);
    }
    bytes_ += text;
}

int TokenizeColumn(std::string_view bytes, TokenFunction take, void* context) {
    return ColumnTokenizer(take, context).Run(bytes);
}

std::string KeywordPrefix(unsigned int field, std::string_view value) {
    std::string token(1, kKeyword);
    AppendFieldNumber(token, field);
    AppendEscaped(token, value);
    return token;
}

std::string KeywordToken(unsigned int field, std::string_view value) {
    std::string token = KeywordPrefix(field, value.substr(0, kKeptOfKeyword));
    if (value.size() > kKeptOfKeyword) {
        AppendEscaped(token, Digest(value));
    }
    return token;
}

std::string NumberToken(const Value& number) {
    char digits[40];
    std::to_chars_result end{};
    std::string token(1, kNumber);
    if (const auto* whole = std::get_if<std::int64_t>(&number)) {
        token += 'i';
        end = std::to_chars(digits, digits + sizeof(digits), *whole);
    } else {
        token += 'd';
        end = std::to_chars(digits, digits + sizeof(digits), std::get<double>(number));
    }
    return token.append(digits, end.ptr);
}

Phrase WordPhrase(std::string_view text, unsigned int scope) {
    Phrase phrase;
    const std::string prefix = ScopePrefix(scope);
    CutWords(text, Purpose::kQuery, [&](const Word& word) {
        phrase.tokens.push_back(prefix + std::string(word.text));
        phrase.prefix = word.kind == Word::Kind::kLast;
        return true;
    });
    return phrase;
}

Phrase GramPhrase(std::string_view folded, unsigned int scope) {
    Phrase phrase;
    CutGrams(folded, std::string(1, kGram) + ScopePrefix(scope), false,
             [&](const std::string& token) {
                 phrase.tokens.push_back(token);
                 return 0;
             });
    // A lone character at the end is what the pair there begins with.
    std::string_view last;
    SplitAtBlanks(folded, [&](std::string_view word) {
        last = word;
        return true;
    });
    phrase.prefix = !last.empty() && CharacterSize(last, 0) == last.size();
    return phrase;
}

std::string Quote(const Phrase& phrase) {
    std::string quoted;
    for (const std::string& token : phrase.tokens) {
        quoted += quoted.empty() ? "\"" : " + \"";
        for (const char c : token) {
            quoted.append(c == '"' ? 2 : 1, c);
        }
        quoted += '"';
    }
    return phrase.prefix ? quoted + " *" : quoted;
}

}  // namespace elasticd::engine::sqlite
