#include "programs/kestoelasticd/query.h"

#include <cmath>
#include <limits>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/util.h"
#include "programs/kestoelasticd/analyzer.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/value_filter.h"

namespace elasticd {
namespace {

using Xapian::Query;

constexpr unsigned int kMaxNesting = 32;
constexpr unsigned int kMaxParts = 1024;
/// What a hit in a name weighs, against a few for a rare word in a text.
constexpr double kGramWeight = 8.0;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadQuery, "Bad query: " + what);
}

class QueryParser {
  public:
    QueryParser(const Mapping& mapping, const FieldTable& fields)
        : mapping_(mapping), fields_(fields) {}

    ParsedQuery Parse(const Json::Value& qsl) {
        result_.query = ParseForm(qsl);
        return std::move(result_);
    }

  private:
    struct Member {
        std::string name;
        const Json::Value& value;
    };

    static Member OnlyMember(const Json::Value& form, const std::string& what) {
        if (!form.isObject() || form.size() != 1) {
            Refuse(what + " must be an object with one member");
        }
        return {form.begin().name(), *form.begin()};
    }

    void CountPart() {
        if (++parts_ > kMaxParts) {
            Refuse("more than " + std::to_string(kMaxParts) + " parts");
        }
    }

    Query ParseForm(const Json::Value& form) {
        CountPart();
        if (nesting_ >= kMaxNesting) {
            Refuse("nested deeper than " + std::to_string(kMaxNesting));
        }
        const Member member = OnlyMember(form, "a form");
        ++nesting_;
        Query query = ParseMember(member.name, member.value);
        --nesting_;
        return query;
    }

    Query ParseMember(const std::string& name, const Json::Value& value) {
        if (name == "all" || name == "any") {
            return ParseList(name, value);
        }
        if (name == "not") {
            const bool had_words = result_.has_words;
            const auto words = result_.words;
            Query excluded = ParseForm(value);
            result_.has_words = had_words;
            result_.words = words;
            return Query(Query::OP_AND_NOT, Everything(), excluded);
        }
        if (name == "prefix" || name == "term" || name == "match" || name == "range") {
            const Member field = OnlyMember(value, "\"" + name + "\"");
            return name == "prefix"  ? ParsePrefix(field.name, field.value)
                   : name == "term"  ? ParseTerm(field.name, field.value)
                   : name == "match" ? ParseMatch(field.name, field.value)
                                     : ParseRange(field.name, field.value);
        }
        Refuse("unknown form \"" + name + "\"");
    }

    /// Everything at weight 0. (The empty term stands for all documents.)
    static Query Everything() { return Unweighted(Query(std::string())); }
    static Query Unweighted(const Query& query) {
        // Not OP_SCALE_WEIGHT by 0: Xapian 1.4.22 then reads the list of all documents in the place
        // of a term that all documents have, and takes it for corrupt once one was deleted.
        return Query(Query::OP_FILTER, Query(std::string()), query);
    }

    Query ParseList(const std::string& name, const Json::Value& forms) {
        if (!forms.isArray()) {
            Refuse("\"" + name + "\" must be an array");
        }
        std::vector<Query> parts;
        for (const Json::Value& form : forms) {
            parts.push_back(ParseForm(form));
        }
        if (name == "all") {
            return parts.empty() ? Everything() : Query(Query::OP_AND, parts.begin(), parts.end());
        }
        return Query(Query::OP_OR, parts.begin(), parts.end());
    }

    static std::string ReadText(const Json::Value& value, const std::string& what) {
        if (!value.isString()) {
            Refuse(what + " must be a text");
        }
        return value.asString();
    }

