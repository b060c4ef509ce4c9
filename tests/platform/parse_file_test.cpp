#include <fcntl.h>
#include <kesto/content_extract.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>

#include "platform/standalone/text_content.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using KESTO::CONTENT_EXTRACT::ParseFile;
using std::string_literals::operator""s;

class ParseFileTest : public PlatformTest {
  protected:
    static Json::Value Parse(const std::string& path, bool need_meta = true) {
        Json::Value cfg;
        cfg["need_meta"] = need_meta;
        Json::Value data;
        errno = 0;
        EXPECT_TRUE(ParseFile(path, cfg, data)) << path;
        EXPECT_EQ(errno, 0) << path;
        return data;
    }
};

TEST_F(ParseFileTest, AttributesAreThoseOfTheObject) {
    const std::string path = "/volume1/Holiday \xff.2019.TXT";
    WriteFile(path, "hello");
    const timespec times[2] = {{1500000000, 0}, {1400000000, 999999999}};
    utimensat(AT_FDCWD, path.c_str(), times, 0);
    const Json::Value data = Parse(path, false);
    EXPECT_EQ(data["KESTOMDPath"], path);
    EXPECT_EQ(data["KESTOMDParent"], "/volume1");
    EXPECT_EQ(data["KESTOMDFSName"], "Holiday \xff.2019.TXT");
    EXPECT_EQ(data["KESTOMDDisplayName"], data["KESTOMDFSName"]);
    EXPECT_EQ(data["KESTOMDIsDir"], false);
    EXPECT_EQ(data["KESTOMDOwnerUserID"], "0");
    EXPECT_EQ(data["KESTOMDOwnerGroupID"], "0");
    EXPECT_EQ(data["KESTOMDFSSize"].asInt(), 5);
    EXPECT_EQ(data["KESTOMDFSContentChangeDate"].asInt(), 1400000000);
    EXPECT_EQ(data["KESTOMDContentModificationDate"].asInt(), 1400000000);
    EXPECT_EQ(data["KESTOMDLastUsedDate"].asInt(), 1500000000);
    EXPECT_GT(data["KESTOMDAttributeChangeDate"].asInt64(), 1500000000);
    EXPECT_FALSE(data.isMember("KESTOMDTextContent"));
    EXPECT_EQ(Parse(path)["KESTOMDTextContent"], "hello");
    EXPECT_EQ(Parse(path)["KESTOMDLastUsedDate"].asInt(), 1500000000);  // reading left no trace
}

TEST_F(ParseFileTest, ExtensionsComeFromTheName) {
    const std::pair<const char*, const char*> rows[] = {
        {"README", ""}, {"a.TAR.Gz", "gz"}, {"name.", ""}, {".profile", "profile"}, {"a..b", "b"},
    };
    for (const auto& [name, extension] : rows) {
        WriteFile(std::string("/volume1/v.1/") + name, "");
        const Json::Value data = Parse(std::string("/volume1/v.1/") + name);
        EXPECT_EQ(data["KESTOMDExtension"], extension) << name;
        EXPECT_EQ(data["KESTOMDKind"], extension) << name;
    }
    EXPECT_EQ(Parse("/volume1/v.1")["KESTOMDExtension"], "1");
    EXPECT_EQ(Parse("/volume1/v.1")["KESTOMDIsDir"], true);
}

