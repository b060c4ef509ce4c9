#include "programs/kestoelasticd/document_editor.h"

#include <map>
#include <vector>

#include "common/error.h"
#include "programs/kestoelasticd/analyzer.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

/// Between the texts of one field, so that no run of words reaches from one into the next.
constexpr unsigned int kPositionGap = 100;
constexpr std::size_t kMaxGramText = 64 * 1024;

template <typename Take>
void WalkIdTerms(const std::string& id, const Take& take) {
    take(IdTerm(id));
    for (std::size_t slash = id.find('/'); slash != std::string::npos;
         slash = id.find('/', slash + 1)) {
        take(FolderTerm(std::string_view(id).substr(0, slash)));
    }
}

}  // namespace

void WalkTexts(const Json::Value& value, const std::function<void(const std::string&)>& take) {
    if (value.isArray() || value.isObject()) {
        for (const Json::Value& element : value) {
            WalkTexts(element, take);
        }
    } else if (!value.isNull()) {
        take(value.asString());
    }
}

std::string GramText(const Json::Value& value) {
    std::string folded;
    WalkTexts(value, [&](const std::string& text) {
        folded += folded.empty() ? "" : "\n";
        folded += Fold(text);
    });
    return folded;
}

void DocumentEditor::AddId(const std::string& id) {
    WalkIdTerms(id, [&](const std::string& term) { document_.add_boolean_term(term); });
    document_.add_value(kIdSlot, id);
}

void DocumentEditor::ReplaceId(const std::string& old_id, const std::string& new_id) {
    WalkIdTerms(old_id, [&](const std::string& term) { document_.remove_term(term); });
    AddId(new_id);
}

void DocumentEditor::AddField(const std::string& name, const Json::Value& value) {
    if (value.isNull()) {
        return;
    }
    const FieldSettings& settings = mapping_.Of(name);
    const unsigned int number = fields_.FindOrAdd(name);
    if (settings.IsNumeric()) {
        AddNumber(name, settings, number, value);
        return;
    }
    const std::string prefix = FieldPrefix(number);
    if (settings.ngram) {
        const std::string folded = GramText(value);
        if (folded.size() > kMaxGramText) {
            throw quivra::Error(kBadDocument, "Too long for n-grams: " + name);
        }
        document_.add_value(FieldSlot(number), folded);
        AddGrams(prefix, folded);
    }
    unsigned int position = 0;
    WalkTexts(value, [&](const std::string& text) {
        if (!settings.ngram) {
            AddText(settings, prefix, text, position);
        } else if (settings.in_all) {
            CountAll(text, 1);
        }
        position += static_cast<unsigned int>(text.size()) + kPositionGap;
    });
}

void DocumentEditor::AddNumber(const std::string& name, const FieldSettings& settings,
                               unsigned int number, const Json::Value& value) {
    const std::optional<std::string> encoded = EncodeNumber(settings.type, value);
    if (!encoded) {
        throw quivra::Error(kBadDocument, "The value does not fit the field's type: " + name);
    }
    document_.add_value(FieldSlot(number), *encoded);
}

void DocumentEditor::AddText(const FieldSettings& settings, const std::string& prefix,
                             const std::string& text, unsigned int first_position) {
    const bool same_tokens = settings.analyzer == Analyzer::kStandard;
    const std::string folded = settings.fold && !same_tokens ? Fold(text) : std::string();
    std::string term;
    Analyze(settings.analyzer, Purpose::kIndex, folded.empty() ? text : folded,
            [&](const Token& token) {
                term.assign(prefix).append(token.text);
                if (term.size() > kMaxTermSize / 2) {
                    term = FitTerm(std::move(term));
                }
                if (settings.HasPositions()) {
                    document_.add_posting(term, first_position + token.position);
                } else {
                    document_.add_term(term);
                }
                if (same_tokens && settings.in_all) {
                    ++all_changes_[std::string(token.text)];
                }
                return true;
            });
    if (!same_tokens && settings.in_all) {
        CountAll(text, 1);
    }
}

/// One term for each two neighbours. A word's last character has a term of its own, so that every
/// character begins one.
void DocumentEditor::AddGrams(const std::string& prefix, const std::string& folded) {
    Analyze(Analyzer::kWhiteSpace, Purpose::kIndex, folded, [&](const Token& word) {
        for (std::size_t pos = 0; pos < word.text.size();) {
            const std::size_t next = pos + CharacterSize(word.text, pos);
            const std::size_t end =
                next < word.text.size() ? next + CharacterSize(word.text, next) : next;
            document_.add_boolean_term(prefix + std::string(word.text.substr(pos, end - pos)));
            pos = next;
        }
        return true;
    });
}

void DocumentEditor::CountAll(const std::string& text, int step) {
    Analyze(Analyzer::kStandard, Purpose::kIndex, text, [&](const Token& token) {
        all_changes_[std::string(token.text)] += step;
        return true;
    });
}

void DocumentEditor::RemoveField(const std::string& name, const Json::Value& old_value) {
    const FieldSettings& settings = mapping_.Of(name);
    const unsigned int number = fields_.FindOrAdd(name);
    document_.add_value(FieldSlot(number), std::string());  // an empty value is none
    if (settings.IsNumeric()) {
        return;
    }
    const std::string prefix = FieldPrefix(number);
    std::vector<std::string> terms;
    Xapian::TermIterator term = document_.termlist_begin();
    for (term.skip_to(prefix); term != document_.termlist_end(); ++term) {
        const std::string text = *term;
        if (text.compare(0, prefix.size(), prefix) != 0) {
            break;
        }
        terms.push_back(text);
    }
    for (const std::string& text : terms) {
        document_.remove_term(text);
    }
    if (settings.in_all) {
        WalkTexts(old_value, [&](const std::string& text) { CountAll(text, -1); });
    }
}

void DocumentEditor::Finish() {
    std::map<std::string, int> fewer;
    for (const auto& [token, change] : all_changes_) {
        if (change > 0) {
            document_.add_term(AllTerm(token), static_cast<unsigned int>(change));
        } else if (change < 0) {
            fewer[AllTerm(token)] = -change;
        }
    }
    all_changes_.clear();
    // A document cannot lower a term's count: the term is set anew where any of it stays.
    std::map<std::string, unsigned int> remaining;
    Xapian::TermIterator held = document_.termlist_begin();
    for (const auto& [term, count] : fewer) {
        held.skip_to(term);
        if (held != document_.termlist_end() && *held == term) {
            const unsigned int wdf = held.get_wdf();
            const auto taken = static_cast<unsigned int>(count);
            remaining[term] = wdf > taken ? wdf - taken : 0;
        }
    }
    for (const auto& [term, count] : remaining) {
        document_.remove_term(term);
        if (count > 0) {
            document_.add_term(term, count);
        }
    }
}

}  // namespace elasticd
