#include "programs/kestoelasticd/search.h"

#include <algorithm>
#include <map>

#include "common/error.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/json_values.h"

namespace elasticd {
namespace {

using engine::kTextField;

constexpr std::size_t kMaxData = (std::size_t{1} << 30) - (1 << 20);
constexpr std::size_t kMaxSortKeys = 8;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadQuery, "Bad query: " + what);
}

std::size_t ReadCount(const Json::Value& query, const char* name, std::size_t otherwise) {
    if (!query.isMember(name)) {
        return otherwise;
    }
    if (!query[name].isUInt64()) {
        Refuse(std::string("\"") + name + "\" must be a count");
    }
    return query[name].asUInt64();
}

std::string ReadName(const Json::Value& value, const char* what) {
    if (!value.isString()) {
        Refuse(std::string(what) + " must be a text");
    }
    return value.asString();
}

void CheckArray(const Json::Value& value, const char* what) {
    if (!value.isArray()) {
        Refuse(std::string(what) + " must be an array");
    }
}

/// Cursors are bytes; JSON holds texts.
std::string ToHex(std::string_view bytes) {
    constexpr char kDigits[] = "0123456789abcdef";
    std::string hex;
    for (const char c : bytes) {
        hex += kDigits[static_cast<unsigned char>(c) >> 4];
        hex += kDigits[static_cast<unsigned char>(c) & 0xf];
    }
    return hex;
}

std::string FromHex(const std::string& hex) {
    std::string bytes;
    const auto digit = [](char c) { return c <= '9' ? c - '0' : c - 'a' + 10; };
    if (hex.size() % 2 != 0 || hex.find_first_not_of("0123456789abcdef") != hex.npos) {
        Refuse("\"after\" must be what an earlier reply had as \"next\"");
    }
    for (std::size_t i = 0; i < hex.size(); i += 2) {
        bytes += static_cast<char>(digit(hex[i]) << 4 | digit(hex[i + 1]));
    }
    return bytes;
}

/// Makes the JSON text of hits.
class HitWriter {
  public:
    HitWriter(const Search& search, const engine::Schema& schema, std::string& out)
        : search_(search), schema_(schema), out_(out) {}

    void Append(const engine::Hit& hit) {
        out_ += out_.back() == '[' ? "{" : ",{";
        start_ = out_.size();
        marked_.clear();
        if (search_.with_id) {
            AppendName(schema_.IdField());
            AppendJsonText(out_, hit.id);
        }
        Mark(schema_.IdField(), hit.id);
        for (const engine::Field& field : hit.fields) {
            const bool wanted = field.name == kTextField
                                    ? search_.with_text
                                    : !search_.fields || search_.fields->contains(field.name);
            if (wanted) {
                AppendName(field.name);
                AppendValue(out_, field.value);
            }
            Mark(field.name, field.value);
        }
        AppendMarked();
        out_ += '}';
    }

  private:
    void AppendName(const std::string& name) {
        if (out_.size() > start_) {
            out_ += ',';
        }
        AppendJsonText(out_, name);
        out_ += ':';
    }

    void Mark(const std::string& name, const engine::Value& value) {
        const auto words = search_.highlighted.find(name);
        if (words == search_.highlighted.end()) {
            return;
        }
        engine::ForEachText(value, [&](std::string_view text) {
            if (!marked_.contains(name)) {
                std::string excerpt =
                    Highlight(schema_.Of(name), std::string(text), words->second, search_.style);
                if (!excerpt.empty()) {
                    marked_.emplace(name, std::move(excerpt));
                }
            }
        });
    }

    void AppendMarked() {
        if (marked_.empty()) {
            return;
        }
        AppendName("highlight");
        out_ += '{';
        start_ = out_.size();
        for (const auto& [name, excerpt] : marked_) {
            AppendName(name);
            AppendJsonText(out_, excerpt);
        }
        out_ += '}';
    }

    const Search& search_;
    const engine::Schema& schema_;
    std::string& out_;
    std::size_t start_ = 0;
    std::map<std::string, std::string> marked_;
};

}  // namespace

