#include "programs/kestoelasticd/search.h"

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "programs/kestoelasticd/analyzer.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/document_editor.h"
#include "programs/kestoelasticd/highlight.h"
#include "programs/kestoelasticd/index_writer.h"
#include "programs/kestoelasticd/query.h"
#include "programs/kestoelasticd/record.h"

namespace elasticd {
namespace {

constexpr std::size_t kMaxData = (std::size_t{1} << 30) - (1 << 20);
constexpr std::size_t kMaxSortKeys = 8;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadQuery, "Bad query: " + what);
}

/// One key of the order: a value, or a stored field, which costs a look at every match.
struct SortField {
    std::optional<unsigned int> slot;
    std::optional<unsigned int> stored;
    bool descending = false;
};

/// Orders by several keys. Documents without a value come last, whatever the direction.
class SortKeys : public Xapian::KeyMaker {
  public:
    explicit SortKeys(std::vector<SortField> fields) : fields_(std::move(fields)) {}

    std::string operator()(const Xapian::Document& document) const override {
        std::string key;
        for (const SortField& field : fields_) {
            const std::string value = field.slot     ? document.get_value(*field.slot)
                                      : field.stored ? StoredText(document, *field.stored)
                                                     : std::string();
            key += value.empty() ? '\1' : '\0';
            AppendOrdered(key, value, field.descending);
        }
        return key;
    }

  private:
    static std::string StoredText(const Xapian::Document& document, unsigned int wanted) {
        std::string text;
        WalkRecord(document.get_data(), [&](unsigned int number, std::string_view json) {
            Json::Value value;
            if (number == wanted && quivra::fromString(value, std::string(json))) {
                text = GramText(value);
            }
        });
        return text;
    }

    /// Ends each value with a mark below everything that may follow within one.
    static void AppendOrdered(std::string& key, const std::string& value, bool descending) {
        const char flip = descending ? '\xff' : '\0';
        for (const char c : value) {
            key += static_cast<char>(c ^ flip);
            if (c == '\0') {
                key += static_cast<char>('\xff' ^ flip);
            }
        }
        key += flip;
        key += flip;
    }

    const std::vector<SortField> fields_;
};

class Searcher {
  public:
    Searcher(const Json::Value& query, const Mapping& mapping, const FieldTable& fields,
             const Xapian::Database& database)
        : mapping_(mapping), fields_(fields), database_(database) {
        if (!query.isObject()) {
            Refuse("no object");
        }
        parsed_ = ParseQuery(query["qsl"], mapping, fields);
        offset_ = ReadCount(query, "offset", 0);
        limit_ = ReadCount(query, "limit", database.get_doccount());
        ReadSort(query["sort"]);
        ReadFields(query["fields"]);
        ReadHighlight(query["highlight"]);
    }

    SearchResult Run() {
        Xapian::Enquire enquire(database_);
        enquire.set_query(parsed_.query);
        std::unique_ptr<SortKeys> keys;
        // The weights are not used for a sort, but a scheme that does without them (BoolWeight)
        // makes Xapian 1.4.22 take a long posting list for corrupt once a document was deleted.
        if (!sort_.empty()) {
            keys = std::make_unique<SortKeys>(sort_);
            enquire.set_sort_by_key(keys.get(), false);
        } else if (parsed_.has_words) {
            enquire.set_sort_by_relevance_then_value(kIdSlot, false);
        } else {
            enquire.set_sort_by_value(kIdSlot, false);
        }
        // Looking at every match is what makes the total exact.
        const Xapian::doccount all = database_.get_doccount();
        const Xapian::MSet hits = enquire.get_mset(offset_, limit_, std::max(all, 1U));
        SearchResult result;
        result.total = hits.get_matches_estimated();
        result.data += '[';
        for (Xapian::MSetIterator hit = hits.begin(); hit != hits.end(); ++hit) {
            AppendHit(result.data, hit.get_document());
            if (result.data.size() > kMaxData) {
                throw quivra::Error(kReplyTooLarge, "Too many hits for one reply; use \"limit\"");
            }
        }
        result.data += ']';
        return result;
    }

  private:
    static Xapian::doccount ReadCount(const Json::Value& query, const char* name,
                                      Xapian::doccount otherwise) {
        if (!query.isMember(name)) {
            return otherwise;
        }
        if (!query[name].isUInt64()) {
            Refuse(std::string("\"") + name + "\" must be a count");
        }
        return static_cast<Xapian::doccount>(
            std::min<Json::UInt64>(query[name].asUInt64(), 0x7fffffff));
    }

    static std::string ReadName(const Json::Value& value, const char* what) {
        if (!value.isString()) {
            Refuse(std::string(what) + " must be a text");
        }
        return value.asString();
    }

    static void CheckArray(const Json::Value& value, const char* what) {
        if (!value.isArray()) {
            Refuse(std::string(what) + " must be an array");
        }
    }

    void ReadSort(const Json::Value& sort) {
        if (sort.isNull()) {
            return;
        }
        CheckArray(sort, "\"sort\"");
        if (sort.size() > kMaxSortKeys) {
            Refuse("too many keys in \"sort\"");
        }
        for (const Json::Value& key : sort) {
            if (!key.isObject()) {
                Refuse("a key of \"sort\" must be an object");
            }
            const std::string order =
                key.isMember("order") ? ReadName(key["order"], "\"order\"") : "asc";
            if (order != "asc" && order != "desc") {
                Refuse("unknown order \"" + order + "\"");
            }
            sort_.push_back(MakeSortField(ReadName(key["field"], "\"field\""), order == "desc"));
        }
    }

