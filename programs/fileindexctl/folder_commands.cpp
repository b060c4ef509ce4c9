#include <array>
#include <exception>
#include <limits>
#include <memory>
#include <optional>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "common/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/output.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/shares.h"
#include "programs/fileindexctl/status.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"
#include "programs/fileindexctl/waiting.h"

namespace quivra::ctl {
namespace {

constexpr std::array kSwitches = {"document", "audio", "video", "photo"};
constexpr std::array kSortFields = {"name", "path", "document", "audio", "video", "photo"};

struct Options {
    std::string path;
    std::string name;
    std::array<std::optional<bool>, kSwitches.size()> switches;
};

struct ListOptions {
    unsigned int offset = 0;
    unsigned int limit = std::numeric_limits<unsigned int>::max();
    std::string sort = "name";
};

/// The library takes lists; one command line changes one folder.
Json::Value ListOf(const Json::Value& element) {
    Json::Value list(Json::arrayValue);
    list.append(element);
    return list;
}

/// Changes what the command line names and leaves the rest.
void Apply(Json::Value& folder, const Options& options) {
    for (std::size_t i = 0; i < kSwitches.size(); ++i) {
        if (options.switches[i]) {
            folder[kSwitches[i]] = *options.switches[i];
        }
    }
    if (!options.name.empty()) {
        folder["name"] = options.name;
    }
}

std::string Contents(const Json::Value& folder) {
    std::string contents;
    for (const char* name : kSwitches) {
        if (folder[name].asBool()) {
            contents += std::string(contents.empty() ? "" : ", ") + name;
        }
    }
    return contents.empty() ? "names only" : contents;
}

/// Tells the outcome: the folder itself for programs, a sentence for people.
int Report(Session& session, const Json::Value& folder, const std::string& sentence) {
    if (session.json) {
        session.out << toString(folder) << "\n";
    } else {
        session.out << sentence << Shown(folder["path"].asString()) << " (" << Contents(folder)
                    << ").\n";
    }
    return kSuccess;
}

/// A failure behind the save leaves a folder that nobody has been told of. Its content is queued
/// here and now; the rest is what `folder set` does again.
void SecureSavedFolder(const std::string& path, Session& session) {
    fileindex::FolderReindex(ListOf(path));
    session.doing = "finish adding " + path +
                    " (it is saved and queued; 'fileindexctl folder set " + path +
                    "' completes it)";
}

int Add(const Options& options, Session& session) {
    session.doing = "add " + options.path;
    const Place place = FindPlace(options.path);
    const std::string& path = place.share_path;
    session.doing = "add " + path;
    RequirePlaceOfIndex(place.share);
    Json::Value folder =
        fileindex::Folder(path, Basename(path), true, true, true, true, false).GetData();
    Apply(folder, options);
    // Afterwards the set alone does not tell a failure before the save from one behind it.
    const bool existed = fileindex::FolderMgr().HasFolder(path);
    try {
        const Silence silence;
        WaitFor(session, Needs::kBothDaemons,
                [list = ListOf(folder)] { fileindex::FolderAdd(list, false); });
    } catch (const std::exception&) {
        if (!existed && fileindex::FolderMgr().HasFolder(path)) {
            SecureSavedFolder(path, session);
        }
        throw;
    }
    return Report(session, folder, "Indexing ");
}

int Set(const Options& options, Session& session) {
    session.doing = "change " + options.path;
    const std::string path = FolderPath(options.path);
    session.doing = "change " + path;
    Json::Value folder;
    fileindex::FolderGet(folder, path);
    Apply(folder, options);
    const std::string share = fileindex::Folder(folder).GetShare();
    RequirePlaceOfIndex(share);
    {
        const Silence silence;
        WaitFor(session, Needs::kBothDaemons, [share, list = ListOf(folder)] {
            // There already, unless adding the folder was cut off; making it again changes nothing.
            fileindex::elastic::ShareIndexCreate(share);
            fileindex::FolderSet(list, false);
        });
    }
    return Report(session, folder, "Changed ");
}

int Get(const Options& options, Session& session) {
    session.doing = "read the settings of " + options.path;
    const std::string path = FolderPath(options.path);
    Json::Value folder;
    fileindex::FolderGet(folder, path);
    folder["additional"]["status"] = TakeStatus().OfFolder(path);
    if (session.json) {
        session.out << toString(folder) << "\n";
        return kSuccess;
    }
    PrintTable(session, {{"path:", folder["path"].asString()},
                         {"name:", folder["name"].asString()},
                         {"content:", Contents(folder)},
                         {"paused:", folder["paused"].asBool() ? "yes" : "no"},
                         {"status:", StatusText(folder["additional"]["status"])}});
    return kSuccess;
}

/// The table goes to the output and the notes beside it, so that the table can be processed.
void PrintList(const Json::Value& list, Session& session) {
    std::vector<std::vector<std::string>> rows = {{"PATH", "NAME", "CONTENT", "STATUS"}};
    for (const Json::Value& folder : list["folder"]) {
        rows.push_back({folder["path"].asString(), folder["name"].asString(), Contents(folder),
                        StatusText(folder["additional"]["status"])});
    }
    if (rows.size() > 1) {
        PrintTable(session, rows);
    }
    const Json::UInt total = list["total"].asUInt();
    if (total == 0) {
        session.err << "Nothing is indexed; choose a folder with 'fileindexctl folder add PATH'.\n";
    } else if (rows.size() - 1 < total) {
        session.err << rows.size() - 1 << " of " << total << ", --limit and --offset for more\n";
    }
}

int List(const ListOptions& options, Session& session) {
    session.doing = "list the folders";
    const bool descending = options.sort[0] == '-';
    Json::Value list;
    fileindex::FolderList(list, options.offset, options.limit,
                          options.sort.substr(descending ? 1 : 0), descending ? "desc" : "asc",
                          Json::Value(Json::arrayValue));
    // Once for all folders: each daemon is asked once, however many folders there are.
    const Status status = TakeStatus();
    for (Json::Value& folder : list["folder"]) {
        folder["additional"]["status"] = status.OfFolder(folder["path"].asString());
    }
    if (session.json) {
        session.out << toString(list) << "\n";
    } else {
        PrintList(list, session);
    }
    return kSuccess;
}

/// A failure behind the save: the folder is gone from the set, so it cannot be deleted again.
std::string DoingAfterDelete(const std::string& path) {
    std::string share;
    std::string root;
    fileindex::GetShareNameByPath(share, path);
    fileindex::GetFullPath(root, "/" + share);
    const std::string rest = fileindex::FolderMgr().IsShareIndexed(share)
                                 ? "the daemon learns of it at its next start"
                                 : "'fileindexctl share clear " + share + " " + root +
                                       "' removes what is left of its index";
    return "finish deleting " + path + " (it is chosen no longer; " + rest + ")";
}

int Delete(const Options& options, Session& session) {
    session.doing = "delete " + options.path;
    const std::string path = FolderPath(options.path);
    session.doing = "delete " + path;
    Json::Value folder;
    fileindex::FolderGet(folder, path);
    try {
        const Silence silence;
        WaitFor(session, Needs::kBothDaemons,
                [list = ListOf(path)] { fileindex::FolderDelete(list); });
    } catch (const std::exception&) {
        if (!fileindex::FolderMgr().HasFolder(path)) {
            session.doing = DoingAfterDelete(path);
        }
        throw;
    }
    return Report(session, folder, "No longer indexing ");
}

int Reindex(const Options& options, Session& session) {
    session.doing = "reindex " + options.path;
    const Place place = FindPlace(options.path);
    if (!fileindex::FolderMgr().IsShareIndexed(place.share)) {
        throw Failure("cannot reindex " + place.share_path + ": no folder of share " + place.share +
                      " is indexed; choose one with 'fileindexctl folder add'");
    }
    RequirePlaceOfIndex(place.share);
    fileindex::FolderReindex(ListOf(place.share_path));
    // The library logs what kept it from the queue and flags the share instead.
    if ((fileindex::StatusMgr().GetShareStatus(place.share) & fileindex::kShareNeedReindex) != 0) {
        throw Failure("cannot queue the reindex of " + place.share_path + ": the queue of share " +
                      place.share + " cannot be written; the system log tells why");
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["path"] = place.share_path;
        session.out << toString(result) << "\n";
    } else {
        session.out << "Queued the reindex of " << Shown(place.share_path) << ".\n";
    }
    return kSuccess;
}

std::string Capital(std::string text) {
    text[0] = static_cast<char>(text[0] - 'a' + 'A');
    return text;
}

using Command = int (*)(const Options&, Session&);

/// The commands on one folder differ in little but what they do with it.
std::shared_ptr<Options> AddFolderCommand(CommandLine& line, CLI::App& group,
                                          const std::string& name, const std::string& description,
                                          const std::string& examples, Command command,
                                          bool with_settings) {
    CLI::App& app = line.AddCommand(group, name, description, examples);
    auto options = std::make_shared<Options>();
    app.add_option("PATH", options->path, "Share path (/photo/2019), or full path, or from here")
        ->required();
    if (with_settings) {
        app.add_option("--name", options->name, "What the folder is called in lists");
        for (std::size_t i = 0; i < kSwitches.size(); ++i) {
            const std::string content = kSwitches[i];
            auto* flag = app.add_flag_function(
                "--" + content + ",!--no-" + content,
                [options, i](std::int64_t count) { options->switches[i] = count > 0; },
                Capital(content) + " files: with content and metadata, or by name only");
            flag->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
        }
    }
    line.OnCommand(app,
                   [options, command](Session& session) { return command(*options, session); });
    return options;
}

void AddListCommand(CommandLine& line, CLI::App& group) {
    CLI::App& app =
        line.AddCommand(group, "list", "List the indexed folders and their status",
                        "  fileindexctl folder list\n"
                        "  fileindexctl folder list --sort -name --limit 10 --offset 20\n"
                        "  fileindexctl folder list --json | jq '.folder[].path'");
    auto options = std::make_shared<ListOptions>();
    std::vector<std::string> fields;
    for (const char* field : kSortFields) {
        fields.emplace_back(field);
        fields.push_back(std::string("-") + field);
    }
    app.add_option("--offset", options->offset, "Leave out that many at the front");
    app.add_option("--limit", options->limit, "The largest number of folders")->default_str("all");
    CLI::Option* sort =
        app.add_option("--sort", options->sort,
                       "name, path, document, audio, video or photo; with - in front in reverse");
    line.SetValues(*sort, fields, true);
    line.OnCommand(app, [options](Session& session) { return List(*options, session); });
}

}  // namespace

void AddFolderCommands(CommandLine& line) {
    CLI::App& group = line.AddGroup(
        "folder", "Choose what is indexed",
        "  fileindexctl folder add /photo            everything in the share \"photo\"\n"
        "  fileindexctl folder add . --no-video      this directory, videos by name\n"
        "  fileindexctl folder list");
    AddFolderCommand(line, group, "add", "Index a folder and keep its index up to date",
                     "  fileindexctl folder add /photo\n"
                     "  fileindexctl folder add /volume1/music/live --name Concerts --no-document",
                     Add, true);
    AddFolderCommand(line, group, "set",
                     "Change what is indexed in a folder; what is not named stays",
                     "  fileindexctl folder set /photo --no-video --document\n"
                     "  fileindexctl folder set /photo --name 'All photos'",
                     Set, true);
    AddFolderCommand(line, group, "get", "Show one folder's settings and status",
                     "  fileindexctl folder get /photo", Get, false);
    AddListCommand(line, group);
    AddFolderCommand(line, group, "delete",
                     "Index a folder no longer; its files stay, its part of the index goes",
                     "  fileindexctl folder delete /photo", Delete, false);
    AddFolderCommand(line, group, "reindex",
                     "Compare a folder, or a part of it, with the disk again",
                     "  fileindexctl folder reindex /photo/2019", Reindex, false);
}

}  // namespace quivra::ctl
