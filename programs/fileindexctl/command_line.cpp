#include "programs/fileindexctl/command_line.h"

#include <algorithm>
#include <cstddef>
#include <utility>

namespace quivra::ctl {
namespace {

constexpr const char* kExamples = R"(Examples:
  fileindexctl folder add /photo              index the share "photo"
  fileindexctl status --watch                 see it happen
  fileindexctl search sunset beach            find files by name, content and metadata
  fileindexctl why /volume1/photo/a.jpg       learn why a file is not found
  fileindexctl folder set /photo --no-video   change what is indexed in it
  fileindexctl pause 8                        leave the disks alone for the night

Each command explains itself: fileindexctl COMMAND --help.
Exit status: 0 done, 1 failed (a search: nothing found), 2 wrong call.)";

/// How many letters were typed wrong, left out, added or swapped with their neighbour.
std::size_t Mistakes(const std::string& typed, const std::string& meant) {
    std::vector<std::vector<std::size_t>> cost(typed.size() + 1,
                                               std::vector<std::size_t>(meant.size() + 1));
    for (std::size_t i = 0; i <= typed.size(); ++i) {
        for (std::size_t j = 0; j <= meant.size(); ++j) {
            if (i == 0 || j == 0) {
                cost[i][j] = i + j;
                continue;
            }
            const std::size_t changed = typed[i - 1] == meant[j - 1] ? 0 : 1;
            cost[i][j] =
                std::min({cost[i - 1][j] + 1, cost[i][j - 1] + 1, cost[i - 1][j - 1] + changed});
            if (i > 1 && j > 1 && typed[i - 1] == meant[j - 2] && typed[i - 2] == meant[j - 1]) {
                cost[i][j] = std::min(cost[i][j], cost[i - 2][j - 2] + 1);
            }
        }
    }
    return cost.back().back();
}

/// ", did you mean 'search'?" where one command is near enough to what was typed.
std::string Suggestion(CLI::App& group, const std::string& typed) {
    std::string nearest;
    std::size_t least = std::min<std::size_t>(3, (typed.size() + 1) / 2);
    for (const CLI::App* command : group.get_subcommands([](const CLI::App*) { return true; })) {
        const std::size_t mistakes = Mistakes(typed, command->get_name());
        if (mistakes < least) {
            least = mistakes;
            nearest = command->get_name();
        }
    }
    return nearest.empty() ? "" : "; did you mean '" + nearest + "'?";
}

}  // namespace

CommandLine::CommandLine()
    : root_(
          "Chooses the folders whose files can be found by name, content and metadata, and "
          "searches them.",
          "fileindexctl") {
    root_.footer(kExamples);
    // One command a call, and with it no later word can be taken for a command ("search status").
    root_.require_subcommand(1);
    root_.set_version_flag("--version", "fileindexctl " FILEINDEX_VERSION,
                           "Print the version and exit");
    AddFolderCommands(*this);
    AddSearchCommand(*this);
    AddStatusCommand(*this);
    AddWhyCommand(*this);
    AddFailedCommand(*this);
    AddServiceCommands(*this);
    AddShareCommands(*this);
    AddVolumeCommands(*this);
    AddQueueCommands(*this);
    AddEventCommands(*this);
}

CLI::App& CommandLine::AddGroup(const std::string& name, const std::string& description,
                                const std::string& examples) {
    CLI::App& group = *root_.add_subcommand(name, description);
    group.footer("Examples:\n" + examples);
    group.require_subcommand(1);
    return group;
}

CLI::App& CommandLine::AddCommand(CLI::App& parent, const std::string& name,
                                  const std::string& description, const std::string& examples) {
    CLI::App& command = *parent.add_subcommand(name, description);
    command.footer("Examples:\n" + examples);
    command.add_flag("--json", json_, "Print one JSON document for programs");
    return command;
}

void CommandLine::OnCommand(CLI::App& command, Action action, Rights rights) {
    const CLI::App* group = command.get_parent();
    const std::string name = (group == &root_ ? "" : group->get_name() + " ") + command.get_name();
    // Only remembered here: an exception of the action must not pass through the parser.
    command.callback(
        [this, chosen = Chosen{name, std::move(action), rights}] { chosen_ = chosen; });
}

void CommandLine::SetValues(CLI::Option& option, const std::vector<std::string>& values,
                            bool only) {
    values_[&option] = values;
    if (only) {
        option.check(CLI::IsMember(values).description(""));
    }
}

std::vector<std::string> CommandLine::ValuesOf(const CLI::Option& option) const {
    const auto found = values_.find(&option);
    return found == values_.end() ? std::vector<std::string>() : found->second;
}

std::string CommandLine::CallOf(const std::vector<std::string>& arguments) {
    constexpr std::size_t kLongestTyped = 64;  // beyond, it is no slip of the fingers
    CLI::App* group = &root_;
    std::string call = "fileindexctl";
    for (const std::string& argument : arguments) {
        if (group->get_require_subcommand_min() == 0) {
            break;
        }
        if (argument.empty() || argument[0] == '-') {
            continue;
        }
        const auto commands = group->get_subcommands(
            [&argument](const CLI::App* app) { return app->get_name() == argument; });
        if (commands.empty()) {
            const std::string suggestion =
                argument.size() > kLongestTyped ? "" : Suggestion(*group, argument);
            throw WrongCall("there is no command '" + argument + "'" +
                            (suggestion.empty() ? "; see '" + call + " --help'" : suggestion));
        }
        group = commands.front();
        call += " " + argument;
    }
    return call;
}

Chosen CommandLine::Parse(const std::vector<std::string>& arguments) {
    CallOf(arguments);  // the parser would only say that an argument was not expected
    std::vector<std::string> reversed = TakeSearchWords(*this, arguments);
    std::reverse(reversed.begin(), reversed.end());  // the form that the parser asks for
    root_.parse(reversed);
    return chosen_;
}

}  // namespace quivra::ctl
