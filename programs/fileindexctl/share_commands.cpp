#include <cctype>
#include <functional>
#include <memory>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/output.h"
#include "programs/fileindexctl/paths.h"
#include "programs/fileindexctl/shares.h"
#include "programs/fileindexctl/table.h"
#include "sdk/share.h"

namespace quivra::ctl {
namespace {

/// One command with up to two arguments that calls one operation of the library.
struct Operation {
    const char* name;
    const char* description;
    const char* example;
    const char* first;  ///< what the first argument is called and means
    const char* first_meaning;
    const char* second;  ///< null: there is none
    const char* second_meaning;
    const char* doing;  ///< "pause share"; the first argument follows
    const char* done;   ///< "Paused share"; the first argument follows
    std::function<void(const std::string&, const std::string&)> call;
};

struct Arguments {
    std::string first;
    std::string second;
};

std::string LowerCase(std::string text) {
    for (char& c : text) {
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    }
    return text;
}

int RunOperation(const Operation& operation, const Arguments& arguments, Session& session) {
    session.doing = std::string(operation.doing) + " " + arguments.first;
    {
        const Silence silence;
        operation.call(arguments.first, arguments.second);
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["done"] = operation.name;
        result[LowerCase(operation.first)] = arguments.first;
        if (operation.second != nullptr) {
            result[LowerCase(operation.second)] = arguments.second;
        }
        session.out << toString(result) << "\n";
    } else {
        session.out << operation.done << " " << session.Shown(arguments.first) << ".\n";
    }
    return kSuccess;
}

void AddOperation(CommandLine& line, CLI::App& group, const Operation& operation) {
    CLI::App& app = line.AddCommand(group, operation.name, operation.description,
                                    std::string("  ") + operation.example);
    auto arguments = std::make_shared<Arguments>();
    app.add_option(operation.first, arguments->first, operation.first_meaning)->required();
    if (operation.second != nullptr) {
        app.add_option(operation.second, arguments->second, operation.second_meaning)->required();
    }
    line.OnCommand(app, [operation, arguments](Session& session) {
        return RunOperation(operation, *arguments, session);
    });
}

/// A share without folders is passed over by the library; who names it should learn that.
void NeedsFolders(const std::string& share) {
    if (!fileindex::FolderMgr().IsShareIndexed(share)) {
        throw Failure("share " + share +
                      " has no indexed folder; see 'fileindexctl folder list' for those that have");
    }
}

/// A rename that was interrupted may have moved the folders already.
void NeedsFoldersOfEither(const std::string& from, const std::string& to) {
    if (!fileindex::FolderMgr().IsShareIndexed(to)) {
        NeedsFolders(from);
    }
}

/// The same for a volume, by the rule that the library selects its folders by.
void NeedsFoldersBelow(const std::string& mount_point) {
    const fileindex::FolderMgr folders;
    for (const auto& folder : folders.GetFolders()) {
        if (folder->GetFullPath().starts_with(mount_point)) {
            return;
        }
    }
    throw Failure("volume " + mount_point +
                  " has no indexed folder; see 'fileindexctl status' for those that have");
}

/// Without one the library would report success and do nothing.
void NeedsFoldersToClean(const std::string& mount_point) {
    const fileindex::FolderMgr folders;
    for (const auto& folder : folders.GetFolders()) {
        if (folder->GetPaused() && folder->GetVolumeToBeClean() == mount_point) {
            return;
        }
    }
    throw Failure("volume " + mount_point + " has no paused folder that waits to be cleared");
}

/// A share whose flags cannot be read is listed with the reason, not left out.
Json::Value DescribeShare(const std::string& name, const fileindex::FolderMgr& folders) {
    Json::Value result(Json::objectValue);
    const sdk::SDKShare share(name);
    unsigned int count = 0;
    bool paused = false;
    for (const auto& folder : folders.GetFolders()) {
        if (folder->GetShare() == name) {
            ++count;
            paused = paused || folder->GetPaused();
        }
    }
    result["name"] = name;
    result["path"] = share.GetPath();
    result["folders"] = count;
    result["paused"] = paused;
    try {
        result["can_be_indexed"] = share.CanBeIndexed();
    } catch (const Error& error) {
        result["can_be_indexed"] = false;
        result["error"] = error.what();
    }
    return result;
}

int ListShares(Session& session) {
    session.doing = "list the shares";
    const fileindex::FolderMgr folders;
    Json::Value list(Json::arrayValue);
    std::vector<std::vector<std::string>> rows = {{"SHARE", "PATH", "FOLDERS", "INDEXING"}};
    for (const std::string& name : AllShares()) {
        const Json::Value share = DescribeShare(name, folders);
        const char* state = !share["can_be_indexed"].asBool() ? "not possible"
                            : share["folders"].asUInt() == 0  ? "off"
                            : share["paused"].asBool()        ? "paused"
                                                              : "on";
        rows.push_back({name, share["path"].asString(), share["folders"].asString(), state});
        list.append(share);
    }
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["share"] = list;
        session.out << toString(result) << "\n";
    } else if (list.empty()) {
        session.err << "There are no shares; describe them in /etc/kesto/shares.conf.\n";
    } else {
        PrintTable(session, rows);
    }
    return kSuccess;
}

const std::vector<Operation>& ShareOperations() {
    static const std::vector<Operation> operations = {
        {"pause", "Stop indexing a share; its index stays and is searched on",
         "fileindexctl share pause photo", "SHARE", "Name of the share", nullptr, nullptr,
         "pause share", "Paused share",
         [](const std::string& share, const std::string&) {
             NeedsFolders(share);
             fileindex::SharePause(share);
         }},
        {"resume", "Index a paused share again", "fileindexctl share resume photo", "SHARE",
         "Name of the share", nullptr, nullptr, "resume share", "Resumed share",
         [](const std::string& share, const std::string&) {
             NeedsFolders(share);
             fileindex::ShareResume(share);
         }},
        {"clear", "Forget a share that is gone: its folders, its queue and its index",
         "fileindexctl share clear photo /volume1/photo", "SHARE", "Name of the share", "PATH",
         "Full path of the root that it had", "clear share", "Cleared share",
         [](const std::string& share, const std::string& path) {
             fileindex::ShareClearPaused(share, CanonicalPath(path));
         }},
        {"rename", "Carry index and folders over to a share's new name, once it has it",
         "fileindexctl share rename photo pictures", "FROM", "The old name", "TO", "The new name",
         "rename share", "Carried over share",
         [](const std::string& from, const std::string& to) {
             NeedsFoldersOfEither(from, to);
             fileindex::ShareRename(from, to);
         }},
        {"migrate", "Carry the index of a share over to its new place, once it is there",
         "fileindexctl share migrate photo /volume1/photo", "SHARE", "Name of the share",
         "OLD_PATH", "Full path of the root that it had", "migrate share", "Migrated share",
         [](const std::string& share, const std::string& path) {
             NeedsFolders(share);
             fileindex::ShareMigrate(share, CanonicalPath(path));
         }},
        {"check-recycle", "Settle the recycle bins after one was switched on or off",
         "fileindexctl share check-recycle photo", "SHARE", "Name of the share", nullptr, nullptr,
         "check the recycle bin of share", "Queued the check of the recycle bin of share",
         [](const std::string& share, const std::string&) {
             NeedsFolders(share);
             fileindex::ShareCheckRecycle(share);
         }},
    };
    return operations;
}

const std::vector<Operation>& VolumeOperations() {
    static const std::vector<Operation> operations = {
        {"pause", "Stop indexing the shares of a volume, before it is unmounted or checked",
         "fileindexctl volume pause /volume1", "MOUNT_POINT", "Where the volume is mounted",
         nullptr, nullptr, "pause volume", "Paused volume",
         [](const std::string& mount_point, const std::string&) {
             NeedsFoldersBelow(mount_point);
             fileindex::VolumePause(mount_point);
         }},
        {"resume", "Index the shares of a volume again", "fileindexctl volume resume /volume1",
         "MOUNT_POINT", "Where the volume is mounted", nullptr, nullptr, "resume volume",
         "Resumed volume",
         [](const std::string& mount_point, const std::string&) {
             NeedsFoldersBelow(mount_point);
             fileindex::VolumeResume(mount_point);
         }},
        {"clear", "Forget the paused folders of a volume that is gone",
         "fileindexctl volume clear /volume1", "MOUNT_POINT", "Where the volume was mounted",
         nullptr, nullptr, "clear volume", "Cleared volume",
         [](const std::string& mount_point, const std::string&) {
             NeedsFoldersToClean(mount_point);
             fileindex::VolumeClearPaused(mount_point);
         }},
    };
    return operations;
}

}  // namespace

void AddShareCommands(CommandLine& line) {
    CLI::App& group = line.AddGroup("share", "Handle the indexing of whole shares",
                                    "  fileindexctl share list\n"
                                    "  fileindexctl share pause photo\n"
                                    "  fileindexctl share rename photo pictures");
    CLI::App& list = line.AddCommand(group, "list", "List the shares and whether they are indexed",
                                     "  fileindexctl share list");
    line.OnCommand(list, ListShares);
    for (const Operation& operation : ShareOperations()) {
        AddOperation(line, group, operation);
    }
}

void AddVolumeCommands(CommandLine& line) {
    CLI::App& group = line.AddGroup("volume", "Handle the indexing of all shares of a volume",
                                    "  fileindexctl volume pause /volume1");
    for (const Operation& operation : VolumeOperations()) {
        AddOperation(line, group, operation);
    }
}

}  // namespace quivra::ctl
