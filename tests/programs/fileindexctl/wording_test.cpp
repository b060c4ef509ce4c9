#include <algorithm>
#include <fstream>
#include <iterator>

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

std::vector<std::string> WordsOf(const std::string& command) {
    std::istringstream in(command);
    return {std::istream_iterator<std::string>(in), {}};
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

TEST_F(WordingTest, ManPageAndCompletionKnowEveryCommandAndOption) {
    const char* commands[] = {"folder add",   "folder set",    "folder get",
                              "folder list",  "folder delete", "folder reindex",
                              "search",       "status",        "why",
                              "pause",        "resume",        "share list",
                              "share pause",  "share resume",  "share clear",
                              "share rename", "share migrate", "share check-recycle",
                              "volume pause", "volume resume", "volume clear",
                              "queue show",   "event add",     "services prepare"};
    std::string page = ReadFile(FILEINDEX_SOURCE_DIR "/packaging/man/fileindexctl.1");
    std::erase(page, '\\');  // roff escapes each "-"
    const std::string completion =
        ReadFile(FILEINDEX_SOURCE_DIR "/packaging/completions/fileindexctl.bash");
    for (const std::string command : commands) {
        const Result help = Piped(WordsOf(command + " --help"));
        EXPECT_EQ(help.status, kSuccess) << command;
        EXPECT_NE(help.out.find("Examples:\n  fileindexctl " + command), std::string::npos);
        std::vector<std::string> words = OptionsIn(help.out);
        const std::vector<std::string> names = WordsOf(command);
        words.insert(words.end(), names.begin(), names.end());
        for (const std::string& word : words) {
            EXPECT_NE(page.find(word), std::string::npos) << word;
            EXPECT_NE(completion.find(word), std::string::npos) << word;
        }
    }
}

}  // namespace
}  // namespace quivra::ctl
