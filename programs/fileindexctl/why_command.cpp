#include <array>
#include <ctime>
#include <memory>
#include <optional>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/path_rules.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

/// A question that may have no answer: then the reason why.
struct Answer {
    std::optional<bool> yes;
    std::string reason;

    bool Is(bool value) const { return yes.has_value() && *yes == value; }
    std::string Text() const { return !yes ? "cannot be told: " + reason : *yes ? "yes" : "no"; }
    Json::Value AsJson() const { return yes ? Json::Value(*yes) : Json::Value(); }
};

/// A daemon that is away, or a damaged queue, makes one answer unknown and leaves the others.
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
    std::vector<Finding> findings;
    std::shared_ptr<fileindex::Folder> folder;  ///< null: none governs the path
    bool needs_metadata = false;
    bool needs_reindex = false;
    bool paused = false;
    Answer pending;
    Answer in_index;
};

/// A reindex of an ancestor covers the path without naming it.
bool IsPending(const Place& place) {
    const fileindex::QueueMgr queue(sdk::SDKShare(place.share).GetQueuePath());
    return queue.IsFullPathProcessing(place.full_path) ||
           queue.IsFullPathHasReindex(place.full_path);
}

bool IsInIndex(const Place& place) {
    Json::Value query(Json::objectValue);
    query["qsl"]["term"]["KESTOMDPath"] = place.full_path;
    query["limit"] = 0;
    Json::Value reply;
    fileindex::elastic::IndexQuery(reply, place.share, query);
    return isJsonType<long long>(reply["total"]) && reply["total"].asInt64() > 0;
}

bool IsPausedNow() {
    const std::int64_t resume_time = fileindex::StatusMgr().GetPauseInfo();
    return resume_time == fileindex::kPausedWithoutEnd || std::time(nullptr) < resume_time;
}

/// Every question is asked even when a rule has failed: the index may still hold what it should
/// not, and the queue tell why.
Report Examine(const Place& place) {
    Report report;
    report.place = place;
    report.findings = ExaminePath(place);
    const fileindex::FolderMgr folders;
    report.folder = folders.GetMostSuitableCfg(place.full_path);
    report.needs_metadata = folders.IsFullPathNeedMeta(place.full_path);
    report.needs_reindex =
        (fileindex::StatusMgr().GetShareStatus(place.share) & fileindex::kShareNeedReindex) != 0;
    report.paused = IsPausedNow();
    report.pending = Ask([&] { return IsPending(place); });
    report.in_index = Ask([&] { return IsInIndex(place); });
    return report;
}

std::string WithRemedy(const std::string& text, const std::string& remedy) {
    return text + (remedy.empty() ? "" : "; " + remedy) + ".";
}

/// Empty when nothing stands against indexing.
std::string VerdictOfRules(const Report& report) {
    const Finding& last = report.findings.back();
    if (!last.passed) {
        const std::string tail =
            report.in_index.Is(true) ? " (the index still holds it, until its next pass)" : "";
        return WithRemedy("It is not indexed: " + last.detail + tail, last.remedy);
    }
    if (report.folder == nullptr) {
        return "It is not indexed: no folder covers it; 'fileindexctl folder add' with it or a "
               "folder above it.";
    }
    return std::string();
}

/// One sentence that says how it stands and what to do.
std::string Verdict(const Report& report) {
    const std::string refused = VerdictOfRules(report);
    if (!refused.empty()) {
        return refused;
    }
    const std::string& share = report.place.share;
    if (report.folder->GetPaused()) {
        return "Share " + share + " is paused; 'fileindexctl share resume " + share +
               "' goes on with it.";
    }
    if (report.needs_reindex) {
        return "Changes of share " + share + " were lost; 'fileindexctl folder reindex " +
               report.folder->GetPath() + "' finds them.";
    }
    if (!report.pending.Is(false)) {
        return report.pending.yes.has_value() && report.paused
                   ? "It waits in the queue, but all indexing is paused; 'fileindexctl resume' "
                     "ends that."
                   : WithRemedy(report.pending.Is(true) ? "It waits in the queue"
                                                        : "The queue cannot be read",
                                "'fileindexctl status' shows how far the indexer is");
    }
    if (!report.in_index.yes) {
        return "The index cannot be asked; 'fileindexctl status' shows which daemon is missing.";
    }
    if (!*report.in_index.yes) {
        return "It should be in the index and is not; 'fileindexctl folder reindex " +
               report.place.share_path + "' repairs that.";
    }
    return report.needs_metadata ? "It is indexed and found by name, content and metadata."
                                 : "It is indexed and found by its name.";
}

std::string FileTypeName(const std::string& path) {
    constexpr std::array kNames = {"document", "audio", "video", "photo", "other"};
    return kNames.at(static_cast<std::size_t>(fileindex::GetFileTypeByFullPath(path)));
}

Json::Value ToJson(const Report& report) {
    Json::Value json(Json::objectValue);
    json["path"] = report.place.full_path;
    json["share"] = report.place.share;
    for (const Finding& finding : report.findings) {
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
    json["verdict"] = Verdict(report);
    return json;
}

void PrintReport(const Report& report, Session& session) {
    session.out << Shown(report.place.full_path) << "\n";
    std::vector<std::vector<std::string>> rows;
    for (const Finding& finding : report.findings) {
        rows.push_back({finding.passed ? "  ok" : "  NO", finding.rule, finding.detail});
    }
    const std::string type = FileTypeName(report.place.full_path);
    rows.push_back({report.folder == nullptr ? "  NO" : "  ok", "governing folder",
                    report.folder == nullptr ? "none" : report.folder->GetPath()});
    rows.push_back({"", "content and metadata",
                    (report.needs_metadata ? "yes, as of type " : "no, as of type ") + type});
    rows.push_back({"", "waits in the queue", report.pending.Text()});
    rows.push_back({"", "in the index", report.in_index.Text()});
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
