#include "programs/kestoelasticd/analyzer.h"

#include <gtest/gtest.h>
#include <unicode/brkiter.h>

#include <memory>
#include <random>
#include <vector>

namespace elasticd {
namespace {

using Tokens = std::vector<std::string>;

Tokens TokensOf(Analyzer analyzer, const std::string& text, Purpose purpose = Purpose::kIndex) {
    Tokens tokens;
    Analyze(analyzer, purpose, text, [&](const Token& token) {
        EXPECT_LT(token.begin, token.end);
        EXPECT_LE(token.end, text.size());
        tokens.emplace_back(token.text);
        return true;
    });
    return tokens;
}

TEST(Analyzer, CutsTextIntoTokens) {
    const struct {
        Analyzer analyzer;
        std::string text;
        Tokens expected;
    } cases[] = {
        {Analyzer::kKeyword, "Canon EOS/5D\xff", {"Canon EOS/5D\xff"}},
        {Analyzer::kWhiteSpace, " Ann  Lee\tBo\u00a0Ek\n", {"Ann", "Lee", "Bo", "Ek"}},
        {Analyzer::kStandard, " .,;- \n", {}},
        {Analyzer::kStandard,
         "\u00dcber R\u00c9SUM\u00c9 stra\u00dfe",
         {"uber", "resume", "strasse"}},
        {Analyzer::kStandard, "re\u0301sume\u0301 \ufb01le \uff21\uff22", {"resume", "file", "ab"}},
        {Analyzer::kStandard,
         "\u041f\u0440\u0438\u0432\u0435\u0442 \u039f\u0394\u039f\u03a3",
         {"\u043f\u0440\u0438\u0432\u0435\u0442", "\u03bf\u03b4\u03bf\u03c3"}},
        {Analyzer::kStandard,
         "\u6771\u4eac\u90fd",
         {"\u6771", "\u6771\u4eac", "\u4eac", "\u4eac\u90fd", "\u90fd"}},
        {Analyzer::kStandard, "A\u6771b", {"a", "\u6771", "b"}},
        {Analyzer::kStandard,
         "\u0915\u093f \u0e2a\u0e27\u0e31\u0e2a\u0e14\u0e35",
         {"\u0915\u093f", "\u0e2a\u0e27\u0e31\u0e2a\u0e14\u0e35"}},
        {Analyzer::kStandard, "ann@x.org \u00fc@@b@", {"ann", "x.org", "u", "b"}},
        {Analyzer::kStandard, "caf\xe9 ok", {"caf", "ok"}},
    };
    for (const auto& test : cases) {
        EXPECT_EQ(TokensOf(test.analyzer, test.text), test.expected) << test.text;
    }
}

TEST(Analyzer, AsksForThePairsOfACjkRunOnly) {
    EXPECT_EQ(TokensOf(Analyzer::kStandard, "\u6771\u4eac\u90fd", Purpose::kQuery),
              (Tokens{"\u6771\u4eac", "\u4eac\u90fd"}));
    EXPECT_EQ(TokensOf(Analyzer::kStandard, "\u6771", Purpose::kQuery), (Tokens{"\u6771"}));
}

/// Plain ASCII is cut without ICU: both must agree on every text.
TEST(Analyzer, CutsAsciiAsIcuDoes) {
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<icu::BreakIterator> words(
        icu::BreakIterator::createWordInstance(icu::Locale::getRoot(), status));
    ASSERT_TRUE(U_SUCCESS(status));
    const std::string alphabet = "aZ09_.',;:-#/ \t\x01";
    std::mt19937 random(7);
    for (int round = 0; round < 20000; ++round) {
        std::string text;
        for (auto size = random() % 12; text.size() < size;) {
            text += alphabet[random() % alphabet.size()];
        }
        const icu::UnicodeString unicode = icu::UnicodeString::fromUTF8(text);
        words->setText(unicode);
        Tokens expected;
        int begin = words->first();
        for (int end = words->next(); end != icu::BreakIterator::DONE;
             begin = end, end = words->next()) {
            const std::string word =
                text.substr(static_cast<std::size_t>(begin), static_cast<std::size_t>(end - begin));
            // To ICU, several underscores are a word, too.
            if (words->getRuleStatus() >= UBRK_WORD_NUMBER &&
                word.find_first_not_of('_') != std::string::npos) {
                expected.push_back(Fold(word));
            }
        }
        ASSERT_EQ(TokensOf(Analyzer::kStandard, text), expected) << '"' << text << '"';
    }
}

}  // namespace
}  // namespace elasticd
