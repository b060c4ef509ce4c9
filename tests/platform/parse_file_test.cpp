#include <fcntl.h>
#include <kesto/content_extract.h>

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
    const std::string path = "/volume1/v.1/Holiday \xff.2019.TXT";
    WriteFile(path, "hello");
    const timespec times[2] = {{1500000000, 0}, {1400000000, 999999999}};
    utimensat(AT_FDCWD, path.c_str(), times, 0);
    const Json::Value data = Parse(path, false);
    EXPECT_EQ(data["KESTOMDPath"], path);
    EXPECT_EQ(data["KESTOMDParent"], "/volume1/v.1");
    EXPECT_EQ(data["KESTOMDExtension"], "txt");
    EXPECT_EQ(data["KESTOMDIsDir"], false);
    EXPECT_EQ(data["KESTOMDContentModificationDate"].asInt(), 1400000000);
    EXPECT_FALSE(data.isMember("KESTOMDTextContent"));
    EXPECT_EQ(Parse(path)["KESTOMDTextContent"], "hello");
    EXPECT_EQ(Parse(path)["KESTOMDLastUsedDate"].asInt(), 1500000000);  // reading left no trace
    EXPECT_EQ(Parse("/volume1")["KESTOMDExtension"], "");
}

TEST_F(ParseFileTest, OnlyRegularFilesHaveContent) {
    WriteFile("/volume1/text", "secret");
    std::filesystem::create_symlink("/volume1/text", "/volume1/link");
    mkfifo("/volume1/fifo", 0666);
    std::string text;
    for (const char* path : {"/volume1/link", "/volume1/fifo", "/volume1", "/dev/zero"}) {
        EXPECT_FALSE(Parse(path).isMember("KESTOMDTextContent")) << path;
        EXPECT_FALSE(kesto::ReadText(path, text)) << path;  // as when it is exchanged meanwhile
    }
    EXPECT_EQ(Parse("/volume1/link")["KESTOMDFSSize"].asInt(), 13);  // the link's own
    Json::Value data;
    EXPECT_TRUE(ParseFile("/volume1", "no object", data));
    EXPECT_EQ(data["KESTOMDIsDir"], true);
    EXPECT_FALSE(ParseFile("/volume1/gone", Json::Value(), data));
    EXPECT_FALSE(ParseFile("/volume1\0/x"s, Json::Value(), data));
}

TEST_F(ParseFileTest, TextIsRecognisedAndLeavesAsValidUtf8) {
    const std::pair<std::string, Json::Value> rows[] = {
        {"plain\ttext\r\n\f\x1b[0m", "plain\ttext\r\n\f\x1b[0m"},
        {"h\0i\0"s, Json::Value()},
        {"%PDF-1.4\nplain", Json::Value()},
        {std::string(20, 'x') + "\x01", Json::Value()},
        {std::string(50, 'x') + "\x01", std::string(50, 'x') + " "},
        {"\xef\xbb\xbfgr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80", "gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80"},
        {"\xc3\xbc\xe2\x82", "\xc3\xbc"},  // a character is cut off
        {"\xc3\xbc\xc3\xbc\xc0\xed", "\xc3\xbc\xc3\xbc\xef\xbf\xbd"},
        {"\x80 caf\xe9 \x81", "\xe2\x82\xac caf\xc3\xa9 \xef\xbf\xbd"},  // Windows-1252
        {"\xff\xfeh\0\xac\x20=\xd8\x00\xde"s, "h\xe2\x82\xac\xf0\x9f\x98\x80"},
        {"\xfe\xff\0h\x20\xac"s, "h\xe2\x82\xac"},
        {"\xff\xfe\x00\xd8h\0i"s, "\xef\xbf\xbdh"},  // a lone surrogate, an odd length
    };
    for (const auto& [content, text] : rows) {
        WriteFile("/volume1/file", content);
        EXPECT_EQ(Parse("/volume1/file")["KESTOMDTextContent"], text);
    }
}

TEST_F(ParseFileTest, HugeFilesAreCutAtACharacter) {
    std::string umlauts = "x";
    while (umlauts.size() < (5U << 20)) {
        umlauts += "\xc3\xbc";
    }
    WriteFile("/volume1/large.txt", umlauts);
    std::filesystem::resize_file("/volume1/large.txt", 1ULL << 40);  // sparse
    EXPECT_TRUE(Parse("/volume1/large.txt")["KESTOMDTextContent"].asString() ==
                umlauts.substr(0, kesto::kMaxTextSize - 1));
    const std::string accents(kesto::kMaxTextSize, '\xe9');  // doubles in size
    EXPECT_EQ(kesto::DecodeText(accents).size(), kesto::kMaxTextSize);
    WriteFile("/volume1/nul.txt", std::string(70000, 'x') + "\0y"s);
    EXPECT_EQ(Parse("/volume1/nul.txt")["KESTOMDTextContent"].asString().substr(69999), "x y");
}

}  // namespace
