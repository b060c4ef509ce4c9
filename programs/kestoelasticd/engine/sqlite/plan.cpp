#include "programs/kestoelasticd/engine/sqlite/plan.h"

#include <algorithm>
#include <utility>

#include "common/error.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/encoder.h"
#include "programs/kestoelasticd/engine/sqlite/tokens.h"
#include "programs/kestoelasticd/engine/words.h"

namespace elasticd::engine::sqlite {
namespace {

using Form = Query::Form;
using Kind = Plan::Kind;

/// The full-text table's parser has room for some 30 parentheses.
constexpr int kMaxDepth = 12;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadQuery, "Bad query: " + what);
}

Plan Simple(Kind kind) {
    Plan plan;
    plan.kind = kind;
    return plan;
}

Plan Words(std::string expression, int depth = 0) {
    Plan plan = Simple(expression.empty() ? Kind::kNothing : Kind::kWords);
    plan.expression = std::move(expression);
    plan.depth = depth;
    return plan;
}

Plan Join(Kind kind, std::vector<Plan> parts);

class Planner {
  public:
    Planner(const FieldTable& fields, Tree& tree)
        : fields_(fields), schema_(fields.GetSchema()), tree_(tree) {}

    Plan Make(const Query& query) {
        switch (query.form) {
            case Form::kAll:
            case Form::kAny: {
                std::vector<Plan> parts;
                for (const Query& part : query.parts) {
                    parts.push_back(Make(part));
                }
                return Join(query.form == Form::kAll ? Kind::kAll : Kind::kAny, std::move(parts));
            }
            case Form::kNot: {
                Plan plan = Simple(Kind::kNot);
                plan.parts.push_back(Make(query.parts.at(0)));
                return plan;
            }
            case Form::kBelow:
                return Below(query.text, query.inclusive);
            case Form::kTerm:
                return Term(query.field, query.value);
            case Form::kRange:
                return Range(query);
            case Form::kMatch:
            case Form::kPhrase:
            case Form::kPrefix:
                break;
        }
        return Text(query);
    }

  private:
    /// Forms that look for a text.
    Plan Text(const Query& query) {
        if (query.field == kAllField) {
            return TextInAll(query);
        }
        if (query.field == schema_.IdField()) {
            return query.form == Form::kPrefix ? IdPrefix(query.text, true) : Node(query.text);
        }
        if (query.field == kParentField) {
            return query.form == Form::kPrefix ? IdPrefix(query.text, false) : Children(query.text);
        }
        const FieldSettings& settings = schema_.Of(query.field);
        if (query.form == Form::kPrefix && (settings.IsNumeric() || settings.ngram)) {
            Refuse("no prefix search in this field: " + query.field);
        }
        if (settings.IsNumeric()) {
            return Term(query.field, query.text);
        }
        const std::optional<unsigned int> number = Searched(query.field);
        if (settings.IsKeyword()) {
            return KeywordText(query, settings, number);
        }
        if (!number) {
            return Simple(Kind::kNothing);
        }
        Plan plan = query.form == Form::kMatch
                        ? MatchField(*number, query)
                        : Words(InField(*number, query.text, query.form == Form::kPrefix));
        plan.weighted = query.form != Form::kPrefix;
        return plan;
    }

    std::optional<unsigned int> Searched(const std::string& field) const {
        const std::optional<unsigned int> number = fields_.Find(field);
        return number && fields_.Of(*number).searched ? number : std::nullopt;
    }

    static Plan KeywordText(const Query& query, const FieldSettings& settings,
                            std::optional<unsigned int> number) {
        const std::string wanted = settings.fold ? Fold(query.text) : query.text;
        if (query.form != Form::kPrefix) {
            return number ? Words(Quote({{KeywordToken(*number, wanted)}, false}))
                          : Simple(Kind::kNothing);
        }
        if (wanted.size() > kKeptOfKeyword) {
            Refuse("a prefix longer than " + std::to_string(kKeptOfKeyword) + " bytes");
        }
        return number ? Words(Quote({{KeywordPrefix(*number, wanted)}, true}))
                      : Simple(Kind::kNothing);
    }

    /// The words of the text side by side in the field, as an expression; empty where it has none.
    std::string InField(unsigned int number, std::string_view text, bool prefix) const {
        const FieldTable::Entry& field = fields_.Of(number);
        const unsigned int scope = field.IsScoped() ? number : kNoScope;
        Phrase phrase =
            field.settings->ngram ? GramPhrase(Fold(text), scope) : WordPhrase(text, scope);
        if (phrase.tokens.empty()) {
            return {};
        }
        phrase.prefix |= prefix;
        return "c" + std::to_string(field.column) + " : " + Quote(phrase);
    }

