#include "programs/fileindexctl/command_line.h"

#include <algorithm>
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

void CommandLine::OnCommand(CLI::App& command, Action action) {
    // Only remembered here: an exception of the action must not pass through the parser.
    command.callback([this, action = std::move(action)] { chosen_ = action; });
}

Action CommandLine::Parse(const std::vector<std::string>& arguments) {
    std::vector<std::string> reversed = TakeSearchWords(*this, arguments);
    std::reverse(reversed.begin(), reversed.end());  // the form that the parser asks for
    root_.parse(reversed);
    return chosen_;
}

}  // namespace quivra::ctl
