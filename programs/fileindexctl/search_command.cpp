#include <array>
#include <memory>
#include <ostream>
#include <vector>

#include "common/json.h"
#include "common/util.h"
#include "fileindex/elastic/protocol.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/search.h"
#include "programs/fileindexctl/search_query.h"
#include "programs/fileindexctl/shares.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

namespace field = fileindex::elastic::field;

constexpr unsigned int kDefaultLimit = 20;
/// Marks around the words found. File contents hardly ever hold these characters, and where they
/// do, a wrong word is bold.
constexpr char kMarkBegin = '\x02';
constexpr char kMarkEnd = '\x03';
/// Where a line worth showing may come from, the best first.
constexpr std::array kHighlightFields = {field::kTextContent, field::kTitle,    field::kDescription,
                                         field::kComment,     field::kKeywords, field::kAuthors};

struct Options {
    std::string share;
    std::string sort;
    Page page{.offset = 0, .limit = kDefaultLimit};
    bool limit_given = false;
    bool paths = false;
    bool null = false;
};

SortOrder ParseSort(const std::string& sort) {
    if (sort.empty() || sort == "relevance") {
        return {};
    }
    const bool descending = sort[0] == '-';
    const std::string name = sort.substr(descending ? 1 : 0);
    Field field;
    if (!FindField(field, name)) {
        throw WrongCall("there is no field '" + name +
                        "' to sort by; see 'fileindexctl search --help'");
    }
    // The name's own field is made for finding parts; sorting goes by the whole name.
    return {name == "name" ? field::kFSName : field.name, descending};
}

/// People see paths and one line, so the daemon need not send more; programs get all fields.
Json::Value MakeRequest(const Json::Value& qsl, const Options& options, const SortOrder& order,
                        bool json) {
    Json::Value request(Json::objectValue);
    request["qsl"] = qsl;
    if (!order.field.empty()) {
        Json::Value& sort = request["sort"].append(Json::Value(Json::objectValue));
        sort["field"] = order.field;
        sort["order"] = order.descending ? "desc" : "asc";
    }
    if (!json) {
        request["fields"].append(field::kPath);
        if (!order.field.empty() && order.field != field::kPath) {
            request["fields"].append(order.field);
        }
    }
    if (!options.paths) {
        Json::Value& highlight = request["highlight"];
        for (const char* field : kHighlightFields) {
            highlight["fields"].append(field);
        }
        highlight["pre"] = json ? "<b>" : std::string(1, kMarkBegin);
        highlight["post"] = json ? "</b>" : std::string(1, kMarkEnd);
        highlight["length"] = 160;
    }
    return request;
}

/// The line as it is shown: on one line, safe for a terminal and there with the words in bold.
std::string ShownHighlight(const std::string& text, const Session& session) {
    std::string line;
    std::string part;
    const auto flush = [&](const char* style) {
        line += Shown(part);
        part.clear();
        line += session.out_is_terminal ? style : "";
    };
    for (const char c : text.substr(0, text.find_last_not_of(" \t\r\n") + 1)) {
        if (c == kMarkBegin) {
            flush("\x1b[1m");
        } else if (c == kMarkEnd) {
            flush("\x1b[0m");
        } else {
            part += c == '\n' || c == '\r' || c == '\t' ? ' ' : c;
        }
    }
    flush("\x1b[0m");
    return line;
}

void PrintHit(const Json::Value& hit, const Options& options, Session& session) {
    const std::string path = hit[field::kPath].asString();
    if (options.paths) {
        session.out << (options.null ? path : Shown(path)) << (options.null ? '\0' : '\n');
        return;
    }
    session.out << Shown(path) << "\n";
    for (const char* field : kHighlightFields) {
        const Json::Value& text = hit["highlight"][field];
        if (text.isString() && !text.asString().empty()) {
            session.out << "    " << ShownHighlight(text.asString(), session) << "\n";
            return;
        }
    }
}

void PrintJson(const SearchResults& results, const Options& options, Session& session) {
    Json::Value document(Json::objectValue);
    Json::Value& hits = document["hits"] = Json::Value(Json::arrayValue);
    for (const Json::Value& hit : results.hits) {
        hits.append(hit);
    }
    document["total"] = results.total;
    document["offset"] = options.page.offset;
    session.out << toString(document) << "\n";
}

