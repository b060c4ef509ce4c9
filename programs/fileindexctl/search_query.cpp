#include "programs/fileindexctl/search_query.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <optional>
#include <string_view>

#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"
#include "programs/fileindexctl/session.h"

namespace quivra::ctl {
namespace {

namespace field = fileindex::elastic::field;

struct ShortName {
    const char* name;
    const char* field;
    FieldKind kind;
    const char* meaning;
};

constexpr std::array kShortNames = {
    ShortName{"name", field::kSearchFileName, FieldKind::kText, "a part of the file name"},
    ShortName{"text", field::kTextContent, FieldKind::kText, "the content"},
    ShortName{"title", field::kTitle, FieldKind::kText, "the title"},
    ShortName{"author", field::kAuthors, FieldKind::kText, "the authors or artists"},
    ShortName{"album", "KESTOMDAlbum", FieldKind::kText, "the album"},
    ShortName{"genre", "KESTOMDMusicalGenre", FieldKind::kText, "the genre of music"},
    ShortName{"composer", "KESTOMDComposer", FieldKind::kText, "the composer"},
    ShortName{"comment", field::kComment, FieldKind::kText, "the comment"},
    ShortName{"keywords", field::kKeywords, FieldKind::kText, "the keywords"},
    ShortName{"camera", "KESTOMDAcquisitionModel", FieldKind::kText, "the model of the camera"},
    ShortName{"ext", field::kExtension, FieldKind::kExact, "the extension, without the dot"},
    ShortName{"dir", field::kParent, FieldKind::kExact, "the directory that holds the file"},
    ShortName{"path", field::kPath, FieldKind::kExact, "the full path"},
    ShortName{"size", field::kFSSize, FieldKind::kSize, "the size in bytes, or 10K, 10M, 10G"},
    ShortName{"year", "KESTOMDRecordingYear", FieldKind::kNumber, "the year of the recording"},
    ShortName{"seconds", "KESTOMDDurationSecond", FieldKind::kNumber, "the duration"},
    ShortName{"modified", field::kFSContentChangeDate, FieldKind::kDate, "as 2024-12-31"},
    ShortName{"created", field::kFSCreationDate, FieldKind::kDate, "as 2024-12-31"},
};

/// The kind of a field that has no short name, from the index's own mapping.
FieldKind MappedKind(const std::string& name) {
    const Json::Value mappings = fileindex::elastic::GetFileIndexMappings();
    const Json::Value& mapping = mappings["properties"][name];
    const std::string type = mapping["type"].asString();
    if (type == "int" || type == "double") {
        return FieldKind::kNumber;
    }
    return mapping["analyzer"] == "keyword" ? FieldKind::kExact : FieldKind::kText;
}

Json::Value Clause(const char* form, const std::string& field, const Json::Value& value) {
    Json::Value clause(Json::objectValue);
    clause[form][field] = value;
    return clause;
}

/// A number with an optional unit, the powers of 1024. Nothing for anything else.
std::optional<double> ParseSize(std::string_view text) {
    double factor = 1;
    const std::size_t unit = text.empty()
                                 ? std::string_view::npos
                                 : std::string_view("KMGT").find(static_cast<char>(
                                       std::toupper(static_cast<unsigned char>(text.back()))));
    if (unit != std::string_view::npos) {
        factor = std::pow(1024.0, static_cast<double>(unit + 1));
        text.remove_suffix(1);
    }
    double number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size() || !std::isfinite(number)) {
        return std::nullopt;
    }
    return number * factor;
}

/// The first second of a day in local time, or of the next day.
std::optional<double> ParseDate(const std::string& text, bool next_day) {
    std::tm date{};
    const char* end = strptime(text.c_str(), "%Y-%m-%d", &date);
    if (end == nullptr || *end != '\0') {
        return std::nullopt;
    }
    date.tm_mday += next_day ? 1 : 0;
    date.tm_isdst = -1;
    return static_cast<double>(std::mktime(&date));
}

/// A number as a query carries it: an integer where it is one.
Json::Value Number(double value) {
    if (value == std::floor(value) && std::abs(value) < 9.0e15) {
        return static_cast<Json::Int64>(value);
    }
    return value;
}

double ParseBound(const Field& field, const std::string& text, bool next_day) {
    std::optional<double> value;
    switch (field.kind) {
        case FieldKind::kDate:
            value = ParseDate(text, next_day);
            break;
        case FieldKind::kSize:
            value = ParseSize(text);
            break;
        default:
            value = text.find_first_of("KMGTkmgt") == std::string::npos ? ParseSize(text)
                                                                        : std::nullopt;
    }
    if (!value) {
        throw WrongCall("'" + text + "' is not a " +
                        (field.kind == FieldKind::kDate ? "date like 2024-12-31" : "number"));
    }
    return *value;
}

/// A date stands for its whole day: after it means from the next midnight on, up to it means
/// before the next midnight.
Json::Value RangeClause(const Field& field, const std::string& value) {
    const bool is_date = field.kind == FieldKind::kDate;
    Json::Value range(Json::objectValue);
    const auto at_least = [&](const std::string& text) {
        range["gte"] = Number(ParseBound(field, text, false));
    };
    const auto up_to = [&](const std::string& text) {
        range[is_date ? "lt" : "lte"] = Number(ParseBound(field, text, true));
    };
    const std::size_t dots = value.find("..");
    if (dots != std::string::npos) {
        at_least(value.substr(0, dots));
        up_to(value.substr(dots + 2));
    } else if (StringStartWith(value, ">=")) {
        at_least(value.substr(2));
    } else if (StringStartWith(value, "<=")) {
        up_to(value.substr(2));
    } else if (StringStartWith(value, ">")) {
        range[is_date ? "gte" : "gt"] = Number(ParseBound(field, value.substr(1), true));
    } else if (StringStartWith(value, "<")) {
        range["lt"] = Number(ParseBound(field, value.substr(1), false));
    } else {
        at_least(value);
        up_to(value);
    }
    return Clause("range", field.name, range);
}

/// A word matches as a whole anywhere, or as a part of the file name.
Json::Value AnywhereClause(const std::string& text) {
    Json::Value clause(Json::objectValue);
    clause["any"].append(Clause("match", "_all", text));
    clause["any"].append(Clause("match", field::kSearchFileName, text));
    return clause;
}

/// Exact fields hold one term each; extensions are kept in lower case.
Json::Value FieldClause(const Field& field, const std::string& value) {
    switch (field.kind) {
        case FieldKind::kText:
            return Clause("match", field.name, value);
        case FieldKind::kExact:
            return Clause(
                "term", field.name,
                field.name == field::kExtension ? GetFileExtension("." + value, true) : value);
        default:
            return RangeClause(field, value);
    }
}

struct Word {
    std::string text;
    std::size_t colon = std::string::npos;  ///< the first colon outside quotes
    bool negated = false;
};

/// Splits at blanks outside quotes; the quotes go. A quote without its partner ends with the text.
std::vector<Word> SplitWords(const std::string& argument) {
    std::vector<Word> words;
    Word word;
    bool quoted = false;
    bool begun = false;
    for (const char c : argument + " ") {
        if (c == '"') {
            quoted = !quoted;
            begun = true;
        } else if (!quoted && (c == ' ' || c == '\t' || c == '\n')) {
            if (!word.text.empty()) {
                words.push_back(word);
            }
            word = Word();
            begun = false;
        } else if (c == '-' && !begun) {
            word.negated = true;
            begun = true;
        } else {
            if (c == ':' && !quoted && word.colon == std::string::npos) {
                word.colon = word.text.size();
            }
            word.text += c;
            begun = true;
        }
    }
    if (quoted && !word.text.empty()) {
        word.text.pop_back();  // the blank that was added
        words.push_back(word);
    }
    return words;
}

/// A colon makes a field only where the field is known, so that "http://x" stays a word.
Json::Value WordClause(const Word& word) {
    Field field;
    Json::Value clause;
    if (word.colon != std::string::npos && word.colon + 1 < word.text.size() &&
        FindField(field, word.text.substr(0, word.colon))) {
        clause = FieldClause(field, word.text.substr(word.colon + 1));
    } else {
        clause = AnywhereClause(word.text);
    }
    if (!word.negated) {
        return clause;
    }
    Json::Value negation(Json::objectValue);
    negation["not"] = clause;
    return negation;
}

}  // namespace

