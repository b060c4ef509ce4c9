#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <ostream>
#include <sstream>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/optree.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

using fileindex::OP;

std::string DescribeErrno() {
    return errno == EACCES ? "permission denied, run it as root" : SystemErrorText(errno);
}

/// What can be opened and is not a file would count as an empty queue, or never end.
void RequireFile(const std::string& path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        throw Failure("cannot read the queue " + path + ": " + DescribeErrno());
    }
    if (!S_ISREG(status.st_mode)) {
        throw Failure("cannot read the queue " + path + ": it is " +
                      (S_ISDIR(status.st_mode) ? "a directory" : "not a file"));
    }
    if (access(path.c_str(), R_OK) != 0) {
        throw Failure("cannot read the queue " + path + ": " + DescribeErrno());
    }
}

/// A queue may hold damaged lines, which are passed over; a file without a single event is
/// something else.
void RequireEvents(int consumed, const std::string& path) {
    struct stat status {};
    if (consumed == 0 && stat(path.c_str(), &status) == 0 && status.st_size > 0) {
        throw Failure(path + " is not a change queue: no line of it holds an event");
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
void ShowAsJson(fileindex::OPTree& queue, const std::string& path, Session& session) {
    const char* separator = "{\"ops\": [";
    const int consumed = queue.ProcessOP([&](std::shared_ptr<OP> op) {
        session.out << separator << toString(ToJson(*op));
        separator = ", ";
    });
    RequireEvents(consumed, path);
    session.out << (separator[0] == '{' ? separator : "") << "], \"consumed\": " << consumed
                << "}\n";
}

/// What the library itself prints of an operation, so that log and front end read alike.
void ShowAsText(fileindex::OPTree& queue, const std::string& path, Session& session) {
    const int consumed = queue.ProcessOP([&session](std::shared_ptr<OP> op) {
        std::ostringstream printed;
        printed << op;
        session.out << Shown(printed.str()) << "\n";
    });
    RequireEvents(consumed, path);
    session.out << "consumed: " << consumed << "\n";
}

int Show(const std::string& path, Session& session) {
    session.doing = "read the queue " + path;
    RequireFile(path);
    fileindex::OPTree queue(path);
    (session.json ? ShowAsJson : ShowAsText)(queue, path, session);
    return kSuccess;
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
    line.OnCommand(
        show, [path](Session& session) { return Show(*path, session); }, Rights::kAnybody);
}

}  // namespace quivra::ctl
