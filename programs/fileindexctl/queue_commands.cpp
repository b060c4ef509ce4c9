#include <sys/stat.h>

#include <cerrno>
#include <memory>
#include <ostream>
#include <sstream>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/optree.h"
#include "programs/fileindexctl/command_line.h"

namespace quivra::ctl {
namespace {

using fileindex::OP;

/// A directory can be opened, and would count as an empty queue.
void RefuseDirectory(const std::string& path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        throw Failure("cannot read the queue " + path + ": " + SystemErrorText(errno));
    }
    if (S_ISDIR(status.st_mode)) {
        throw Failure("cannot read the queue " + path + ": it is a directory");
    }
}

Json::Value ToJson(const OP& op) {
    Json::Value json(Json::objectValue);
    json["op"] = static_cast<int>(op.op);
    json["path"] = op.node->GetPath();
    json["path_old"] = op.path;
    json["data"] = op.data;
    return json;
}

/// Written op by op: a queue may hold millions. A queue that cannot be read fails before the first.
int ShowAsJson(fileindex::OPTree& queue, Session& session) {
    const char* separator = "{\"ops\": [";
    const int consumed = queue.ProcessOP([&](std::shared_ptr<OP> op) {
        session.out << separator << toString(ToJson(*op));
        separator = ", ";
    });
    session.out << (separator[0] == '{' ? separator : "") << "], \"consumed\": " << consumed
                << "}\n";
    return kSuccess;
}

/// What the library itself prints of an operation, so that log and front end read alike.
int ShowAsText(fileindex::OPTree& queue, Session& session) {
    const int consumed = queue.ProcessOP([&session](std::shared_ptr<OP> op) {
        std::ostringstream printed;
        printed << op;
        session.out << session.Shown(printed.str()) << "\n";
    });
    session.out << "consumed: " << consumed << "\n";
    return kSuccess;
}

int Show(const std::string& path, Session& session) {
    session.doing = "read the queue " + path;
    RefuseDirectory(path);
    fileindex::OPTree queue(path);
    return session.json ? ShowAsJson(queue, session) : ShowAsText(queue, session);
}

}  // namespace

void AddQueueCommands(CommandLine& line) {
    CLI::App& group =
        line.AddGroup("queue", "Look into change queues",
                      "  fileindexctl queue show /volume1/photo/@eaDir/fileindex/queue\n"
                      "                           what is left to do, after merging, and how many "
                      "changes that is");
    CLI::App& show = line.AddCommand(
        group, "show",
        "Show the operations that a queue file amounts to; the file stays as it is.\n"
        "[01] delete, [02] index, [03] attributes, [04] settings, [05] rename, [06] reindex,\n"
        "[07] reindex all",
        "  fileindexctl queue show /volume1/photo/@eaDir/fileindex/queue\n"
        "  fileindexctl queue show --json queue.tmp | jq '.ops[].path'");
    auto path = std::make_shared<std::string>();
    show.add_option("FILE", *path, "The queue file, or its working copy (.tmp)")->required();
    line.OnCommand(show, [path](Session& session) { return Show(*path, session); });
}

}  // namespace quivra::ctl
