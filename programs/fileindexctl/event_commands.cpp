#include <algorithm>
#include <array>
#include <memory>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/event.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/util.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/text.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

struct Kind {
    const char* name;
    unsigned int event;
};

constexpr std::array kKinds = {
    Kind{"create", fileindex::EVENT_CREATE}, Kind{"modify", fileindex::EVENT_MODIFY},
    Kind{"delete", fileindex::EVENT_DELETE}, Kind{"attr", fileindex::EVENT_ATTR},
    Kind{"rename", fileindex::EVENT_RENAME}, Kind{"reindex", fileindex::EVENT_REINDEX},
};

struct Options {
    std::string path;
    std::string kind;
    std::string from;
    bool is_dir = false;
};

/// The share that holds the path: its queue takes the event.
std::string ShareOf(const std::string& full_path) {
    std::string name;
    std::string root;
    try {
        fileindex::GetShareNamePathByFullPath(name, root, full_path);
    } catch (const Error&) {
        // Its 502 stands for any system call; here it means one thing.
        throw Error(Error::kNoSuchShare, full_path);
    }
    return name;
}

/// The line as the file monitor would write it: one bit each, "data" for no kind but settings.
Json::Value MakeEvent(const Options& options, const std::string& path, const std::string& from) {
    const auto* const kind =
        std::find_if(kKinds.begin(), kKinds.end(),
                     [&options](const Kind& known) { return options.kind == known.name; });
    Json::Value event(Json::objectValue);
    event["event"] = kind->event;
    event["is_dir"] = options.is_dir;
    event["path"] = path;
    event["path_old"] = from;
    event["data"] = Json::Value();
    return event;
}

int Report(Session& session, const std::string& share, const std::string& queue,
           const Json::Value& event, const std::string& kind) {
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["share"] = share;
        result["queue"] = queue;
        result["event"] = event;
        session.out << toString(result) << "\n";
    } else {
        session.out << "Queued for share " << Shown(share) << ": " << kind << " "
                    << Shown(event["path"].asString()) << "\n";
    }
    return kSuccess;
}

int Add(const Options& options, Session& session) {
    if ((options.kind == "rename") == options.from.empty()) {
        throw WrongCall(options.from.empty() ? "a rename needs --from OLD"
                                             : "--from goes with --kind rename only");
    }
    const std::string path = CanonicalPath(options.path);
    const std::string from = options.from.empty() ? std::string() : CanonicalPath(options.from);
    session.doing = "queue the change of " + path;
    const std::string share = ShareOf(path);
    if (!from.empty() && ShareOf(from) != share) {
        throw Failure("cannot queue the rename: " + from + " lies in another share than " + path +
                      "; queue a delete there and a create here");
    }
    const std::string queue = sdk::SDKShare(share).GetQueuePath();
    const Json::Value event = MakeEvent(options, path, from);
    session.doing = "append the change to " + queue;
    // Not as a custom event of the library: that one is dropped where a reindex is pending, and a
    // failure would flag the share instead of being told.
    fileindex::QueueMgr(queue).Append(event);
    return Report(session, share, queue, event, options.kind);
}

}  // namespace

void AddEventCommands(CommandLine& line) {
    const std::string examples =
        "  fileindexctl event add /volume1/photo/a.jpg --kind modify\n"
        "  fileindexctl event add /volume1/photo/new --kind rename --from /volume1/photo/old "
        "--dir\n"
        "  fileindexctl event add /volume1/photo --kind reindex --dir";
    CLI::App& group = line.AddGroup("event", "Tell the indexer of changes by hand", examples);
    CLI::App& add = line.AddCommand(
        group, "add", "Append a change to the queue of the share that holds the path", examples);
    auto options = std::make_shared<Options>();
    std::vector<std::string> kinds;
    for (const Kind& kind : kKinds) {
        kinds.emplace_back(kind.name);
    }
    add.add_option("PATH", options->path, "Full path; a relative one starts here")->required();
    CLI::Option* kind = add.add_option("--kind", options->kind,
                                       "What happened: create, modify, delete, attr, rename, "
                                       "reindex");
    kind->required();
    line.SetValues(*kind, kinds, true);
    add.add_option("--from", options->from, "For a rename: the old path");
    add.add_flag("--dir", options->is_dir, "It is a directory");
    line.OnCommand(add, [options](Session& session) { return Add(*options, session); });
}

}  // namespace quivra::ctl
