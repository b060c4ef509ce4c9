#include <algorithm>
#include <fstream>

#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "tests/programs/fileindexctl/ctl_fixture.h"

namespace quivra::ctl {
namespace {

class WordingTest : public CtlTest {};

TEST_F(WordingTest, EveryCodeOfTheLibraryHasACauseAndARemedy) {
    std::ifstream header(FILEINDEX_SOURCE_DIR "/common/error.h");
    int found = 0;
    for (std::string line; std::getline(header, line);) {
        const std::size_t equals = line.find(" = ");
        if (!line.starts_with("        k") || equals == std::string::npos) {
            continue;
        }
        ++found;
        const int code = std::stoi(line.substr(equals + 3));
        EXPECT_TRUE(HasErrorText(code)) << line;
        const std::string text = DescribeError("do X", Error(code, "why"));
        EXPECT_EQ(text.find("cannot do X: "), 0U);
        EXPECT_NE(text.find("; "), std::string::npos) << text;
        EXPECT_TRUE(text.ends_with("[" + std::to_string(code) + "]")) << text;
    }
    EXPECT_GE(found, 19);
}

TEST_F(WordingTest, ErrorsAreOneSentence) {
    EXPECT_EQ(
        DescribeError("add /photo", Error(901, "Duplicated ID: /photo")),
        "cannot add /photo: it is already indexed; use 'fileindexctl folder set' to change it "
        "[901]");
    EXPECT_EQ(Reworded("Quivra error, code=800, reason=[music]"),
              "no share has that name or holds that path [800]");
    EXPECT_EQ(Reworded("Quivra error, code=1012"), "kestoelasticd refused it [1012]");
    EXPECT_EQ(Reworded("the disk is on fire"), "the disk is on fire");
    // What an error is about may be hostile; the sentence stays one line.
    for (const char* path : {"/tmp/no\nsuch\x1b[2J", "/tmp"}) {
        const Result result = Piped({"queue", "show", path});
        EXPECT_EQ(result.status, kFailure);
        EXPECT_EQ(result.out, "");
        EXPECT_EQ(result.err.find('\n'), result.err.size() - 1);
        EXPECT_EQ(result.err.find('\x1b'), std::string::npos);
    }
}

TEST_F(WordingTest, WrongCallsHaveStatusTwoAndDoNothing) {
    const std::vector<std::string> rows[] = {
        {"queue"},
        {"search"},
        {"event", "add", "/volume1/s/a", "--kind", "rename"},
        {"event", "add", "/volume1/s/a", "--kind", "create", "--from", "/volume1/s/b"},
        {"folder", "add"},
        {"pause", "999999"},
    };
    const std::pair<std::vector<std::string>, const char*> slips[] = {
        {{"serch", "x"}, "did you mean 'search'?"},
        {{"--json", "folder", "lsit"}, "did you mean 'list'?"},
        {{"folder", "frobnicate"}, "see 'fileindexctl folder --help'"},
        {{}, "a command is missing; see 'fileindexctl --help'"},
        {{"pause", "x"}, "HOURS = x is not a number that fits; see 'fileindexctl pause --help'"},
        {{"pause", "1", "2"}, "2 is not expected here; see 'fileindexctl pause --help'"},
        {{"search", "--limit"}, "--limit needs a value"},
        {{"event", "add", "x", "--kind", "y"}, "y is not one of create,"},
        {{"share", "clear", "", ""}, "SHARE is empty"},
    };
    for (const auto& [arguments, advice] : slips) {
        const Result result = Piped(arguments);
        EXPECT_EQ(result.status, kWrongCall);
        EXPECT_NE(result.err.find(advice), std::string::npos) << result.err;
    }
    fake::ScriptedServer indexer(kDaemonSocket);
    for (const std::vector<std::string>& row : rows) {
        const Result result = Piped(row);
        EXPECT_EQ(result.status, kWrongCall) << testing::PrintToString(row);
        EXPECT_EQ(result.out, "") << testing::PrintToString(row);
        EXPECT_NE(result.err, "") << testing::PrintToString(row);
    }
    EXPECT_EQ(indexer.Connections(), 0);
}

/// The long options that a text names.
std::vector<std::string> OptionsIn(const std::string& text) {
    std::vector<std::string> options;
    for (std::size_t at = 0; (at = text.find("--", at)) != std::string::npos;) {
        const std::size_t end = text.find_first_not_of("abcdefghijklmnopqrstuvwxyz-", at);
        options.push_back(text.substr(at, end - at));
        at = std::min(end, text.size());
    }
    return options;
}

/// Every command below the group, by the words that call it.
std::vector<std::vector<std::string>> CommandsBelow(CLI::App& group,
                                                    const std::vector<std::string>& words = {}) {
    std::vector<std::vector<std::string>> commands;
    for (CLI::App* app : group.get_subcommands([](const CLI::App*) { return true; })) {
        std::vector<std::string> call = words;
        call.push_back(app->get_name());
        const auto below = CommandsBelow(*app, call);
        commands.insert(commands.end(), below.begin(), below.end());
        if (below.empty()) {
            commands.push_back(call);
        }
    }
    return commands;
}

std::string Joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) {
        text += (text.empty() ? "" : " ") + word;
    }
    return text;
}