    Query ParsePrefix(const std::string& field, const Json::Value& value) {
        const std::string text = ReadText(value, "a prefix");
        if (field == mapping_.IdField()) {
            return Unweighted(IdPrefix(text));
        }
        const FieldSettings& settings = mapping_.Of(field);
        const std::optional<unsigned int> number = fields_.Find(field);
        if (settings.IsNumeric() || settings.ngram || field == kAllField) {
            Refuse("no prefix search in this field: " + field);
        }
        if (!number) {
            return Query();
        }
        const bool fold = settings.fold || settings.analyzer == Analyzer::kStandard;
        const std::string wanted = fold ? Fold(text) : text;
        if (wanted.size() > kKeptOfTerm - 3) {
            Refuse("a prefix longer than a term keeps of a text");
        }
        return Unweighted(Query(Query::OP_WILDCARD, FieldPrefix(*number) + wanted));
    }

    /// Ids below a folder share a term. A prefix that ends within a name is looked for in its
    /// folder.
    static Query IdPrefix(const std::string& text) {
        const std::size_t slash = text.rfind('/');
        const Query folder =
            slash == std::string::npos
                ? Query(std::string())
                : Unweighted(Query(FolderTerm(std::string_view(text).substr(0, slash))));
        if (text.empty() || slash == text.size() - 1) {
            return folder;
        }
        return Query(Query::OP_FILTER, folder, Filter(kIdSlot, 0.0, [text](const std::string& id) {
                         return quivra::StringStartWith(id, text);
                     }));
    }

    static Query Filter(unsigned int slot, double weight, ValueFilter::Test test) {
        return Query((new ValueFilter(slot, std::move(test), weight))->release());
    }

    Query ParseTerm(const std::string& field, const Json::Value& value) {
        if (value.isArray() || value.isObject() || value.isNull()) {
            Refuse("the value of a term must be a text, a number or a bool");
        }
        if (field == mapping_.IdField()) {
            return Unweighted(Query(IdTerm(value.asString())));
        }
        const FieldSettings& settings = mapping_.Of(field);
        const std::optional<unsigned int> number = fields_.Find(field);
        if (field != kAllField && settings.IsNumeric()) {
            const std::optional<std::string> encoded = EncodeNumber(settings.type, value);
            if (!encoded) {
                Refuse("the value does not fit the field's type: " + field);
            }
            return number ? Equals(*number, *encoded) : Query();
        }
        if (field == kAllField) {
            return Unweighted(Query(AllTerm(value.asString())));
        }
        if (!number) {
            return Query();
        }
        if (settings.ngram) {
            const std::string wanted = Fold(value.asString());
            return Unweighted(Filter(FieldSlot(*number), 0.0,
                                     [wanted](const std::string& text) { return text == wanted; }));
        }
        return Unweighted(Query(FitTerm(FieldPrefix(*number) + value.asString())));
    }

    static Query Equals(unsigned int number, const std::string& encoded) {
        return Query(Query::OP_VALUE_RANGE, FieldSlot(number), encoded, encoded);
    }

    Query ParseMatch(const std::string& field, const Json::Value& value) {
        std::string text;
        Query::op joiner = Query::OP_AND;
        if (value.isObject()) {
            text = ReadText(value["text"], "\"text\"");
            const std::string name =
                value.isMember("operator") ? ReadText(value["operator"], "\"operator\"") : "and";
            if (name != "and" && name != "or") {
                Refuse("unknown operator \"" + name + "\"");
            }
            joiner = name == "or" ? Query::OP_OR : Query::OP_AND;
        } else {
            text = ReadText(value, "a text to match");
        }
        result_.has_words = true;
        return field == kAllField ? MatchAll(joiner, text) : MatchField(field, joiner, text);
    }

    /// Words are split at blanks first, because a part of a file name is found with the signs in
    /// it. A lone sign ("rock & roll") asks for nothing where there are words beside it.
    Query MatchAll(Query::op joiner, const std::string& text) {
        std::vector<Query> words;
        std::vector<Query> signs;
        Analyze(Analyzer::kWhiteSpace, Purpose::kQuery, text, [&](const Token& token) {
            CountPart();
            const std::vector<Query> standard = StandardWords(kAllField, token.text, "A", false);
            std::vector<Query> ways = OtherWays(token.text);
            ways.emplace_back(Query::OP_AND, standard.begin(), standard.end());
            (standard.empty() ? signs : words).emplace_back(Query::OP_OR, ways.begin(), ways.end());
            return true;
        });
        const std::vector<Query>& parts = words.empty() ? signs : words;
        return Query(joiner, parts.begin(), parts.end());
    }

