#include <cctype>
#include <functional>
#include <memory>
#include <optional>
#include <ostream>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "fileindex/folder_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/output.h"
#include "programs/fileindexctl/share_operations.h"
#include "programs/fileindexctl/shares.h"
#include "programs/fileindexctl/table.h"
#include "programs/fileindexctl/text.h"
#include "programs/fileindexctl/waiting.h"
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
    /// The library changes the set of folders here without the lock that guards it.
    bool under_lock = false;
    /// The library saves the change first: after a failure to tell a daemon it stands.
    bool saves_first = false;
};

constexpr const char* kSavedFirst =
    " to the end (the folders are marked; do it again once all daemons run)";

std::function<void(const std::string&, const std::string&)> OnFirst(
    void (*call)(const std::string&)) {
    return [call](const std::string& first, const std::string&) { call(first); };
}

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
    if (arguments.first.empty() || (operation.second != nullptr && arguments.second.empty())) {
        throw WrongCall(std::string(arguments.first.empty() ? operation.first : operation.second) +
                        " is empty");
    }
    session.doing = std::string(operation.doing) + " " + arguments.first;
    const std::string doing = session.doing;
    try {
        const Silence silence;
        session.doing += operation.saves_first ? kSavedFirst : "";
        WaitFor(session, Needs::kBothDaemons, [operation, arguments] {
            std::optional<LockFile> lock;
            if (operation.under_lock) {
                lock.emplace(fileindex::kFileIndexFoldersLockPath, true);
            }
            operation.call(arguments.first, arguments.second);
        });
    } catch (const Error& error) {
        // What fails without a daemon fails before the save.
        const bool is_saved = IsIndexerAway(error) || error.code == Error::kChannelFailed;
        session.doing = is_saved ? session.doing : doing;
        throw;
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
        session.out << operation.done << " " << Shown(arguments.first) << ".\n";
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
        result["error"] = DescribeCause(error);
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
    const std::vector<std::string> problems = ProblemsOfShares();
    if (session.json) {
        Json::Value result(Json::objectValue);
        result["share"] = list;
        result["problems"] = Json::Value(Json::arrayValue);
        for (const std::string& problem : problems) {
            result["problems"].append(problem);
        }
        session.out << toString(result) << "\n";
    } else if (list.empty()) {
        session.err << "There are no shares; describe them in /etc/kesto/shares.conf.\n";
    } else {
        PrintTable(session, rows);
    }
    session.out.flush();
    for (const std::string& problem : problems) {
        session.err << Shown(problem) << "\n";
    }
    return problems.empty() ? kSuccess : kFailure;
}

const std::vector<Operation>& ShareOperations() {
    static const std::vector<Operation> operations = {
        {"pause", "Stop indexing a share; its index stays and is searched on",
         "fileindexctl share pause photo", "SHARE", "Name of the share", nullptr, nullptr,
         "pause share", "Paused share", OnFirst(PauseShare), true},
        {"resume", "Index a paused share again", "fileindexctl share resume photo", "SHARE",
         "Name of the share", nullptr, nullptr, "resume share", "Resumed share",
         OnFirst(ResumeShare), true},
        {"clear", "Forget a share that is gone: its folders, its queue and its index",
         "fileindexctl share clear photo /volume1/photo", "SHARE", "Name of the share", "PATH",
         "Full path of the root that it had", "clear share", "Cleared share", ClearShare, true},
        {"rename", "Carry index and folders over to a share's new name, once it has it",
         "fileindexctl share rename photo pictures", "FROM", "The old name", "TO", "The new name",
         "rename share", "Carried over share", RenameShare},
        {"migrate", "Carry the index of a share over to its new place, once it is there",
         "fileindexctl share migrate photo /volume1/photo", "SHARE", "Name of the share",
         "OLD_PATH", "Full path of the root that it had", "migrate share", "Migrated share",
         MigrateShare},
        {"check-recycle", "Settle the recycle bins after one was switched on or off",
         "fileindexctl share check-recycle photo", "SHARE", "Name of the share", nullptr, nullptr,
         "check the recycle bin of share", "Queued the check of the recycle bin of share",
         OnFirst(CheckRecycleBin)},
    };
    return operations;
}

const std::vector<Operation>& VolumeOperations() {
    static const std::vector<Operation> operations = {
        {"pause", "Stop indexing the shares of a volume, before it is unmounted or checked",
         "fileindexctl volume pause /volume1", "MOUNT_POINT", "Where the volume is mounted",
         nullptr, nullptr, "pause volume", "Paused volume", OnFirst(PauseVolume), true, true},
        {"resume", "Index the shares of a volume again", "fileindexctl volume resume /volume1",
         "MOUNT_POINT", "Where the volume is mounted", nullptr, nullptr, "resume volume",
         "Resumed volume", OnFirst(ResumeVolume), true, true},
        {"clear", "Forget the paused folders of a volume that is gone",
         "fileindexctl volume clear /volume1", "MOUNT_POINT", "Where the volume was mounted",
         nullptr, nullptr, "clear volume", "Cleared volume", OnFirst(ClearVolume), true},
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