TEST_F(WordingTest, HelpManPageAndCompletionKnowEveryCommandAndOption) {
    std::string page = ReadFile(FILEINDEX_SOURCE_DIR "/packaging/man/fileindexctl.1");
    std::erase(page, '\\');  // roff escapes each "-"
    CommandLine line;
    for (std::vector<std::string> call : CommandsBelow(line.Root())) {
        const std::string command = Joined(call);
        EXPECT_NE(page.find(command), std::string::npos) << command;
        call.emplace_back("--help");
        const Result help = Piped(call);
        EXPECT_EQ(help.status, kSuccess) << command;
        EXPECT_NE(help.out.find("Examples:\n  fileindexctl " + command), std::string::npos);
        call.insert(call.begin(), "--complete");
        call.back() = "-";
        const std::string completed = Piped(call).out;
        for (const std::string& option : OptionsIn(help.out)) {
            EXPECT_NE(page.find(option), std::string::npos) << option;
            EXPECT_NE(("\n" + completed).find("\n" + option + "\t"), std::string::npos)
                << command << " " << option;
        }
    }
}

TEST_F(WordingTest, CompletionOffersWhatFits) {
    AddShare("music");
    AddShare("photo");
    SetFolders({"/photo/2019"});
    const std::pair<std::vector<std::string>, const char*> rows[] = {
        {{"fo"}, "folder\tChoose what is indexed\n"},
        {{"folder", "re"}, "reindex\tCompare a folder, or a part of it, with the disk again\n"},
        {{"event", "add", "x", "--kind", "re"}, "rename\t\nreindex\t\n"},
        {{"event", "add", "--kind=", "x", "--from", ""}, ":files\n"},
        {{"search", "--sort=si"}, "--sort=size\t\n"},
        {{"search", "--share", "=", "p"}, "photo\tshare\n"},
        {{"folder", "get", "--json", "/"}, "/photo/2019\tphoto/2019\n:files\n"},
        {{"share", "clear", "m"}, "music\tshare\n"},
        {{"share", "clear", "music", ""}, "/photo/2019\tphoto/2019\n:files\n"},
        {{"share", "clear", "music", "/volume1/music", ""}, ""},
        {{"pause", ""}, ""},
    };
    for (const auto& [words, offered] : rows) {
        std::vector<std::string> arguments = words;
        arguments.insert(arguments.begin(), "--complete");
        EXPECT_EQ(Piped(arguments).out, offered) << Joined(words);
    }
    WriteFile("/var/packages/Quivra/etc/fileindex.folders", "{");
    EXPECT_EQ(Piped({"--complete", "folder", "get", ""}).out, "");
}

}  // namespace
}  // namespace quivra::ctl
