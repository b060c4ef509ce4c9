#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "programs/kestoelasticd/engine/value.h"

/// What stands in the full-text table, as tokens. Words are tokens as they are; everything else
/// begins with a control character, which no word does:
///
///   \x02 <pair>             two neighbours of an n-gram field's characters, or a last one alone
///   \x03 <number> <value>   the whole value of a keyword field
///   \x04 i|d <digits>       a number that "_all" finds
///   \x05 <number> <token>   a word or pair of a field that has no column of its own, or that
///                           "_all" does not find
///   \x06                    between two values in one column: no phrase goes over it
///
/// All of it is on disk: a change needs a new format of the index.
namespace elasticd::engine::sqlite {

/// Builds what one column of the full-text table is given for a document: stretches of text, each
/// with the way in which the tokenizer is to take it. The text itself is not kept there.
class ColumnText {
  public:
    void AddWords(std::string_view text) { Add('w', 0, text); }
    /// Words that are found in the field of that number only, or (`in_all`) by "_all", too.
    void AddScopedWords(unsigned int field, bool in_all, std::string_view text) {
        Add(in_all ? 'b' : 's', field, text);
    }
    void AddGrams(std::string_view folded) { Add('g', 0, folded); }
    void AddScopedGrams(unsigned int field, std::string_view folded) { Add('h', field, folded); }
    void AddToken(std::string_view token) { Add('t', 0, token); }

    bool IsEmpty() const { return bytes_.empty(); }
    const std::string& Bytes() const { return bytes_; }

  private:
    void Add(char way, unsigned int field, std::string_view text);

    std::string bytes_;
};

using TokenFunction = int (*)(void* context, std::string_view token, bool same_place);

/// Gives the tokens of what ColumnText has built. Ends early, with its result, when `take` returns
/// something else than 0. What is no such thing gives nothing.
int TokenizeColumn(std::string_view bytes, TokenFunction take, void* context);

/// What a query asks a column for: tokens side by side.
struct Phrase {
    std::vector<std::string> tokens;
    bool prefix = false;  ///< the last token may go on
};

std::string KeywordToken(unsigned int field, std::string_view value);
/// The beginning of the keyword tokens of all values that begin so. `value` is at most
/// kKeptOfKeyword bytes long.
std::string KeywordPrefix(unsigned int field, std::string_view value);
inline constexpr std::size_t kKeptOfKeyword = 200;
/// `number` is an int64_t or a double.
std::string NumberToken(const Value& number);

/// The words of the text, one after the other. Not scoped: `field` is 0xffffffff.
inline constexpr unsigned int kNoScope = 0xffffffff;
Phrase WordPhrase(std::string_view text, unsigned int scope);
/// A part of an n-gram field. `folded` may hold blanks.
Phrase GramPhrase(std::string_view folded, unsigned int scope);

/// The phrase in the full-text table's query language.
std::string Quote(const Phrase& phrase);

}  // namespace elasticd::engine::sqlite