Json::Value MakeQuery(const std::vector<std::string>& arguments) {
    Json::Value clauses(Json::arrayValue);
    for (const std::string& argument : arguments) {
        for (const Word& word : SplitWords(argument)) {
            clauses.append(WordClause(word));
        }
    }
    if (clauses.empty()) {
        throw WrongCall("there is no word to search for; see 'fileindexctl search --help'");
    }
    Json::Value query(Json::objectValue);
    query["all"] = clauses;
    return query;
}

bool FindField(Field& field, const std::string& name) {
    for (const ShortName& known : kShortNames) {
        if (name == known.name || name == known.field) {
            field = {known.field, known.kind};
            return true;
        }
    }
    if (!StringStartWith(name, "KESTO") && !StringStartWith(name, "_KESTO")) {
        return false;
    }
    field = {name, MappedKind(name)};
    return true;
}

std::vector<std::string> ShortFieldNames() {
    std::vector<std::string> names;
    for (const ShortName& known : kShortNames) {
        names.emplace_back(known.name);
    }
    return names;
}

std::string FieldHelp() {
    std::string help;
    for (const ShortName& known : kShortNames) {
        std::string line = std::string("  ") + known.name + ":";
        line.resize(std::max<std::size_t>(line.size(), 12), ' ');
        help += line + known.meaning + "\n";
    }
    return help;
}

}  // namespace quivra::ctl