TEST_F(ParseFileTest, OnlyRegularFilesHaveContent) {
    WriteFile("/volume1/text", "secret");
    std::filesystem::create_symlink("/volume1/text", "/volume1/link");
    std::filesystem::create_symlink("/volume1/nowhere", "/volume1/dangling");
    mkfifo("/volume1/fifo", 0666);
    sockaddr_un address{AF_UNIX, "/volume1/socket"};
    const int server = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    EXPECT_EQ(bind(server, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
    for (const char* path : {"/volume1/link", "/volume1/dangling", "/volume1/fifo",
                             "/volume1/socket", "/volume1", "/dev/zero"}) {
        EXPECT_FALSE(Parse(path).isMember("KESTOMDTextContent")) << path;
    }
    EXPECT_EQ(Parse("/volume1/link")["KESTOMDIsDir"], false);
    EXPECT_EQ(Parse("/volume1/link")["KESTOMDFSSize"].asInt(), 13);  // the link's own
    std::string text;
    for (const char* path : {"/volume1/fifo", "/volume1/link", "/dev/zero", "/volume1/gone"}) {
        EXPECT_FALSE(kesto::ReadText(path, text)) << path;  // as when it is exchanged meanwhile
    }
    close(server);
}

TEST_F(ParseFileTest, FailsForWhatIsNotThere) {
    Json::Value data;
    for (const std::string& path :
         {"/volume1/gone"s, ""s, "/volume1/"s + std::string(5000, 'x'), "/volume1\0/x"s}) {
        errno = 0;
        EXPECT_FALSE(ParseFile(path, Json::Value(), data)) << path;
        EXPECT_NE(errno, 0);
    }
    for (const char* cfg :
         {"[]", "\"x\"", "{}", "{\"need_meta\": \"true\"}", "{\"need_meta\": 1}"}) {
        Json::Value value;
        Json::Reader().parse(cfg, value);
        EXPECT_TRUE(ParseFile("/volume1", value, data)) << cfg;
    }
}

TEST_F(ParseFileTest, TextIsRecognisedByItsContent) {
    const std::pair<std::string, bool> rows[] = {
        {"", true},
        {"plain\ttext\r\n\f\x1b[0m", true},
        {"caf\xe9", true},
        {"\xff\xfeh\0i\0"s, true},
        {"\xfe\xff\0h\0i"s, true},
        {"h\0i\0"s, false},
        {"\x7f"
         "ELF\x02\x01\x01\x03",
         false},
        {"%PDF-1.4\nplain", false},
        {"{\\rtf1 plain}", false},
        {std::string(200, 'x') + "\x01", true},
        {std::string(20, 'x') + "\x01", false},
    };
    for (const auto& [block, is_text] : rows) {
        EXPECT_EQ(kesto::IsTextBeginning(block), is_text) << block;
    }
}

TEST_F(ParseFileTest, TextLeavesAsValidUtf8) {
    struct Row {
        const char* label;
        std::string raw;
        std::string text;
    };
    const Row rows[] = {
        {"ASCII", "hello\n", "hello\n"},
        {"UTF-8", "gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80", "gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80"},
        {"UTF-8 mark", "\xef\xbb\xbfhi", "hi"},
        {"cut-off character", "\xc3\xbc\xe2\x82", "\xc3\xbc"},
        {"one fault among sound ones", "\xc3\xbc\xc3\xbc\xff.", "\xc3\xbc\xc3\xbc\xef\xbf\xbd."},
        {"over-long, surrogate, beyond", "\xc3\xbc\xc3\xbc\xc3\xbc\xc0\xed\xa0",
         "\xc3\xbc\xc3\xbc\xc3\xbc\xef\xbf\xbd\xef\xbf\xbd\xef\xbf\xbd"},
        {"Windows-1252", "\x80 caf\xe9 \x93q\x94",
         "\xe2\x82\xac caf\xc3\xa9 \xe2\x80\x9cq\xe2\x80\x9d"},
        {"its undefined bytes", "\xe9\x81\xe9", "\xc3\xa9\xef\xbf\xbd\xc3\xa9"},
        {"UTF-16LE", "\xff\xfeh\0\xac\x20=\xd8\x00\xde"s, "h\xe2\x82\xac\xf0\x9f\x98\x80"},
        {"UTF-16BE", "\xfe\xff\0h\x20\xac"s, "h\xe2\x82\xac"},
        {"lone surrogate", "\xff\xfe\x00\xd8h\0"s, "\xef\xbf\xbdh"},
        {"odd length", "\xff\xfeh\0i"s, "h"},
        {"marks alone", "\xff\xfe", ""},
        {"control characters",
         "a\x01"
         "b\0c\x7f"s,
         "a b c "},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(kesto::DecodeText(row.raw), row.text) << row.label;
    }
}

TEST_F(ParseFileTest, HugeFilesAreCutAtACharacter) {
    std::string umlauts = "x";
    while (umlauts.size() < (5U << 20)) {
        umlauts += "\xc3\xbc";
    }
    WriteFile("/volume1/large.txt", umlauts);
    const std::string text = Parse("/volume1/large.txt")["KESTOMDTextContent"].asString();
    EXPECT_EQ(text, umlauts.substr(0, kesto::kMaxTextSize - 1));
    const std::string accents(kesto::kMaxTextSize, '\xe9');  // doubles in size
    EXPECT_EQ(kesto::DecodeText(accents).size(), kesto::kMaxTextSize);
    const std::string late_nul = std::string(70000, 'x') + "\0y"s;
    WriteFile("/volume1/nul.txt", late_nul);
    EXPECT_EQ(Parse("/volume1/nul.txt")["KESTOMDTextContent"].asString().substr(69999), "x y");
    std::filesystem::resize_file("/volume1/large.txt", 1ULL << 40);  // sparse
    EXPECT_EQ(Parse("/volume1/large.txt")["KESTOMDTextContent"].asString(), text);
}

}  // namespace