    /// How a word of a search in "_all" is found besides by the terms of "_all" itself: as a part
    /// of an n-gram field, or as a number.
    std::vector<Query> OtherWays(std::string_view word) {
        std::vector<Query> ways;
        for (const auto& [name, settings] : mapping_.Listed()) {
            const std::optional<unsigned int> number = fields_.Find(name);
            if (!settings.in_all || !number) {
                continue;
            }
            if (settings.ngram) {
                ways.push_back(Grams(name, *number, Fold(word)));
            } else if (settings.IsNumeric() && settings.type != FieldType::kBool) {
                if (const auto encoded = EncodeNumber(settings.type, std::string(word))) {
                    ways.push_back(Equals(*number, *encoded));
                }
            }
        }
        return ways;
    }

    /// A query for each standard word of the text. The pairs of a CJK run stand for the run: where
    /// places are known, they must follow each other.
    std::vector<Query> StandardWords(const std::string& field, std::string_view text,
                                     const std::string& prefix, bool has_positions) {
        std::vector<std::vector<Query>> runs;
        std::size_t run_end = 0;
        Analyze(Analyzer::kStandard, Purpose::kQuery, text, [&](const Token& token) {
            CountPart();
            result_.words[field].emplace(token.text);
            if (runs.empty() || token.begin >= run_end) {
                runs.emplace_back();
            }
            runs.back().emplace_back(FitTerm(prefix + std::string(token.text)));
            run_end = token.end;
            return true;
        });
        std::vector<Query> words;
        for (const std::vector<Query>& run : runs) {
            words.emplace_back(has_positions ? Query::OP_PHRASE : Query::OP_AND, run.begin(),
                               run.end());
        }
        return words;
    }

    Query MatchField(const std::string& field, Query::op joiner, const std::string& text) {
        const FieldSettings& settings = mapping_.Of(field);
        const std::optional<unsigned int> number = fields_.Find(field);
        if (settings.IsNumeric() || field == mapping_.IdField()) {
            return ParseTerm(field, text);
        }
        if (!number) {
            return Query();
        }
        const std::string prefix = FieldPrefix(*number);
        std::vector<Query> words;
        if (settings.analyzer == Analyzer::kStandard && !settings.ngram) {
            words = StandardWords(field, text, prefix, settings.HasPositions());
            return Query(joiner, words.begin(), words.end());
        }
        const std::string prepared = settings.fold || settings.ngram ? Fold(text) : text;
        const Analyzer splitter = settings.ngram ? Analyzer::kWhiteSpace : settings.analyzer;
        Analyze(splitter, Purpose::kQuery, prepared, [&](const Token& token) {
            CountPart();
            if (settings.ngram) {
                words.push_back(Grams(field, *number, std::string(token.text)));
            } else {
                result_.words[field].insert(Fold(token.text));
                words.emplace_back(FitTerm(prefix + std::string(token.text)));
            }
            return true;
        });
        return Query(joiner, words.begin(), words.end());
    }

    /// The documents whose text holds the folded word anywhere: those with all its pairs of
    /// characters, then looked at, because the pairs may stand elsewhere.
    Query Grams(const std::string& field, unsigned int number, const std::string& word) {
        const std::string prefix = FieldPrefix(number);
        result_.words[field].insert(word);
        std::vector<Query> parts;
        for (std::size_t pos = 0; pos < word.size();) {
            const std::size_t next = pos + CharacterSize(word, pos);
            if (next < word.size()) {
                CountPart();
                const std::size_t end = next + CharacterSize(word, next);
                parts.push_back(Unweighted(Query(prefix + word.substr(pos, end - pos))));
            }
            pos = next;
        }
        if (parts.empty()) {
            parts.push_back(Unweighted(Query(Query::OP_WILDCARD, prefix + word)));
        }
        parts.push_back(Filter(FieldSlot(number), kGramWeight, [word](const std::string& text) {
            return text.find(word) != std::string::npos;
        }));
        return Query(Query::OP_AND, parts.begin(), parts.end());
    }

