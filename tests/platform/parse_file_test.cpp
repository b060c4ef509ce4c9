#include <fcntl.h>
#include <kesto/content_extract.h>

#include <sys/resource.h>
#include <sys/syscall.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <thread>

#include "platform/standalone/text_content.h"
#include "tests/platform/platform_test.h"

namespace {

using namespace platform_test;
using KESTO::CONTENT_EXTRACT::ParseFile;
using std::string_literals::operator""s;
namespace fs = std::filesystem;

/// What happens in the place of the next call of that kind.
std::function<void()> before_statx;
std::function<int()> instead_of_read;  // returns an errno; 0: read as usual

class ParseFileTest : public PlatformTest {
  protected:
    ~ParseFileTest() override {
        before_statx = nullptr;
        instead_of_read = nullptr;
    }
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
    struct stat status {};
    stat(path.c_str(), &status);
    EXPECT_EQ(data["@inode"], Json::UInt64{status.st_ino});
    EXPECT_EQ(data["@modified_ns"].asInt64(), 1400000000999999999);
    EXPECT_EQ(data["@changed_ns"].asInt64(),
              status.st_ctim.tv_sec * 1'000'000'000 + status.st_ctim.tv_nsec);
}

TEST_F(ParseFileTest, OnlyRegularFilesHaveContent) {
    WriteFile("/volume1/text", "secret");
    std::filesystem::create_symlink("/volume1/text", "/volume1/link");
    mkfifo("/volume1/fifo", 0666);
    for (const char* path : {"/volume1/link", "/volume1/fifo", "/volume1", "/dev/zero"}) {
        const Json::Value data = Parse(path);
        EXPECT_FALSE(data.isMember("KESTOMDTextContent") || data.isMember("@content_error"))
            << path;
    }
    EXPECT_EQ(Parse("/volume1/link")["KESTOMDFSSize"].asInt(), 13);  // the link's own
    Json::Value data;
    EXPECT_TRUE(ParseFile("/volume1", "no object", data));
    EXPECT_EQ(data["KESTOMDIsDir"], true);
    EXPECT_FALSE(ParseFile("/volume1/gone", Json::Value(), data));
    EXPECT_FALSE(ParseFile("/volume1\0/x"s, Json::Value(), data));
    EXPECT_FALSE(ParseFile("/volume1/../volume1/text", Json::Value(), data));
}

/// A directory of the share and one that is private, with a file of one name in each, and a link
/// to the private one in the share.
void MakeSwapPlace() {
    WriteFile("/volume1/dir/file", "public");
    WriteFile("/volume2/private/file", "secret");
    fs::create_directory_symlink("/volume2/private", "/volume1/link");
}
void Swap() {
    renameat2(AT_FDCWD, "/volume1/dir", AT_FDCWD, "/volume1/link", RENAME_EXCHANGE);
}

TEST_F(ParseFileTest, NothingOfALinksTargetIsEverSeen) {
    MakeSwapPlace();
    Json::Value data;
    EXPECT_FALSE(ParseFile("/volume1/link/file", Json::Value(), data));
    EXPECT_EQ(errno, ELOOP);
    // Between the walk and the extraction, exactly.
    before_statx = Swap;
    EXPECT_EQ(Parse("/volume1/dir/file")["KESTOMDTextContent"], "public");
    Swap();
    // And at any moment.
    std::atomic<bool> is_over = false;
    std::thread attacker([&] {
        while (!is_over) {
            Swap();
        }
    });
    Json::Value cfg;
    cfg["need_meta"] = true;
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(200);
    int seen = 0;
    for (int i = 0; i < 20000 && std::chrono::steady_clock::now() < end; ++i) {
        data = Json::Value();
        if (ParseFile("/volume1/dir/file", cfg, data)) {
            ++seen;
            EXPECT_EQ(data["KESTOMDTextContent"], "public");
        }
    }
    is_over = true;
    attacker.join();
    EXPECT_GT(seen, 0);
    fs::remove_all("/volume2");
}

TEST_F(ParseFileTest, ContentThatCannotBeReadNowIsSaidToBeMissing) {
    const char* path = "/volume1/file";
    WriteFile(path, "text");
    const auto error_of = [&] {
        const Json::Value data = Parse(path);
        EXPECT_EQ(data["KESTOMDFSName"], "file");
        EXPECT_FALSE(data.isMember("KESTOMDTextContent"));
        return data["@content_error"].asString() + (data["@content_retry"] == true ? " +" : " -");
    };
    const int holder = open(path, O_RDWR | O_CLOEXEC);
    std::signal(SIGIO, SIG_IGN);
    ASSERT_EQ(fcntl(holder, F_SETLEASE, F_WRLCK), 0);
    EXPECT_EQ(error_of(), "the file could not be opened: another program holds a lease on it +");
    close(holder);
    std::signal(SIGIO, SIG_DFL);
    rlimit old{};
    getrlimit(RLIMIT_NOFILE, &old);
    const int next = dup(0);
    close(next);
    const rlimit one_left{static_cast<rlim_t>(next) + 1, old.rlim_max};
    setrlimit(RLIMIT_NOFILE, &one_left);
    const std::string without_descriptor = error_of();
    setrlimit(RLIMIT_NOFILE, &old);
    EXPECT_EQ(without_descriptor, "the file could not be opened: Too many open files +");
    instead_of_read = [] { return EIO; };
    EXPECT_EQ(error_of(), "the file could not be read: Input/output error +");
    instead_of_read = [] { return EISDIR; };
    EXPECT_EQ(error_of(), "the file could not be read: Is a directory -");
    int left = 1;
    const std::function<int()> change = [&] {
        WriteFile(path, "new!");  // of the same size
        const timespec times[2] = {{}, {1400000000 + left, 0}};
        utimensat(AT_FDCWD, path, times, 0);
        instead_of_read = --left > 0 ? change : nullptr;
        return 0;
    };
    instead_of_read = change;
    const Json::Value data = Parse(path);  // read once more
    EXPECT_EQ(data["KESTOMDTextContent"], "new!");
    EXPECT_EQ(data["KESTOMDFSContentChangeDate"].asInt(), 1400000001);
    left = 100;
    instead_of_read = change;
    EXPECT_EQ(error_of(), "the file changed while it was read +");
}

TEST_F(ParseFileTest, TextIsRecognisedAndLeavesAsValidUtf8) {
    const std::pair<std::string, Json::Value> rows[] = {
        {"plain\ttext\r\n\f\x1b[0m", "plain\ttext\r\n\f\x1b[0m"},
        {"h\0i\0"s, Json::Value()},
        {"%PDF-1.4\nplain", Json::Value()},
        {std::string(20, 'x') + "\x01", Json::Value()},
        {std::string(50, 'x') + "\x01", std::string(50, 'x') + " "},
        {"\xef\xbb\xbfgr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80", "gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80"},
        {"\xf4\x8f\xbf\xbf", "\xf4\x8f\xbf\xbf"},  // the last character that there is
        {"\u00fc\u00fc\u00fc\xed\xa0\x80", "\u00fc\u00fc\u00fc\ufffd\ufffd\ufffd"},  // a surrogate
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

extern "C" {

int statx(int fd, const char* __restrict path, int flags, unsigned int mask,
          struct statx* __restrict status) noexcept {
    if (const auto action = std::exchange(before_statx, nullptr)) {
        action();
    }
    return static_cast<int>(syscall(SYS_statx, fd, path, flags, mask, status));
}

ssize_t read(int fd, void* data, std::size_t size) {
    if (const auto action = std::exchange(instead_of_read, nullptr)) {
        errno = action();
        if (errno != 0) {
            return -1;
        }
    }
    return syscall(SYS_read, fd, data, size);
}

}  // extern "C"
