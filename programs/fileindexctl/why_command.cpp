#include <sys/stat.h>

#include <array>
#include <ctime>
#include <memory>
#include <optional>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/path_rules.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/status.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"
#include "sdk/share.h"

namespace quivra::ctl {

namespace field = fileindex::elastic::field;

namespace {

/// A question that perhaps cannot be answered: then the reason why.
struct Answer {
    std::optional<bool> yes;
    std::string reason;

    bool Is(bool value) const { return yes.has_value() && *yes == value; }
    std::string Text() const { return !yes ? "cannot be told: " + reason : *yes ? "yes" : "no"; }
    Json::Value AsJson() const { return yes ? Json::Value(*yes) : Json::Value(); }
};

/// A daemon that is away, or a damaged queue, makes one reply unknown and leaves the others.
template <typename Question>
Answer Ask(Question question) {
    try {
        return {question(), ""};
    } catch (const Error& error) {
        return {std::nullopt, DescribeCause(error)};
    }
}

struct Report {
    Place place;
    std::vector<fileindex::PathFinding> findings;
    std::shared_ptr<fileindex::Folder> folder;  ///< null: none governs the path
    bool is_share_indexed = false;              ///< some folder lies in the share
    bool is_directory = false;
    bool needs_metadata = false;
    bool needs_reindex = false;
    bool paused = false;
    Answer pending;
    Answer in_index;
    Json::Value document;  ///< the fields of kFields that the index holds of it
    bool is_outdated = false;
    Status system;  ///< the daemons alone
    ShareLine share;
};

/// What tells how the document came to be; its text only to see whether there is one.
constexpr std::array kFields = {field::kPath, field::kTextContent, field::kContentError,
                                field::kContentRetry, field::kModifiedNs};

/// A reindex of an ancestor covers the path without naming it.
bool IsPending(const Place& place) {
    const fileindex::QueueMgr queue(sdk::SDKShare(place.share).GetQueuePath());
    return queue.IsFullPathProcessing(place.full_path) ||
           queue.IsFullPathHasReindex(place.full_path);
}

bool FindDocument(Json::Value& document, const Place& place) {
    Json::Value query(Json::objectValue);
    query["qsl"]["term"][field::kPath] = place.full_path;
    query["limit"] = 1;  // the path is the document's id
    for (const char* name : kFields) {
        query["fields"].append(name);
    }
    Json::Value reply;
    fileindex::elastic::IndexQuery(reply, place.share, query);
    if (!reply["data"].isArray() || reply["data"].empty() || !reply["data"][0].isObject()) {
        return false;
    }
    document = reply["data"][0];
    return true;
}

/// Whether the file has changed since it was read for the index. Where the document does not say
/// what was read, that is not known.
bool IsOutdated(const Json::Value& document, const Place& place) {
    struct stat status {};
    const Json::Value& read = document[field::kModifiedNs];
    if (!read.isInt64() || lstat(place.full_path.c_str(), &status) != 0) {
        return false;
    }
    // Nanoseconds: a file exchanged for another one of the same second counts as changed.
    return read.asInt64() != status.st_mtim.tv_sec * 1'000'000'000LL + status.st_mtim.tv_nsec;
}

bool IsDirectory(const Place& place) {
    struct stat status {};
    return lstat(place.full_path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool IsPausedNow() {
    const std::int64_t resume_time = fileindex::StatusMgr().GetPauseInfo();
    return resume_time == fileindex::kPausedWithoutEnd || std::time(nullptr) < resume_time;
}

void AskDaemons(Report& report) {
    report.system = TakeDaemons();
    report.share = TakeShareLine(
        report.place.share, report.folder == nullptr || report.folder->GetPaused(), report.system);
    if (!report.is_share_indexed) {
        // The indexer works by shares: a covering folder of an outer share does not count, and
        // there is no index that could be asked.
        report.in_index = {false, ""};
        return;
    }
    if (!report.system.search.IsUp()) {
        report.in_index = {std::nullopt, DescribeProblem(kSearchDaemon, report.system.search)};
        return;
    }
    report.in_index = Ask([&] { return FindDocument(report.document, report.place); });
    report.is_outdated = IsOutdated(report.document, report.place);
}

/// Every question is asked even when a rule has failed: the index may still hold what it should
/// not, and the queue tell why.
Report Examine(const Place& place) {
    Report report;
    report.place = place;
    report.findings = fileindex::ExaminePath(place.full_path);
    report.is_directory = IsDirectory(place);
    const fileindex::FolderMgr folders;
    report.folder = folders.GetMostSuitableCfg(place.full_path);
    report.is_share_indexed = folders.IsShareIndexed(place.share);
    report.needs_metadata = folders.IsFullPathNeedMeta(place.full_path);
    report.needs_reindex =
        (fileindex::StatusMgr().GetShareStatus(place.share) & fileindex::kShareNeedReindex) != 0;
    report.paused = IsPausedNow();
    report.pending = Ask([&] { return IsPending(place); });
    AskDaemons(report);
    return report;
}

std::string WithRemedy(const std::string& text, const std::string& remedy) {
    return text + (remedy.empty() ? "" : "; " + remedy) + ".";
}

/// The names by which `folder set` switches them.
std::string FileTypeName(const std::string& path) {
    constexpr std::array kNames = {"document", "audio", "video", "photo", "other"};
    return kNames.at(static_cast<std::size_t>(fileindex::GetFileTypeByFullPath(path)));
}

/// Empty when nothing stands against indexing.
std::string VerdictOfRules(const Report& report) {
    const fileindex::PathFinding& last = report.findings.back();
    if (!last.passed) {
        const std::string tail =
            report.in_index.Is(true) ? " (the index still holds it, until its next pass)" : "";
        return WithRemedy("It is not indexed: " + last.detail + tail, last.remedy);
    }
    if (report.folder == nullptr) {
        return "It is not indexed: no folder covers it; 'fileindexctl folder add' with it or a "
               "folder above it.";
    }
    if (!report.is_share_indexed) {
        return "It is not indexed: it lies in share " + report.place.share +
               ", which has no folder of its own; 'fileindexctl folder add " +
               report.place.share_path + "' indexes it.";
    }
    return std::string();
}

/// What keeps changes of the share from reaching its index. Empty when nothing does.
std::string VerdictOfShare(const Report& report) {
    const std::string& share = report.place.share;
    if (report.folder->GetPaused()) {
        return "Share " + share + " is paused; 'fileindexctl share resume " + share +
               "' goes on with it.";
    }
    if (!report.share.problems.empty()) {
        return "Share " + share +
               " is not indexed as it should be: " + report.share.problems.front() + ".";
    }
    if (!report.system.problems.empty()) {
        return report.system.problems.front();
    }
    if (report.needs_reindex) {
        return "Changes of share " + share + " were lost; 'fileindexctl folder reindex " +
               report.folder->GetPath() + "' finds them.";
    }
    return report.share.made_anew
               ? "The index of share " + share +
                     " was damaged or missing and is made anew; 'fileindexctl status' shows how "
                     "far it is."
               : std::string();
}

/// What still has to be done with the path itself. Empty when that is nothing.
std::string VerdictOfQueue(const Report& report) {
    if (!report.pending.yes) {
        return "The queue cannot be read (" + report.pending.reason + ").";
    }
    if (report.pending.Is(true)) {
        return report.paused ? "It waits in the queue, but all indexing is paused; 'fileindexctl "
                               "resume' ends that."
                             : "It waits in the queue; 'fileindexctl status' shows how far the "
                               "indexer is.";
    }
    if (!report.in_index.yes) {
        return "The index cannot be asked (" + report.in_index.reason + ").";
    }
    if (!*report.in_index.yes && report.share.waiting > 0) {
        return "It is not in the index yet: " + Number(report.share.waiting, "file", "files") +
               " of the share wait; 'fileindexctl status' shows how far the indexer is.";
    }
    if (!*report.in_index.yes || report.is_outdated) {
        return std::string(report.is_outdated ? "It has changed since it was indexed, unnoticed"
                                              : "It should be in the index and is not") +
               "; 'fileindexctl folder reindex " + report.place.share_path + "' repairs that.";
    }
    return std::string();
}

/// Why a document has no content although nothing went wrong.
std::string WithoutContent(const Report& report) {
    const std::string type = FileTypeName(report.place.full_path);
    if (report.is_directory) {
        return "It is indexed and found by its name, as directories are.";
    }
    if (type == "other") {
        return "It is indexed and found by its name: content of files of this kind is not read.";
    }
    return "It is indexed and found by its name: reading " + type + " files is switched off in " +
           report.folder->GetPath() + "; 'fileindexctl folder set " + report.folder->GetPath() +
           " --" + type + "' switches it on.";
}

/// What of this document can be found.
std::string VerdictOfDocument(const Report& report) {
    if (report.is_directory || !report.needs_metadata) {
        return WithoutContent(report);
    }
    const Json::Value& error = report.document[field::kContentError];
    if (error.isString() && !error.asString().empty()) {
        const bool can_pass = report.document[field::kContentRetry] == true;
        return "It is indexed and found by its name; its content could not be read (" +
               error.asString() + ")" +
               (can_pass ? " and is tried again; 'fileindexctl failed --retry' does that now."
                         : "; that is tried again when the file changes.");
    }
    const Json::Value& text = report.document[field::kTextContent];
    if (text.isString() && !text.asString().empty()) {
        return "It is indexed and found by name, content and metadata.";
    }
    return report.share.waiting > 0
               ? "It is indexed and found by its name; its content may still wait for its turn: " +
                     Number(report.share.waiting, "file", "files") + " of the share do."
               : "It is indexed and found by name and metadata; no text was found in it.";
}

/// One sentence that says how it stands and what to do.
std::string Verdict(const Report& report) {
    // From what concerns all to what concerns this document alone: whoever mends the first thing
    // may find the rest mended.
    for (const auto& verdict : {VerdictOfRules, VerdictOfShare, VerdictOfQueue}) {
        std::string sentence = verdict(report);
        if (!sentence.empty()) {
            return sentence;
        }
    }
    return VerdictOfDocument(report);
}

Json::Value ToJson(const Report& report) {
    Json::Value json(Json::objectValue);
    json["path"] = report.place.full_path;
    json["share"] = report.place.share;
    for (const fileindex::PathFinding& finding : report.findings) {
        Json::Value rule(Json::objectValue);
        rule["rule"] = finding.rule;
        rule["passed"] = finding.passed;
        rule["detail"] = finding.detail;
        json["rules"].append(rule);
    }
    json["may_be_indexed"] = report.findings.back().passed;
    json["folder"] = report.folder == nullptr ? Json::Value() : report.folder->GetData();
    json["type"] = FileTypeName(report.place.full_path);
    json["metadata"] = report.needs_metadata;
    json["paused"] = report.paused;
    json["need_reindex"] = report.needs_reindex;
    json["pending"] = report.pending.AsJson();
    json["in_index"] = report.in_index.AsJson();
    json["outdated"] = report.is_outdated;
    json["content_error"] = report.document[field::kContentError];
    json["problems"] = Json::Value(Json::arrayValue);
    for (const std::string& problem : report.share.problems) {
        json["problems"].append(problem);
    }
    json["verdict"] = Verdict(report);
    return json;
}

void PrintReport(const Report& report, Session& session) {
    session.out << Shown(report.place.full_path) << "\n";
    std::vector<std::vector<std::string>> rows;
    for (const fileindex::PathFinding& finding : report.findings) {
        rows.push_back({finding.passed ? "  ok" : "  NO", finding.rule, finding.detail});
    }
    const std::string type = FileTypeName(report.place.full_path);
    rows.push_back({report.folder == nullptr ? "  NO" : "  ok", "governing folder",
                    report.folder == nullptr ? "none" : report.folder->GetPath()});
    rows.push_back(
        {"", "content and metadata",
         (report.needs_metadata ? "wanted, as of type " : "not wanted, as of type ") + type});
    rows.push_back({"", "waits in the queue", report.pending.Text()});
    rows.push_back({"", "in the index",
                    report.in_index.Text() + (report.is_outdated ? ", as it was before" : "")});
    PrintTable(session, rows);
    session.out << Shown(Verdict(report)) << "\n";
}

int Why(const std::string& path, Session& session) {
    session.doing = "examine " + path;
    const Report report = Examine(FindPlace(path));
    if (session.json) {
        session.out << toString(ToJson(report)) << "\n";
    } else {
        PrintReport(report, session);
    }
    return kSuccess;
}

}  // namespace

void AddWhyCommand(CommandLine& line) {
    CLI::App& command = line.AddCommand(
        line.Root(), "why", "Tell rule by rule whether a path is indexed, and why not",
        "  fileindexctl why /volume1/photo/2019/a.jpg\n"
        "  fileindexctl why a.jpg                     from the current directory\n"
        "  fileindexctl why /photo --json | jq -r .verdict");
    auto path = std::make_shared<std::string>();
    command.add_option("PATH", *path, "Full path, share path, or from here")->required();
    line.OnCommand(command, [path](Session& session) { return Why(*path, session); });
}

}  // namespace quivra::ctl
