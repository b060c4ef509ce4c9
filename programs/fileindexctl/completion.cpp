#include "programs/fileindexctl/completion.h"

#include <algorithm>
#include <array>
#include <exception>
#include <ostream>
#include <string_view>

#include "fileindex/folder_mgr.h"
#include "programs/fileindexctl/shares.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

constexpr const char* kFiles = ":files";

struct Candidate {
    std::string word;
    std::string meaning;
};
using Candidates = std::vector<Candidate>;

/// Where the words before the one to be completed have led.
struct Place {
    CLI::App* app;
    const CLI::Option* pending = nullptr;  ///< an option that waits for its value
    std::size_t arguments = 0;             ///< of the command that are given already
};

bool TakesValue(const CLI::Option& option) {
    return option.get_items_expected_min() > 0;
}

CLI::App* FindCommand(CLI::App& group, const std::string& name) {
    const auto found = group.get_subcommands(
        [&name](const CLI::App* command) { return command->get_name() == name; });
    return found.empty() ? nullptr : found.front();
}

Place Follow(CLI::App& root, const std::vector<std::string>& words) {
    Place place{&root};
    for (const std::string& word : words) {
        CLI::App* command = FindCommand(*place.app, word);
        // First: the value of an option may look like a command.
        if (place.pending != nullptr) {
            place.pending = nullptr;
        } else if (word.starts_with("-")) {
            const CLI::Option* option = place.app->get_option_no_throw(word);
            place.pending = option != nullptr && TakesValue(*option) ? option : nullptr;
        } else if (command != nullptr) {
            place.app = command;
        } else {
            ++place.arguments;
        }
    }
    return place;
}

Candidates Shares() {
    Candidates shares;
    for (const std::string& name : AllShares()) {
        shares.push_back({name, "share"});
    }
    return shares;
}

Candidates Folders() {
    Candidates folders;
    const fileindex::FolderMgr set;
    for (const auto& folder : set.GetFolders()) {
        folders.push_back({folder->GetPath(), folder->GetName()});
    }
    return folders;
}

/// What an argument or an option's value may be is told by its name, which is the same wherever it
/// means the same.
Candidates ValuesOf(CommandLine& line, const CLI::Option& option) {
    Candidates values;
    for (const std::string& value : line.ValuesOf(option)) {
        values.push_back({value, ""});
    }
    const std::string name = option.get_name();
    if (name == "SHARE" || name == "--share" || name == "FROM" || name == "TO") {
        return Shares();
    }
    constexpr std::array<std::string_view, 5> kPaths = {"PATH", "OLD_PATH", "FILE", "MOUNT_POINT",
                                                        "--from"};
    if (name == "PATH") {
        values = Folders();
    }
    if (std::find(kPaths.begin(), kPaths.end(), name) != kPaths.end()) {
        values.push_back({kFiles, ""});
    }
    return values;
}

Candidates OptionsOf(CLI::App& app) {
    Candidates options;
    for (const CLI::Option* option : app.get_options()) {
        for (const std::string& name : option->get_lnames()) {
            options.push_back({"--" + name, option->get_description()});
        }
    }
    return options;
}

Candidates CommandsOf(CLI::App& group) {
    Candidates commands;
    for (const CLI::App* command : group.get_subcommands([](const CLI::App*) { return true; })) {
        const std::string description = command->get_description();
        commands.push_back({command->get_name(), description.substr(0, description.find('\n'))});
    }
    return commands;
}

Candidates ArgumentsOf(CommandLine& line, const Place& place) {
    const auto arguments =
        place.app->get_options([](const CLI::Option* option) { return option->get_positional(); });
    return place.arguments < arguments.size() ? ValuesOf(line, *arguments[place.arguments])
                                              : Candidates();
}

Candidates FindCandidates(CommandLine& line, const std::vector<std::string>& before,
                          const std::string& current) {
    const Place place = Follow(line.Root(), before);
    if (place.pending != nullptr) {
        return ValuesOf(line, *place.pending);
    }
    const std::size_t equals = current.find('=');
    if (current.starts_with("-") && equals != std::string::npos) {
        const CLI::Option* option = place.app->get_option_no_throw(current.substr(0, equals));
        Candidates values = option == nullptr ? Candidates() : ValuesOf(line, *option);
        for (Candidate& value : values) {
            value.word = current.substr(0, equals + 1) + value.word;
        }
        return values;
    }
    if (current.starts_with("-")) {
        return OptionsOf(*place.app);
    }
    // A group has commands and no arguments of its own, a command the other way round.
    Candidates commands = CommandsOf(*place.app);
    return commands.empty() ? ArgumentsOf(line, place) : commands;
}

/// One line is one candidate, so a name with a line break or a tab cannot be offered.
bool CanBePrinted(const std::string& word) {
    return word.find_first_of("\t\n") == std::string::npos;
}

}  // namespace

void Complete(CommandLine& line, std::vector<std::string> words, Session& session) {
    // Some shells take "--sort=size" apart.
    std::erase(words, "=");
    const std::string current = words.empty() ? "" : words.back();
    if (!words.empty()) {
        words.pop_back();
    }
    try {
        for (const Candidate& candidate : FindCandidates(line, words, current)) {
            if (candidate.word == kFiles) {
                session.out << kFiles << "\n";
            } else if (candidate.word.starts_with(current) && CanBePrinted(candidate.word)) {
                session.out << candidate.word << "\t" << Shown(candidate.meaning) << "\n";
            }
        }
    } catch (const std::exception&) {
        // Shares or folders cannot be read: nothing is offered.
    }
}

}  // namespace quivra::ctl