    Plan MatchField(unsigned int number, const Query& query) const {
        std::vector<Plan> words;
        SplitAtBlanks(query.text, [&](std::string_view stretch) {
            Plan word = Words(InField(number, stretch, false));
            if (word.kind == Kind::kWords) {  // a lone sign asks for nothing
                words.push_back(std::move(word));
            }
            return true;
        });
        return words.empty() ? Simple(Kind::kNothing)
                             : Join(query.any_word ? Kind::kAny : Kind::kAll, std::move(words));
    }

    /// Words are split at blanks first, because a part of a file name is found with the signs in
    /// it. A lone sign ("rock & roll") asks for nothing where there are words beside it.
    Plan TextInAll(const Query& query) const {
        if (query.form != Form::kMatch) {
            Phrase phrase = WordPhrase(query.text, kNoScope);
            phrase.prefix |= query.form == Form::kPrefix;
            std::vector<Plan> ways = GramWays(query.text);
            if (!phrase.tokens.empty()) {
                ways.push_back(Words(Quote(phrase)));
            }
            Plan plan = Join(Kind::kAny, std::move(ways));
            plan.weighted = query.form != Form::kPrefix;
            return plan;
        }
        std::vector<Plan> words;
        std::vector<Plan> signs;
        SplitAtBlanks(query.text, [&](std::string_view stretch) {
            std::vector<Plan> ways = GramWays(stretch);
            const Phrase phrase = WordPhrase(stretch, kNoScope);
            if (!phrase.tokens.empty()) {
                ways.push_back(Words(Quote(phrase)));
            }
            AddNumberWays(ways, stretch);
            (phrase.tokens.empty() ? signs : words).push_back(Join(Kind::kAny, std::move(ways)));
            return true;
        });
        std::vector<Plan>& parts = words.empty() ? signs : words;
        Plan plan = parts.empty()
                        ? Simple(Kind::kNothing)
                        : Join(query.any_word ? Kind::kAny : Kind::kAll, std::move(parts));
        plan.weighted = true;
        return plan;
    }

    /// How a text is found in "_all" as a part of an n-gram field.
    std::vector<Plan> GramWays(std::string_view text) const {
        std::vector<Plan> ways;
        for (const auto& [name, settings] : schema_.Listed()) {
            const std::optional<unsigned int> number = Searched(name);
            if (settings.ngram && settings.in_all && number) {
                Plan way = Words(InField(*number, text, false));
                if (way.kind == Kind::kWords) {
                    ways.push_back(std::move(way));
                }
            }
        }
        return ways;
    }

    static void AddNumberWays(std::vector<Plan>& ways, std::string_view text) {
        const Value value = std::string(text);
        if (const std::optional<Value> whole = ToNumber(FieldType::kInt, value)) {
            ways.push_back(Words(Quote({{NumberToken(*whole)}, false})));
        }
        if (const std::optional<Value> real = ToNumber(FieldType::kDouble, value)) {
            ways.push_back(Words(Quote({{NumberToken(*real)}, false})));
        }
    }

    Plan Term(const std::string& field, const Value& value) {
        const std::string text = FirstText(value);
        if (field == schema_.IdField()) {
            return Node(text);
        }
        if (field == kParentField) {
            return Children(text);
        }
        if (field == kAllField) {
            const Phrase phrase = WordPhrase(text, kNoScope);
            return phrase.tokens.empty() ? Simple(Kind::kNothing) : Words(Quote(phrase));
        }
        const FieldSettings& settings = schema_.Of(field);
        const std::optional<unsigned int> number = Searched(field);
        if (settings.IsNumeric()) {
            const std::optional<Value> typed = ToNumber(settings.type, value);
            if (!typed) {
                Refuse("the value does not fit the field's type: " + field);
            }
            return Typed(number, Bound{*typed, true}, Bound{*typed, true});
        }
        if (settings.ngram) {
            const Bound bound{Fold(text), true};
            return Typed(number, bound, bound);
        }
        if (settings.IsKeyword()) {
            Query query;
            query.text = text;
            return KeywordText(query, settings, number);
        }
        return number ? Words(InField(*number, text, false)) : Simple(Kind::kNothing);
    }

    static std::string FirstText(const Value& value) {
        std::string first;
        ForEachText(value, [&](std::string_view text) { first = text; });
        return first;
    }

