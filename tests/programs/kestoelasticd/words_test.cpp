#include "programs/kestoelasticd/engine/words.h"

#include <gtest/gtest.h>

#include <vector>

#include "programs/kestoelasticd/engine/sqlite/tokens.h"

namespace elasticd::engine {
namespace {

using Tokens = std::vector<std::string>;

Tokens WordsOf(const std::string& text, Purpose purpose = Purpose::kIndex) {
    Tokens words;
    EXPECT_TRUE(CutWords(text, purpose, [&](const Word& word) {
        EXPECT_LT(word.begin, word.end);
        EXPECT_LE(word.end, text.size());
        words.emplace_back(word.text);
        return true;
    })) << text;
    return words;
}

TEST(Words, AreCutAndFolded) {
    const struct {
        std::string text;
        Tokens expected;
    } cases[] = {
        {" .,;- \n", {}},
        {"\u00dcber R\u00c9SUM\u00c9 stra\u00dfe", {"uber", "resume", "strasse"}},
        {"re\u0301sume\u0301 \ufb01le \uff21\uff22", {"resume", "file", "ab"}},
        {"\u041f\u0440\u0438\u0432\u0435\u0442 \u039f\u0394\u039f\u03a3",
         {"\u043f\u0440\u0438\u0432\u0435\u0442", "\u03bf\u03b4\u03bf\u03c3"}},
        {"\u6771\u4eac\u90fd", {"\u6771\u4eac", "\u4eac\u90fd", "\u90fd"}},
        {"A\u6771b", {"a", "\u6771", "b"}},
        {"\u0915\u093f \u0e2a\u0e27\u0e31\u0e2a\u0e14\u0e35",
         {"\u0915\u093f", "\u0e2a\u0e27\u0e31\u0e2a\u0e14\u0e35"}},
        {"ada.lovelace@x.org l'\u00e9cole server_name",
         {"ada", "lovelace", "x", "org", "l", "ecole", "server", "name"}},
        {"caf\xe9 ok", {"caf", "ok"}},
        {"fileIndex HTTPServer2", {"fileindex", "file", "index", "httpserver2", "http", "server2"}},
        {"aB\u2014", {"ab", "a", "b"}},
        {std::string(300, 'x'), {std::string(kMaxWord, 'x')}},
    };
    for (const auto& test : cases) {
        EXPECT_EQ(WordsOf(test.text), test.expected) << test.text;
    }
    EXPECT_EQ(WordsOf("\u6771\u4eac\u90fd", Purpose::kQuery),
              (Tokens{"\u6771\u4eac", "\u4eac\u90fd"}));
    EXPECT_EQ(WordsOf("\u6771 fileIndex", Purpose::kQuery), (Tokens{"\u6771", "fileindex"}));
}

/// A query's tokens, side by side, are found in those of the text that it was taken from.
TEST(Tokens, APartOfANameIsAPhraseOfItsPairs) {
    const struct {
        const char* name;
        const char* part;
        bool found;
    } cases[] = {
        {"report 2020.pdf", "port", true},
        {"report 2020.pdf", "20.p", true},
        {"report 2020.pdf", "t 2", true},
        {"report 2020.pdf", "tr", false},
        {"report 2020.pdf", "report 2020.pdf", true},
        {"report 2020.pdf", "t2", false},
        {"abab", "baba", false},
        {"x y", "y", true},
        {"\u00e4\u00f6", "\u00f6", true},
        {"ab", "abc", false},
    };
    for (const auto& test : cases) {
        sqlite::ColumnText column;
        column.AddGrams(test.name);
        Tokens held;
        sqlite::TokenizeColumn(
            column.Bytes(),
            [](void* out, std::string_view token, bool) {
                static_cast<Tokens*>(out)->emplace_back(token);
                return 0;
            },
            &held);
        const sqlite::Phrase phrase = sqlite::GramPhrase(test.part, sqlite::kNoScope);
        bool found = false;
        for (std::size_t at = 0; at + phrase.tokens.size() <= held.size(); ++at) {
            bool fits = true;
            for (std::size_t i = 0; i < phrase.tokens.size(); ++i) {
                const bool last = i + 1 == phrase.tokens.size();
                fits &= phrase.prefix && last ? held[at + i].starts_with(phrase.tokens[i])
                                              : held[at + i] == phrase.tokens[i];
            }
            found |= fits;
        }
        EXPECT_EQ(found, test.found) << test.name << " / " << test.part;
    }
}

}  // namespace
}  // namespace elasticd::engine