Search::Search(const Json::Value& query, const engine::Schema& schema) {
    if (!query.isObject()) {
        Refuse("not an object");
    }
    ParsedQuery parsed = ParseQuery(query["qsl"], schema);
    request.query = std::move(parsed.query);
    request.by_relevance = parsed.has_words;
    request.offset = ReadCount(query, "offset", 0);
    request.limit = ReadCount(query, "limit", SIZE_MAX);
    timeout =
        std::min(timeout, std::chrono::milliseconds(static_cast<std::int64_t>(
                              std::min<std::size_t>(ReadCount(query, "timeout", 5000), 5000))));
    if (query.isMember("after")) {
        request.after = FromHex(ReadName(query["after"], "\"after\""));
    }
    if (query.isMember("count") && !query["count"].isBool()) {
        Refuse("\"count\" must be a bool");
    }
    request.count = !query.isMember("count") || query["count"].asBool();
    ReadSort(query["sort"]);
    ReadFields(query["fields"], schema);
    ReadHighlight(query["highlight"], parsed, schema);
    request.with_text =
        with_text || (highlighted.contains(kTextField) && schema.Of(kTextField).stored);
    if (highlighted.empty()) {
        request.fields = fields;
    }
}

void Search::ReadSort(const Json::Value& sort) {
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
        request.sort.push_back({ReadName(key["field"], "\"field\""), order == "desc"});
    }
}

void Search::ReadFields(const Json::Value& names, const engine::Schema& schema) {
    if (names.isNull()) {
        return;
    }
    CheckArray(names, "\"fields\"");
    fields.emplace();
    with_id = false;
    for (const Json::Value& field : names) {
        const std::string name = ReadName(field, "a field");
        with_id |= name == schema.IdField();
        with_text |= name == kTextField && schema.Of(kTextField).stored;
        fields->insert(name);
    }
}

void Search::ReadHighlight(const Json::Value& highlight, ParsedQuery& parsed,
                           const engine::Schema& schema) {
    if (highlight.isNull()) {
        return;
    }
    if (!highlight.isObject()) {
        Refuse("\"highlight\" must be an object");
    }
    if (highlight.isMember("pre")) {
        style.pre = ReadName(highlight["pre"], "\"pre\"");
    }
    if (highlight.isMember("post")) {
        style.post = ReadName(highlight["post"], "\"post\"");
    }
    style.length = std::min<std::size_t>(ReadCount(highlight, "length", style.length), 1 << 20);
    CheckArray(highlight["fields"], "\"fields\" of \"highlight\"");
    for (const Json::Value& field : highlight["fields"]) {
        const std::string name = ReadName(field, "a field");
        AskedWords words = parsed.words[engine::kAllField];
        words.Merge(parsed.words[name]);
        if (!words.IsEmpty() && schema.Of(name).stored) {
            highlighted[name] = std::move(words);
        }
    }
}

SearchResult RunSearch(const Search& search, const engine::Schema& schema, engine::Index& index) {
    SearchResult result;
    result.reply = R"({"success":true,"data":[)";
    HitWriter writer(search, schema, result.reply);
    std::size_t hits = 0;
    std::string next;
    engine::SearchRequest request = search.request;
    request.deadline = engine::SearchRequest::Clock::now() + search.timeout;
    const engine::SearchResult found = index.Search(request, [&](engine::Hit&& hit) {
        writer.Append(hit);
        next = ++hits == request.limit ? std::move(hit.cursor) : std::string();
        if (result.reply.size() > kMaxData) {
            throw quivra::Error(kReplyTooLarge, "Too many hits for one reply; use \"limit\"");
        }
    });
    result.total = found.total;
    result.reply += ']';
    if (request.count) {
        result.reply += ",\"total\":" + std::to_string(result.total);
    }
    if (!next.empty()) {
        result.reply += ",\"next\":\"" + ToHex(next) + "\"";
    }
    result.reply += '}';
    return result;
}

}  // namespace elasticd
