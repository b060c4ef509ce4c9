#include "programs/kestoelasticd/highlight.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "programs/kestoelasticd/engine/words.h"

namespace elasticd {
namespace {

/// Bytes of the text: [first, second).
using Span = std::pair<std::size_t, std::size_t>;

/// Where the word ends that is asked for; 0 where it is not. Of a pair of characters of which only
/// the first was asked for, only that one counts.
std::size_t EndOfAsked(const engine::Word& word, const std::string& text, const AskedWords& words) {
    if (words.whole.contains(std::string(word.text))) {
        return word.end;
    }
    for (const std::string& beginning : words.beginnings) {
        if (word.text.starts_with(beginning)) {
            const bool pair = word.kind == engine::Word::Kind::kPair;
            return pair ? word.begin + engine::CharacterSize(text, word.begin) : word.end;
        }
    }
    return 0;
}

/// The words of the text that are asked for, up to one excerpt behind the first.
std::vector<Span> FindWords(const std::string& text, const AskedWords& words, std::size_t length) {
    std::vector<Span> found;
    engine::CutWords(text, engine::Purpose::kIndex, [&](const engine::Word& word) {
        if (const std::size_t end = EndOfAsked(word, text, words)) {
            found.emplace_back(word.begin, end);
        }
        return found.empty() || word.begin < found.front().first + length;
    });
    return found;
}

/// The parts of the text that are asked for. Folding changes sizes, so the place of each folded
/// byte is kept.
std::vector<Span> FindParts(const std::string& text, const AskedWords& words) {
    std::string folded;
    std::vector<std::size_t> places;
    for (std::size_t pos = 0; pos < text.size();) {
        const std::size_t size = engine::CharacterSize(text, pos);
        folded += engine::Fold(std::string_view(text).substr(pos, size));
        places.resize(folded.size(), pos);
        pos += size;
    }
    places.push_back(text.size());
    std::vector<Span> found;
    for (const std::string& word : words.whole) {
        for (std::size_t at = folded.find(word); at != std::string::npos && !word.empty();
             at = folded.find(word, at + word.size())) {
            found.emplace_back(places[at], places[at + word.size()]);
        }
    }
    return found;
}

/// Sorted, without overlaps: the pairs of a CJK run become one mark.
std::vector<Span> Merged(std::vector<Span> spans) {
    std::sort(spans.begin(), spans.end());
    std::vector<Span> merged;
    for (const Span& span : spans) {
        if (!merged.empty() && span.first <= merged.back().second) {
            merged.back().second = std::max(merged.back().second, span.second);
        } else {
            merged.push_back(span);
        }
    }
    return merged;
}

bool IsInsideCharacter(const std::string& text, std::size_t pos) {
    return pos < text.size() && (text[pos] & '\xc0') == '\x80';
}

}  // namespace

std::string Highlight(const engine::FieldSettings& settings, const std::string& text,
                      const AskedWords& words, const HighlightStyle& style) {
    const std::vector<Span> spans =
        Merged(settings.ngram ? FindParts(text, words) : FindWords(text, words, style.length));
    if (spans.empty()) {
        return std::string();
    }
    const std::size_t before = style.length / 4;
    std::size_t begin = spans.front().first > before ? spans.front().first - before : 0;
    std::size_t end = std::min(text.size(), begin + std::max(style.length, before + 1));
    end = std::max(end, spans.front().second);
    while (begin > 0 && IsInsideCharacter(text, begin)) {
        --begin;
    }
    while (IsInsideCharacter(text, end)) {
        ++end;
    }
    std::string excerpt;
    std::size_t done = begin;
    for (const auto& [first, last] : spans) {
        if (last > end) {
            break;
        }
        excerpt.append(text, done, first - done).append(style.pre);
        excerpt.append(text, first, last - first).append(style.post);
        done = last;
    }
    return excerpt.append(text, done, end - done);
}

}  // namespace elasticd