/// To the error stream: what a script reads from the output is hits alone.
void TellAbout(const SearchResults& results, const Options& options, Session& session) {
    for (const std::string& failure : results.failures) {
        session.err << "fileindexctl: " << Shown(failure) << "\n";
    }
    if (results.total == 0) {
        session.err << "Nothing found.\n";
    } else if (results.hits.empty()) {
        session.err << "Nothing from offset " << options.page.offset << " on: " << results.total
                    << " in all.\n";
    } else if (options.page.offset + results.hits.size() < results.total) {
        session.err << results.hits.size() << " of " << results.total << ", --limit for more\n";
    }
}

int SearchCommand(Options options, const std::vector<std::string>& words, Session& session) {
    if (options.null) {
        options.paths = true;
    }
    if (options.page.limit == 0 || (options.paths && !options.limit_given)) {
        options.page.limit = Page::kNoLimit;
    }
    const SortOrder order = ParseSort(options.sort);
    const Json::Value request = MakeRequest(MakeQuery(words), options, order, session.json);
    session.doing = "find the shares to search";
    const std::vector<std::string> shares =
        options.share.empty() ? SearchableShares() : std::vector<std::string>{options.share};
    if (shares.empty()) {
        throw Failure(
            "nothing is indexed yet; choose a folder with 'fileindexctl folder add PATH'");
    }
    const SearchResults results = SearchShares(shares, request, options.page, order, session);
    if (session.json) {
        PrintJson(results, options, session);
    } else {
        for (const Json::Value& hit : results.hits) {
            PrintHit(hit, options, session);
        }
    }
    session.out.flush();  // on a terminal, notes come behind the hits
    TellAbout(results, options, session);
    return results.hits.empty() ? kFailure : kSuccess;
}

}  // namespace

// The parser would read "-draft" as a row of short options and split "[2024]" at its commas.
std::vector<std::string> TakeSearchWords(CommandLine& line,
                                         const std::vector<std::string>& arguments) {
    if (arguments.empty() || arguments[0] != "search") {
        return arguments;
    }
    const CLI::App& command = *line.Root().get_subcommand("search");
    std::vector<std::string> rest = {"search"};
    bool only_words = false;
    for (std::size_t i = 1; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (only_words || (!StringStartWith(argument, "--") && argument != "-h")) {
            line.words.push_back(argument);
        } else if (argument == "--") {
            only_words = true;
        } else {
            rest.push_back(argument);
            const CLI::Option* option = command.get_option_no_throw(argument);
            if (option != nullptr && option->get_items_expected_min() > 0 &&
                i + 1 < arguments.size()) {
                rest.push_back(arguments[++i]);
            }
        }
    }
    return rest;
}

void AddSearchCommand(CommandLine& line) {
    CLI::App& command = line.AddCommand(
        line.Root(), "search", "Find files by name, content and metadata: every word has to match",
        "  fileindexctl search sunset beach\n"
        "  fileindexctl search 'annual report' -draft ext:pdf 'modified:>2024-01-01'\n"
        "  fileindexctl search name:invoice 'size:1M..20M' --sort -size --limit 50\n"
        "  fileindexctl search 'author:\"Ada Lovelace\"' --share books --json\n"
        "  fileindexctl search --null ext:iso | xargs -0 du -ch\n\n"
        "Words:\n"
        "  word        in the content, the metadata or a part of the name\n"
        "  -word       not there\n"
        "  \"- a:b\"     in quotes: taken as it stands (quote it for the shell, too)\n"
        "  field:value in this field; numbers and dates: > >= < <= or LOW..HIGH\n\n"
        "Fields:\n" +
            FieldHelp());
    auto options = std::make_shared<Options>();
    auto words = std::make_shared<std::vector<std::string>>();
    command.add_option("QUERY", *words, "The words to find");
    command.add_option("--share", options->share, "Search this share only");
    CLI::Option* limit =
        command.add_option("--limit", options->page.limit,
                           "The largest number of hits (20; with --paths all); 0 stands for all");
    command.add_option("--offset", options->page.offset, "Leave out that many hits at the front");
    CLI::Option* sort = command.add_option("--sort", options->sort,
                                           "Sort by a field, with - in front from the largest on; "
                                           "else the most relevant come first");
    line.SetValues(*sort, ShortFieldNames(), false);
    command.add_flag("--paths", options->paths, "Print nothing but all paths, one a line");
    command.add_flag("--null", options->null,
                     "Like --paths, each path ended by a NUL byte: safe for every name");
    line.OnCommand(command, [options, limit, &line](Session& session) {
        options->limit_given = limit->count() > 0;
        return SearchCommand(*options, line.words, session);
    });
}

}  // namespace quivra::ctl
