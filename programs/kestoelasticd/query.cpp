#include "programs/kestoelasticd/query.h"

#include <utility>

#include "common/error.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/words.h"
#include "programs/kestoelasticd/json_values.h"

namespace elasticd {
namespace {

using engine::Bound;
using engine::FieldSettings;
using engine::FieldType;
using engine::kAllField;
using engine::Query;
using Form = Query::Form;

constexpr unsigned int kMaxNesting = 32;
constexpr unsigned int kMaxParts = 1024;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadQuery, "Bad query: " + what);
}

quivra::Error UnknownForm(const std::string& name) {
    return quivra::Error(kBadQuery, "Bad query: unknown form \"" + name + "\"");
}

std::string ReadText(const Json::Value& value, const std::string& what) {
    if (!value.isString()) {
        Refuse(what + " must be a text");
    }
    return value.asString();
}

class QueryParser {
  public:
    explicit QueryParser(const engine::Schema& schema) : schema_(schema) {}

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
            // What must not be there is neither ranked nor highlighted.
            const bool had_words = result_.has_words;
            const auto words = result_.words;
            Query query;
            query.form = Form::kNot;
            query.parts.push_back(ParseForm(value));
            result_.has_words = had_words;
            result_.words = words;
            return query;
        }
        if (name == "below") {
            return ParseBelow(value);
        }
        const Member field = OnlyMember(value, "\"" + name + "\"");
        Query query = name == "prefix"   ? ParseText(Form::kPrefix, field.name, field.value)
                      : name == "phrase" ? ParseText(Form::kPhrase, field.name, field.value)
                      : name == "match"  ? ParseMatch(field.name, field.value)
                      : name == "term"   ? ParseTerm(field.name, field.value)
                      : name == "range"  ? ParseRange(field.name, field.value)
                                         : throw UnknownForm(name);
        query.field = field.name;
        return query;
    }

    Query ParseList(const std::string& name, const Json::Value& forms) {
        if (!forms.isArray()) {
            Refuse("\"" + name + "\" must be an array");
        }
        Query query;
        query.form = name == "all" ? Form::kAll : Form::kAny;
        for (const Json::Value& form : forms) {
            query.parts.push_back(ParseForm(form));
        }
        return query;
    }

    static Query ParseBelow(const Json::Value& value) {
        Query query;
        query.form = Form::kBelow;
        if (value.isObject()) {
            query.text = ReadText(value["path"], "\"path\"");
            if (value.isMember("self") && !value["self"].isBool()) {
                Refuse("\"self\" must be a bool");
            }
            query.inclusive = value.isMember("self") && value["self"].asBool();
        } else {
            query.text = ReadText(value, "a directory");
        }
        return query;
    }

    /// "prefix" and "phrase".
    Query ParseText(Form form, const std::string& field, const Json::Value& value) {
        Query query;
        query.form = form;
        query.text = ReadText(value, form == Form::kPrefix ? "a prefix" : "a phrase");
        const FieldSettings& settings = schema_.Of(field);
        const bool is_id = field == schema_.IdField() || field == engine::kParentField;
        if (!is_id && field != kAllField &&
            (settings.IsNumeric() || (form == Form::kPrefix && settings.ngram))) {
            Refuse(std::string("no ") + (form == Form::kPrefix ? "prefix" : "phrase") +
                   " search in this field: " + field);
        }
        if (!is_id) {
            NoteWords(field, query.text, form == Form::kPrefix);
            result_.has_words |= form == Form::kPhrase;
        }
        return query;
    }

    Query ParseMatch(const std::string& field, const Json::Value& value) {
        Query query;
        query.form = Form::kMatch;
        if (value.isObject()) {
            query.text = ReadText(value["text"], "\"text\"");
            const std::string name =
                value.isMember("operator") ? ReadText(value["operator"], "\"operator\"") : "and";
            if (name != "and" && name != "or") {
                Refuse("unknown operator \"" + name + "\"");
            }
            query.any_word = name == "or";
        } else {
            query.text = ReadText(value, "a text to match");
        }
        if (schema_.Of(field).IsNumeric() && field != kAllField) {
            CheckNumber(field, query.text);
        }
        result_.has_words = true;
        NoteWords(field, query.text, false);
        return query;
    }

    /// Counts the words as parts and keeps them for highlights.
    void NoteWords(const std::string& field, const std::string& text, bool prefix) {
        AskedWords& asked = result_.words[field];
        std::string last;
        engine::CutWords(text, engine::Purpose::kQuery, [&](const engine::Word& word) {
            CountPart();
            const bool begins = word.kind == engine::Word::Kind::kLast;
            (begins ? asked.beginnings : asked.whole).emplace(word.text);
            last = word.text;
            return true;
        });
        if (prefix && !last.empty()) {
            asked.beginnings.insert(last);
        }
        // Of n-gram fields any part is found, signs and all.
        engine::SplitAtBlanks(text, [&](std::string_view stretch) {
            CountPart();
            result_.words[field].whole.insert(engine::Fold(stretch));
            return true;
        });
    }

    void CheckNumber(const std::string& field, const engine::Value& value) const {
        if (!engine::ToNumber(schema_.Of(field).type, value)) {
            Refuse("the value does not fit the field's type: " + field);
        }
    }

    Query ParseTerm(const std::string& field, const Json::Value& value) const {
        if (value.isArray() || value.isObject() || value.isNull()) {
            Refuse("the value of a term must be a text, a number or a bool");
        }
        Query query;
        query.form = Form::kTerm;
        query.value = ToValue(value);
        if (schema_.Of(field).IsNumeric() && field != kAllField) {
            CheckNumber(field, query.value);
        }
        return query;
    }

    Query ParseRange(const std::string& field, const Json::Value& bounds) const {
        const FieldSettings& settings = schema_.Of(field);
        if (!settings.IsNumeric() || field == kAllField) {
            Refuse("no range search in this field: " + field);
        }
        if (!bounds.isObject() || bounds.empty()) {
            Refuse("a range must be an object with bounds");
        }
        Query query;
        query.form = Form::kRange;
        for (auto it = bounds.begin(); it != bounds.end(); ++it) {
            AddBound(query, settings.type, it.name(), ToValue(*it));
        }
        return query;
    }

    static void AddBound(Query& query, FieldType type, const std::string& name,
                         const engine::Value& value) {
        const bool upper = name == "lt" || name == "lte";
        if (!upper && name != "gt" && name != "gte") {
            Refuse("unknown bound \"" + name + "\"");
        }
        const bool inclusive = name == "lte" || name == "gte";
        std::optional<engine::Value> number = engine::ToNumber(type, value);
        if (type == FieldType::kBool && (!number || !inclusive)) {
            Refuse("a bool's range takes \"gte\" or \"lte\" and a bool");
        }
        if (!number) {  // whole numbers can be compared with others
            number = engine::ToNumber(FieldType::kDouble, value);
        }
        if (!number) {
            Refuse("the bound of a range is not a number");
        }
        std::optional<Bound>& bound = upper ? query.upper : query.lower;
        if (bound) {
            Refuse("a range takes one lower and one upper bound");
        }
        bound = Bound{*number, inclusive};
    }

    const engine::Schema& schema_;
    ParsedQuery result_;
    unsigned int nesting_ = 0;
    unsigned int parts_ = 0;
};

}  // namespace

void AskedWords::Merge(const AskedWords& other) {
    whole.insert(other.whole.begin(), other.whole.end());
    beginnings.insert(other.beginnings.begin(), other.beginnings.end());
}

ParsedQuery ParseQuery(const Json::Value& qsl, const engine::Schema& schema) {
    return QueryParser(schema).Parse(qsl);
}

}  // namespace elasticd