    Query ParseRange(const std::string& field, const Json::Value& bounds) {
        const FieldSettings& settings = mapping_.Of(field);
        if (!settings.IsNumeric() || field == kAllField) {
            Refuse("no range search in this field: " + field);
        }
        if (!bounds.isObject() || bounds.empty()) {
            Refuse("a range must be an object with bounds");
        }
        const std::optional<unsigned int> number = fields_.Find(field);
        std::vector<Query> parts;
        for (auto it = bounds.begin(); it != bounds.end(); ++it) {
            parts.push_back(Bound(settings.type, number ? FieldSlot(*number) : 0, it.name(), *it));
        }
        return number ? Unweighted(Query(Query::OP_AND, parts.begin(), parts.end())) : Query();
    }

    static Query Bound(FieldType type, unsigned int slot, const std::string& name,
                       const Json::Value& value) {
        const bool upper = name == "lt" || name == "lte";
        if (!upper && name != "gt" && name != "gte") {
            Refuse("unknown bound \"" + name + "\"");
        }
        const bool exclusive = name == "lt" || name == "gt";
        const std::optional<std::string> encoded = EncodeBound(type, value, upper, exclusive);
        if (!encoded) {
            return Query();
        }
        // From the lowest value on: an open range would match documents without one.
        return upper ? Query(Query::OP_VALUE_RANGE, slot, std::string(1, '\0'), *encoded)
                     : Query(Query::OP_VALUE_GE, slot, *encoded);
    }

    /// The bound as an inclusive one; none where nothing can lie within it.
    static std::optional<std::string> EncodeBound(FieldType type, const Json::Value& value,
                                                  bool upper, bool exclusive) {
        const double infinity = std::numeric_limits<double>::infinity();
        if (type == FieldType::kDouble) {
            const std::optional<double> bound = ReadDouble(value);
            if (!bound) {
                Refuse("the bound of a range is no number");
            }
            return EncodeDouble(exclusive ? std::nextafter(*bound, upper ? -infinity : infinity)
                                          : *bound);
        }
        if (type == FieldType::kBool) {
            const std::optional<std::string> flag = EncodeNumber(type, value);
            if (!flag || exclusive) {
                Refuse("a bool's range takes \"gte\" or \"lte\" and a bool");
            }
            return flag;
        }
        return EncodeIntBound(value, upper, exclusive);
    }

    static std::optional<std::string> EncodeIntBound(const Json::Value& value, bool upper,
                                                     bool exclusive) {
        using Limits = std::numeric_limits<std::int64_t>;
        std::int64_t bound = 0;
        if (value.isInt64()) {
            bound = value.asInt64();
        } else if (value.isNumeric()) {
            const double number = value.asDouble();
            if (number >= 0x1p63 || number < -0x1p63) {
                const bool all = upper == (number > 0);
                return all ? std::optional(EncodeInt(upper ? Limits::max() : Limits::min()))
                           : std::nullopt;
            }
            bound = static_cast<std::int64_t>(upper ? std::floor(number) : std::ceil(number));
            exclusive = exclusive && static_cast<double>(bound) == number;
        } else {
            const std::optional<std::int64_t> number = ReadInt(value);
            if (!number || value.isBool()) {
                Refuse("the bound of a range is no number");
            }
            bound = *number;
        }
        if (exclusive) {
            if (bound == (upper ? Limits::min() : Limits::max())) {
                return std::nullopt;
            }
            bound += upper ? -1 : 1;
        }
        return EncodeInt(bound);
    }

    const Mapping& mapping_;
    const FieldTable& fields_;
    ParsedQuery result_;
    unsigned int nesting_ = 0;
    unsigned int parts_ = 0;
};

}  // namespace

ParsedQuery ParseQuery(const Json::Value& qsl, const Mapping& mapping, const FieldTable& fields) {
    return QueryParser(mapping, fields).Parse(qsl);
}

}  // namespace elasticd
