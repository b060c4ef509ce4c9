#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

/// Carries a command out and returns the exit status.
using Action = std::function<int(Session&)>;

/// Whether a command reads or changes what belongs to root alone.
enum class Rights { kAnybody, kRoot };

/// What a command line asks for.
struct Chosen {
    std::string name;  ///< "folder add"
    Action action;
    Rights rights = Rights::kRoot;
};

/// The tree of commands. Parsing only chooses an action; running it is the caller's.
class CommandLine {
  public:
    CommandLine();

    /// A group of commands ("folder") or, with an action added later, a command at the top.
    CLI::App& AddGroup(const std::string& name, const std::string& description,
                       const std::string& examples);

    /// A command of `parent` that writes text or, with --json, one JSON document.
    CLI::App& AddCommand(CLI::App& parent, const std::string& name, const std::string& description,
                         const std::string& examples);

    /// What the command does when it is the one that the command line names.
    void OnCommand(CLI::App& command, Action action, Rights rights = Rights::kRoot);

    /// The words that an option's value is one of. Others are refused when `only` is set.
    void SetValues(CLI::Option& option, const std::vector<std::string>& values, bool only);

    /// The words that were set for the option; none where any value will do.
    std::vector<std::string> ValuesOf(const CLI::Option& option) const;

    CLI::App& Root() { return root_; }

    /// Finds out what the arguments (without the program's name) ask for. Throws CLI::Error for a
    /// request for help and for a wrong call, WrongCall for a command that there is not.
    Chosen Parse(const std::vector<std::string>& arguments);

    /// The command that the arguments name, "fileindexctl folder add", as far as they do. Throws
    /// WrongCall, with the nearest command, for one that there is not.
    std::string CallOf(const std::vector<std::string>& arguments);

    bool WantsJson() const { return json_; }

    /// The words of a search, see TakeSearchWords.
    std::vector<std::string> words;

  private:
    CLI::App root_;
    bool json_ = false;
    std::map<const CLI::Option*, std::vector<std::string>> values_;
    Chosen chosen_;
};

/// Takes the words out of the arguments of a search, where "-draft" is a word and not an option,
/// and returns the rest for the parser. Other command lines are returned as they are.
std::vector<std::string> TakeSearchWords(CommandLine& line,
                                         const std::vector<std::string>& arguments);

/// Each adds one group of commands.
void AddQueueCommands(CommandLine& line);
void AddSearchCommand(CommandLine& line);
void AddEventCommands(CommandLine& line);
void AddFolderCommands(CommandLine& line);
void AddShareCommands(CommandLine& line);
void AddVolumeCommands(CommandLine& line);
void AddServiceCommands(CommandLine& line);
void AddStatusCommand(CommandLine& line);
void AddWhyCommand(CommandLine& line);
void AddFailedCommand(CommandLine& line);

}  // namespace quivra::ctl
