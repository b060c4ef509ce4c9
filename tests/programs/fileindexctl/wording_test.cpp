#include <algorithm>
#include <fstream>

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
    const Error unreachable(502, "write failed, reason=Transport endpoint is not connected");
    EXPECT_NE(DescribeError("pause indexing", unreachable).find("daemon does not answer"),
              std::string::npos);
    EXPECT_NE(DescribeError("search share s", Error(4711, "Request failed, msg=odd"))
                  .find("Request failed, msg=odd"),
              std::string::npos);
    // What an error is about may be hostile; the sentence stays one line.
    const Result result = Piped({"queue", "show", "/tmp/no\nsuch\x1b[2J"});
    EXPECT_EQ(result.status, kFailure);
    EXPECT_EQ(result.err.find('\n'), result.err.size() - 1);
    EXPECT_EQ(result.err.find('\x1b'), std::string::npos);
}

TEST_F(WordingTest, WrongCallsHaveStatusTwoAndDoNothing) {
    const std::vector<std::string> rows[] = {
        {},
        {"frobnicate"},
        {"queue"},
        {"queue", "show"},
        {"queue", "show", "a", "b"},
        {"search"},
        {"search", "--limit", "many", "word"},
        {"search", "--no-such-option", "word"},
        {"search", "--sort", "colour", "word"},
        {"event", "add", "/volume1/s/a"},
        {"event", "add", "/volume1/s/a", "--kind", "explode"},
        {"event", "add", "/volume1/s/a", "--kind", "rename"},
        {"event", "add", "/volume1/s/a", "--kind", "create", "--from", "/volume1/s/b"},
        {"folder", "add"},
        {"folder", "add", ""},
        {"folder", "list", "--sort", "size"},
        {"pause", "-1"},
        {"pause", "soon"},
        {"pause", "999999"},
        {"share", "rename", "one"},
        {"status", "now"},
    };
    fake::ScriptedServer indexer(kDaemonSocket);
    for (const std::vector<std::string>& row : rows) {
        const Result result = Piped(row);
        EXPECT_EQ(result.status, kWrongCall) << testing::PrintToString(row);
        EXPECT_EQ(result.out, "") << testing::PrintToString(row);
        EXPECT_NE(result.err, "") << testing::PrintToString(row);
    }
    EXPECT_EQ(indexer.Connections(), 0);
}

/// Every command, by its words.
const std::vector<std::string> kCommands[] = {
    {},
    {"folder"},
    {"folder", "add"},
    {"folder", "set"},
    {"folder", "get"},
    {"folder", "list"},
    {"folder", "delete"},
    {"folder", "reindex"},
    {"search"},
    {"status"},
    {"why"},
    {"pause"},
    {"resume"},
    {"share"},
    {"share", "list"},
    {"share", "pause"},
    {"share", "resume"},
    {"share", "clear"},
    {"share", "rename"},
    {"share", "migrate"},
    {"share", "check-recycle"},
    {"volume"},
    {"volume", "pause"},
    {"volume", "resume"},
    {"volume", "clear"},
    {"queue"},
    {"queue", "show"},
    {"event"},
    {"event", "add"},
    {"services"},
    {"services", "prepare"},
};

std::string HelpOf(std::vector<std::string> command) {
    command.push_back("--help");
    std::ostringstream out;
    Session session{.out = out, .err = out};
    EXPECT_EQ(Run(command, session), kSuccess);
    return out.str();
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

TEST_F(WordingTest, HelpTeachesByExamplesAtEveryLevel) {
    for (const std::vector<std::string>& command : kCommands) {
        std::string call = "  fileindexctl";
        for (const std::string& word : command) {
            call += " " + word;
        }
        const std::string help = HelpOf(command);
        const std::size_t examples = help.find("Examples:\n");
        ASSERT_NE(examples, std::string::npos) << call;
        EXPECT_NE(help.find(call, examples), std::string::npos) << call;
    }
    EXPECT_EQ(Piped({"--version"}).status, kSuccess);
}

TEST_F(WordingTest, ManPageAndCompletionKnowEveryCommandAndOption) {
    std::string page = ReadFile(FILEINDEX_SOURCE_DIR "/packaging/man/fileindexctl.1");
    std::erase(page, '\\');  // roff escapes each "-"
    const std::string completion =
        ReadFile(FILEINDEX_SOURCE_DIR "/packaging/completions/fileindexctl.bash");
    for (const std::vector<std::string>& command : kCommands) {
        std::vector<std::string> words = OptionsIn(HelpOf(command));
        words.insert(words.end(), command.begin(), command.end());
        for (const std::string& word : words) {
            EXPECT_NE(page.find(word), std::string::npos) << word;
            EXPECT_NE(completion.find(word), std::string::npos) << word;
        }
    }
}

}  // namespace
}  // namespace quivra::ctl