    Plan Range(const Query& query) const {
        return Typed(Searched(query.field), query.lower, query.upper);
    }

    static Plan Typed(std::optional<unsigned int> number, std::optional<Bound> lower,
                      std::optional<Bound> upper) {
        if (!number) {
            return Simple(Kind::kNothing);
        }
        Plan plan = Simple(Kind::kTyped);
        plan.field = *number;
        plan.lower = std::move(lower);
        plan.upper = std::move(upper);
        return plan;
    }

    Plan Node(const std::string& id) {
        const std::optional<sqlite::Node> node = tree_.Find(id);
        if (!node || !node->has_document) {
            return Simple(Kind::kNothing);
        }
        Plan plan = Simple(Kind::kNode);
        plan.node = node->id;
        return plan;
    }

    Plan Children(const std::string& directory) {
        const std::optional<sqlite::Node> node = tree_.Find(directory == "/" ? "" : directory);
        Plan plan = Simple(node ? Kind::kChildren : Kind::kNothing);
        plan.node = node ? node->id : 0;
        return plan;
    }

    Plan Below(const std::string& directory, bool inclusive) {
        const std::optional<sqlite::Node> node = tree_.Find(directory == "/" ? "" : directory);
        Plan plan = Simple(node ? Kind::kBelow : Kind::kNothing);
        plan.node = node ? node->id : 0;
        plan.itself = inclusive;
        return plan;
    }

    /// Ids that begin so; or (not `itself`) ids in directories that do.
    Plan IdPrefix(const std::string& text, bool itself) {
        const std::size_t slash = text.rfind('/');
        std::int64_t parent = Tree::kRoot;
        if (slash != std::string::npos) {
            const std::optional<sqlite::Node> directory = tree_.Find(text.substr(0, slash));
            if (!directory) {
                return Simple(Kind::kNothing);
            }
            parent = directory->id;
        }
        Plan plan = Simple(Kind::kNames);
        plan.node = parent;
        plan.name = slash == std::string::npos ? text : text.substr(slash + 1);
        plan.itself = itself;
        return plan;
    }

    const FieldTable& fields_;
    const Schema& schema_;
    Tree& tree_;
};

/// Several expressions as one.
Plan JoinWords(std::vector<Plan> words, const char* joiner) {
    if (words.size() == 1) {
        return std::move(words.front());
    }
    Plan joined = Words({});
    joined.kind = Kind::kWords;
    joined.weighted = words.front().weighted;
    for (const Plan& part : words) {
        joined.expression += joined.expression.empty() ? "(" : joiner;
        joined.expression += part.expression + ")";
        joined.depth = std::max(joined.depth, part.depth + 1);
    }
    return joined;
}

/// Puts the parts of an "all" or "any" that the full-text table can answer into one, apart by
/// whether they weigh.
Plan Join(Kind kind, std::vector<Plan> parts) {
    const bool all = kind == Kind::kAll;
    Plan joined = Simple(kind);
    std::vector<Plan> words[2];
    for (Plan& part : parts) {
        if (part.kind == (all ? Kind::kNothing : Kind::kEverything)) {
            return part;
        }
        if (part.kind == Kind::kWords && part.depth < kMaxDepth) {
            words[part.weighted ? 1 : 0].push_back(std::move(part));
        } else if (part.kind != (all ? Kind::kEverything : Kind::kNothing)) {
            joined.parts.push_back(std::move(part));
        }
    }
    for (std::vector<Plan>& group : words) {
        if (!group.empty()) {
            joined.parts.insert(joined.parts.begin(),
                                JoinWords(std::move(group), all ? " AND (" : " OR ("));
        }
    }
    if (joined.parts.empty()) {
        return Simple(all ? Kind::kEverything : Kind::kNothing);
    }
    return joined.parts.size() == 1 ? std::move(joined.parts.front()) : joined;
}

void CollectWords(const Plan& plan, std::string& out) {
    if (plan.kind == Kind::kWords && plan.weighted) {
        out += out.empty() ? "(" : " OR (";
        out += plan.expression + ")";
    }
    if (plan.kind == Kind::kAll || plan.kind == Kind::kAny) {
        for (const Plan& part : plan.parts) {
            CollectWords(part, out);
        }
    }
}

}  // namespace

Plan MakePlan(const Query& query, const FieldTable& fields, Tree& tree) {
    return Planner(fields, tree).Make(query);
}

std::string WeightedWords(const Plan& plan) {
    std::string words;
    CollectWords(plan, words);
    return words;
}

}  // namespace elasticd::engine::sqlite
