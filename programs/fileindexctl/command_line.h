#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <string>
#include <vector>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

/// Carries a command out; the answer is the exit status.
using Action = std::function<int(Session&)>;

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
    void OnCommand(CLI::App& command, Action action);

    CLI::App& Root() { return root_; }

    /// Chooses the action that the arguments (without the program's name) ask for. Throws
    /// CLI::Error: a request for help, or a wrong call.
    Action Parse(const std::vector<std::string>& arguments);

    bool WantsJson() const { return json_; }

    /// The words of a search, see TakeSearchWords.
    std::vector<std::string> words;

  private:
    CLI::App root_;
    bool json_ = false;
    Action chosen_;
};

/// Takes the words out of the arguments of a search, where "-draft" is a word and not an option,
/// and answers the rest for the parser. Other command lines are answered as they are.
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

}  // namespace quivra::ctl
