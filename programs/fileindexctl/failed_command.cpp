#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/daemons.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

struct Options {
    std::string share;
    bool retry = false;
};

std::vector<std::string> SharesOf(const Options& options) {
    const fileindex::FolderMgr folders;
    if (options.share.empty()) {
        const auto shares = folders.GetIndexedShares();
        return {shares.begin(), shares.end()};
    }
    if (!folders.IsShareIndexed(options.share)) {
        throw Failure("share " + options.share +
                      " has no indexed folder; see 'fileindexctl folder list' for those that have");
    }
    return {options.share};
}

/// The daemon's reply to a question about one share.
Json::Value AskIndexer(const std::string& question, const std::string& share) {
    Json::Value data(Json::objectValue);
    data["share"] = share;
    const DaemonState state = AskDaemon(kIndexer, question, data);
    if (state.reach == DaemonState::Reach::kRefused) {
        throw Failure("fileindexd cannot do that for share " + share + ": " + state.refusal);
    }
    if (state.reach != DaemonState::Reach::kReplied) {
        throw Failure(DescribeProblem(kIndexer, state));
    }
    return state.data;
}

std::string Text(const Json::Value& value) {
    return value.isString() ? value.asString() : "unknown";
}

std::string Time(const Json::Value& seconds) {
    return seconds.isInt64() && seconds.asInt64() > 0 ? LocalTime(seconds.asInt64())
                                                      : "when it changes";
}

int List(const std::vector<std::string>& shares, Session& session) {
    Json::Value all(Json::arrayValue);
    std::vector<std::vector<std::string>> rows = {{"PATH", "SINCE", "NEXT TRY", "REASON"}};
    for (const std::string& share : shares) {
        const Json::Value files = AskIndexer("failed", share);
        // The list comes from a store on the share's disk: nothing in it is taken for granted.
        for (const Json::Value& file : files.isArray() ? files : Json::Value(Json::arrayValue)) {
            if (!file.isObject()) {
                continue;
            }
            all.append(file)["share"] = share;
            rows.push_back({Text(file["path"]), Time(file["since"]), Time(file["next_try"]),
                            Text(file["reason"])});
        }
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["failed"] = all;
        session.out << toString(result) << "\n";
    } else if (all.empty()) {
        session.err << "The content of all files that want it could be read.\n";
    } else {
        PrintTable(session, rows);
    }
    return kSuccess;
}

int Retry(const std::vector<std::string>& shares, Session& session) {
    for (const std::string& share : shares) {
        AskIndexer("retry", share);
    }
    if (session.json) {
        session.out << "{\"done\":\"retry\"}\n";
    } else {
        session.out << "They are tried again now; 'fileindexctl failed' lists what is left.\n";
    }
    return kSuccess;
}

int Failed(const Options& options, Session& session) {
    session.doing = "list the files without content";
    const std::vector<std::string> shares = SharesOf(options);
    return options.retry ? Retry(shares, session) : List(shares, session);
}

}  // namespace

void AddFailedCommand(CommandLine& line) {
    CLI::App& command =
        line.AddCommand(line.Root(), "failed",
                        "List the files that are found by their names only, because their content "
                        "could not be read",
                        "  fileindexctl failed\n"
                        "  fileindexctl failed photo --retry    try those of the share again now\n"
                        "  fileindexctl failed --json | jq -r '.failed[].path'");
    auto options = std::make_shared<Options>();
    command.add_option("SHARE", options->share, "Those of this share only");
    command.add_flag("--retry", options->retry, "Do not wait for their next try: try them now");
    line.OnCommand(command, [options](Session& session) { return Failed(*options, session); });
}

}  // namespace quivra::ctl
