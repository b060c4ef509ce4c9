#include "tests/programs/kestoelasticd/model.h"

#include <algorithm>
#include <set>

#include "programs/kestoelasticd/engine/words.h"

namespace elasticd::engine {
namespace {

using Form = Query::Form;

std::vector<std::string> Stretches(std::string_view text) {
    std::vector<std::string> stretches;
    SplitAtBlanks(text, [&](std::string_view stretch) {
        stretches.emplace_back(stretch);
        return true;
    });
    return stretches;
}

/// What stands at each place of the text; parts of a word stand where it does.
std::vector<std::set<std::string>> Places(std::string_view text) {
    std::vector<std::set<std::string>> places;
    CutWords(text, Purpose::kIndex, [&](const Word& word) {
        if (word.kind != Word::Kind::kPart) {
            places.emplace_back();
        }
        places.back().emplace(word.text);
        return true;
    });
    return places;
}

std::string Folded(const Value& value) {
    std::string folded;
    ForEachText(value, [&](std::string_view text) { folded += Fold(text) + "\n"; });
    return folded;
}

double AsDouble(const Value& number) {
    const auto* whole = std::get_if<std::int64_t>(&number);
    return whole != nullptr ? static_cast<double>(*whole) : std::get<double>(number);
}

bool Within(const Value& number, const Query& query) {
    const double value = AsDouble(number);
    const auto fits = [&](const std::optional<Bound>& bound, int side) {
        const double difference = bound ? side * (value - AsDouble(bound->number)) : 1;
        return difference > 0 || (difference == 0 && bound->inclusive);
    };
    return fits(query.lower, 1) && fits(query.upper, -1);
}

bool IsBelow(const std::string& id, const std::string& directory) {
    return id.starts_with(directory + "/") && id != directory;
}

}  // namespace

void Model::Upsert(const Document& document) {
    Fields& fields = documents[document.id];
    fields.clear();
    for (const Field& field : document.fields) {
        fields[field.name] = field.value;
    }
}

bool Model::Set(const std::string& id, const std::string& new_id,
                const std::vector<Field>& changes) {
    if (!documents.contains(id)) {
        return false;
    }
    for (const Field& field : changes) {
        if (IsNone(field.value)) {
            documents[id].erase(field.name);
        } else {
            documents[id][field.name] = field.value;
        }
    }
    std::map<std::string, Fields> moved;
    const bool alone = IsBelow(new_id, id);
    for (auto at = documents.begin(); new_id != id && at != documents.end();) {
        if (at->first == id || (!alone && IsBelow(at->first, id))) {
            moved[new_id + at->first.substr(id.size())] = at->second;
            at = documents.erase(at);
        } else {
            ++at;
        }
    }
    for (const auto& [moved_id, fields] : moved) {
        documents[moved_id] = fields;
    }
    return true;
}

void Model::DeleteMatching(const Query& query) {
    for (const std::string& id : Find(query)) {
        documents.erase(id);
    }
}

std::vector<std::string> Model::Find(const Query& query) const {
    std::vector<std::string> found;
    for (const auto& [id, fields] : documents) {
        if (Matches(id, query)) {
            found.push_back(id);
        }
    }
    return found;
}

Value Model::ValueOf(const std::string& id, const std::string& field) const {
    const Fields& fields = documents.at(id);
    const auto found = fields.find(field);
    return found == fields.end() ? Value() : found->second;
}

bool Model::Matches(const std::string& id, const Query& query) const {
    const auto part_matches = [&](const Query& part) { return Matches(id, part); };
    switch (query.form) {
        case Form::kAll:
            return std::all_of(query.parts.begin(), query.parts.end(), part_matches);
        case Form::kAny:
            return std::any_of(query.parts.begin(), query.parts.end(), part_matches);
        case Form::kNot:
            return !Matches(id, query.parts[0]);
        case Form::kBelow: {
            // "/" stands for the root, although it is an id, too.
            const std::string directory = query.text == "/" ? "" : query.text;
            return IsBelow(id, directory) || (query.inclusive && id == directory);
        }
        case Form::kRange: {
            const Value value = ValueOf(id, query.field);
            return !IsNone(value) && Within(*ToNumber(schema_.Of(query.field).type, value), query);
        }
        case Form::kTerm: {
            const Value value = ValueOf(id, query.field);
            const FieldType type = schema_.Of(query.field).type;
            return !IsNone(value) && ToNumber(type, value) == ToNumber(type, query.value);
        }
        default:
            return MatchesText(id, query);
    }
}

bool Model::MatchesText(const std::string& id, const Query& query) const {
    if (query.field == kAllField) {
        return MatchesAllField(id, query);
    }
    if (query.field == schema_.IdField()) {
        return query.form == Form::kPrefix ? id.starts_with(query.text) : id == query.text;
    }
    const FieldSettings& settings = schema_.Of(query.field);
    const Value value = ValueOf(id, query.field);
    if (settings.IsKeyword()) {
        bool found = false;
        ForEachText(value, [&](std::string_view text) {
            found |=
                query.form == Form::kPrefix ? text.starts_with(query.text) : text == query.text;
        });
        return found;
    }
    if (query.form != Form::kMatch) {
        return HasPhrase(value, query.text, query.form == Form::kPrefix);
    }
    std::vector<bool> found;
    for (const std::string& stretch : Stretches(query.text)) {
        if (settings.ngram) {
            found.push_back(Folded(value).find(Fold(stretch)) != std::string::npos);
        } else if (!Places(stretch).empty()) {
            found.push_back(HasPhrase(value, stretch, false));
        }
    }
    const auto yes = std::count(found.begin(), found.end(), true);
    return yes > 0 && (query.any_word || yes == static_cast<std::ptrdiff_t>(found.size()));
}

bool Model::MatchesAllField(const std::string& id, const Query& query) const {
    if (query.form != Form::kMatch) {
        const Fields& fields = documents.at(id);
        return std::any_of(fields.begin(), fields.end(), [&](const auto& field) {
            const FieldSettings& settings = schema_.Of(field.first);
            return settings.in_all && !settings.IsNumeric() &&
                   !field.first.starts_with(kUnsearchedPrefix) &&
                   (settings.ngram
                        ? Folded(field.second).find(Fold(query.text)) != std::string::npos
                        : HasPhrase(field.second, query.text, query.form == Form::kPrefix));
        });
    }
    std::vector<bool> words;
    std::vector<bool> signs;
    for (const std::string& stretch : Stretches(query.text)) {
        (Places(stretch).empty() ? signs : words).push_back(StretchInAll(id, stretch));
    }
    const std::vector<bool>& found = words.empty() ? signs : words;
    const auto yes = std::count(found.begin(), found.end(), true);
    return yes > 0 && (query.any_word || yes == static_cast<std::ptrdiff_t>(found.size()));
}

bool Model::StretchInAll(const std::string& id, std::string_view stretch) const {
    const Fields& fields = documents.at(id);
    return std::any_of(fields.begin(), fields.end(), [&](const auto& field) {
        const FieldSettings& settings = schema_.Of(field.first);
        if (!settings.in_all || field.first.starts_with(kUnsearchedPrefix)) {
            return false;
        }
        if (settings.IsNumeric()) {
            const std::optional<Value> asked = ToNumber(settings.type, std::string(stretch));
            return settings.type != FieldType::kBool && asked &&
                   asked == ToNumber(settings.type, field.second);
        }
        return settings.ngram ? Folded(field.second).find(Fold(stretch)) != std::string::npos
                              : HasPhrase(field.second, stretch, false);
    });
}

/// As a query is cut: no parts of words; a lone character of CJK begins a pair.
bool Model::HasPhrase(const Value& value, std::string_view text, bool prefix) const {
    std::vector<std::string> asked;
    bool lone = false;
    CutWords(text, Purpose::kQuery, [&](const Word& word) {
        asked.emplace_back(word.text);
        lone = word.kind == Word::Kind::kLast;
        return true;
    });
    bool found = false;
    ForEachText(value, [&](std::string_view held) {
        const auto places = Places(held);
        for (std::size_t at = 0; !asked.empty() && at + asked.size() <= places.size(); ++at) {
            bool fits = true;
            for (std::size_t i = 0; i < asked.size(); ++i) {
                const bool open = (prefix || lone) && i + 1 == asked.size();
                fits &= std::any_of(places[at + i].begin(), places[at + i].end(),
                                    [&](const std::string& word) {
                                        return open ? word.starts_with(asked[i]) : word == asked[i];
                                    });
            }
            found |= fits;
        }
    });
    return found;
}

}  // namespace elasticd::engine