    SortField MakeSortField(const std::string& name, bool descending) const {
        SortField field{std::nullopt, std::nullopt, descending};
        const FieldSettings& settings = mapping_.Of(name);
        if (name == kAllField || name == kTextField) {
            Refuse("no sorting by " + name);
        }
        if (name == mapping_.IdField()) {
            field.slot = kIdSlot;
        } else if (const std::optional<unsigned int> number = fields_.Find(name)) {
            if (settings.IsNumeric() || settings.ngram) {
                field.slot = FieldSlot(*number);
            } else {
                field.stored = *number;
            }
        }
        return field;
    }

    void ReadFields(const Json::Value& fields) {
        with_id_ = true;
        if (fields.isNull()) {
            return;
        }
        CheckArray(fields, "\"fields\"");
        wanted_.emplace();
        with_id_ = false;
        for (const Json::Value& field : fields) {
            const std::string name = ReadName(field, "a field");
            with_id_ |= name == mapping_.IdField();
            with_text_ |= name == kTextField && mapping_.Of(name).stored;
            if (const std::optional<unsigned int> number = fields_.Find(name)) {
                wanted_->insert(*number);
            }
        }
    }

    void ReadHighlight(const Json::Value& highlight) {
        if (highlight.isNull()) {
            return;
        }
        if (!highlight.isObject()) {
            Refuse("\"highlight\" must be an object");
        }
        if (highlight.isMember("pre")) {
            style_.pre = ReadName(highlight["pre"], "\"pre\"");
        }
        if (highlight.isMember("post")) {
            style_.post = ReadName(highlight["post"], "\"post\"");
        }
        style_.length = ReadCount(highlight, "length", static_cast<unsigned int>(style_.length));
        CheckArray(highlight["fields"], "\"fields\" of \"highlight\"");
        for (const Json::Value& field : highlight["fields"]) {
            const std::string name = ReadName(field, "a field");
            std::set<std::string> words = parsed_.words[kAllField];
            words.merge(parsed_.words[name]);
            if (!words.empty()) {
                highlighted_[name] = std::move(words);
            }
        }
    }

    void AppendHit(std::string& out, const Xapian::Document& document) const {
        out += out.size() > 1 ? ",{" : "{";
        const std::size_t start = out.size();
        const std::string id = document.get_value(kIdSlot);
        if (with_id_) {
            AppendName(out, start, mapping_.IdField());
            AppendJsonText(out, id);
        }
        std::map<std::string, std::string> marked;
        WalkRecord(document.get_data(), [&](unsigned int number, std::string_view json) {
            const std::string& name = fields_.NameOf(number);
            if (!mapping_.Of(name).stored) {
                return;
            }
            if (!wanted_ || wanted_->contains(number)) {
                AppendName(out, start, name);
                out += json;
            }
            Mark(marked, name, json);
        });
        const bool marks_text = highlighted_.contains(kTextField) && mapping_.Of(kTextField).stored;
        if (with_text_ || marks_text) {
            const std::string json =
                UnpackText(database_.get_metadata(TextKey(document.get_docid())));
            if (with_text_ && !json.empty()) {
                AppendName(out, start, kTextField);
                out += json;
            }
            Mark(marked, kTextField, json);
        }
        if (highlighted_.contains(mapping_.IdField())) {
            std::string json;
            AppendJsonText(json, id);
            Mark(marked, mapping_.IdField(), json);
        }
        AppendMarked(out, start, marked);
        out += '}';
    }

    static void AppendName(std::string& out, std::size_t start, const std::string& name) {
        if (out.size() > start) {
            out += ',';
        }
        AppendJsonText(out, name);
        out += ':';
    }

    void Mark(std::map<std::string, std::string>& marked, const std::string& name,
              std::string_view json) const {
        const auto words = highlighted_.find(name);
        Json::Value value;
        if (words == highlighted_.end() || !quivra::fromString(value, std::string(json))) {
            return;
        }
        WalkTexts(value, [&](const std::string& text) {
            if (!marked.contains(name)) {
                std::string excerpt = Highlight(mapping_.Of(name), text, words->second, style_);
                if (!excerpt.empty()) {
                    marked.emplace(name, std::move(excerpt));
                }
            }
        });
    }

    static void AppendMarked(std::string& out, std::size_t start,
                             const std::map<std::string, std::string>& marked) {
        if (marked.empty()) {
            return;
        }
        AppendName(out, start, "highlight");
        out += '{';
        const std::size_t first = out.size();
        for (const auto& [name, excerpt] : marked) {
            AppendName(out, first, name);
            AppendJsonText(out, excerpt);
        }
        out += '}';
    }

    const Mapping& mapping_;
    const FieldTable& fields_;
    const Xapian::Database& database_;
    ParsedQuery parsed_;
    Xapian::doccount offset_ = 0;
    Xapian::doccount limit_ = 0;
    std::vector<SortField> sort_;
    std::optional<std::set<unsigned int>> wanted_;  ///< none: all
    bool with_id_ = true;
    bool with_text_ = false;
    HighlightStyle style_;
    std::map<std::string, std::set<std::string>> highlighted_;  ///< field -> words
};

}  // namespace

SearchResult Search(const Json::Value& query, const Mapping& mapping, const FieldTable& fields,
                    const Xapian::Database& database) {
    return Searcher(query, mapping, fields, database).Run();
}

}  // namespace elasticd
