#include "common/json.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <clocale>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <locale>

#include "tests/fake/fake_libc.h"

namespace {
/// Directories cannot be made durable.
bool failing_sync = false;
}  // namespace

extern "C" int fsync(int fd) {
    struct stat status {};
    if (failing_sync && fstat(fd, &status) == 0 && S_ISDIR(status.st_mode)) {
        errno = EIO;
        return -1;
    }
    return static_cast<int>(syscall(SYS_fsync, fd));
}

namespace quivra {
namespace {

Json::Value Parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(value, text)) << text;
    return value;
}

TEST(JsonTest, GettersTakeWhatTheTypeAllows) {
    const Json::Value object = Parse(
        R"({"text":"x","real":1.5,"one":1.0,"yes":true,"max":9223372036854775807,
            "over":18446744073709551615,"huge":1e300,"negative":-1})");
    long long wide = 5;
    for (const char* key : {"text", "real", "yes", "over", "huge", "absent"}) {
        EXPECT_THROW(GetJsonValue(wide, object, key, true), Error) << key;
        EXPECT_NO_THROW(GetJsonValue(wide, object, key, false)) << key;
    }
    EXPECT_THROW(GetJsonValue(wide, Parse("[1]"), "a", true), Error);
    EXPECT_EQ(wide, 5);
    GetJsonValue(wide, object, "max", true);
    EXPECT_EQ(wide, 9223372036854775807LL);
    int number = 0;
    GetJsonValue(number, object, "one", true);
    EXPECT_EQ(number, 1);
    unsigned int positive = 0;
    EXPECT_THROW(GetJsonValue(positive, object, "negative", true), Error);

    Json::Value itself = Parse(R"({"a": {"b": 1}})");
    GetJsonValue(itself, itself, "a", true);
    EXPECT_EQ(toString(itself), R"({"b":1})");
    GetJsonValue<Json::Value>(itself, itself, "b", true);
    EXPECT_EQ(itself, 1);
}

/// Groups digits and has a decimal comma, as a host program's locale may.
class CommaLocale : public std::numpunct<char> {
  protected:
    char do_decimal_point() const override { return ','; }
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\3"; }
};

TEST(JsonTest, TheLocaleOfTheHostPlaysNoPart) {
    const std::string text = R"([-1234567,18446744073709551615,1234.5,1e+300])";
    const std::locale old = std::locale::global(std::locale(std::locale(), new CommaLocale));
    for (const char* name : {"C", "de_DE.UTF-8"}) {  // the second where the machine has it
        std::setlocale(LC_ALL, name);
        const Json::Value value = Parse(text);
        EXPECT_EQ(value[2].asDouble(), 1234.5);
        EXPECT_EQ(toString(value).substr(0, 37), text.substr(0, 37));
        EXPECT_EQ(Parse(toString(value)), value);
        EXPECT_STREQ(Error(123456).what(), "Quivra error, code=123456");
    }
    std::locale::global(old);
    std::setlocale(LC_ALL, "C");
}

TEST(JsonTest, MergesChanges) {
    const char* const rows[][3] = {
        {R"({"a":1,"b":2})", R"({"a":null})", R"({"b":2})"},
        {R"({"a":{"c":2}})", R"({"a":{"b":1}})", R"({"a":{"b":1,"c":2}})"},
        {R"({"a":[1,2]})", R"({"a":[1]})", R"({"a":[1]})"},
        {R"({"a":"text"})", R"({"a":{"b":1,"c":null}})", R"({"a":{"b":1}})"},
        {R"([1])", R"({"a":1})", R"({"a":1})"},
        {R"({"a":1})", R"([1])", R"({"a":1})"},
    };
    for (const auto& [text, changes, merged] : rows) {
        Json::Value target = Parse(text);
        JsonApplyChanges(target, Parse(changes));
        EXPECT_EQ(toString(target), merged);
    }
    Json::Value target = Parse(R"({"a":1,"a\u0000b":2})");
    JsonApplyChanges(target, Parse(R"({"a\u0000b":null})"));
    EXPECT_EQ(toString(target), R"({"a":1})");
}

TEST(JsonTest, HostileTextIsRefusedAndBytesSurvive) {
    Json::Value value;
    using namespace std::string_literals;
    for (const std::string& text : {""s,
                                    "{"s,
                                    "{} x"s,
                                    std::string(5000, '['),
                                    std::string(1000000, '{'),
                                    "\0"s,
                                    "{\"a\":}"s,
                                    "[]\0junk"s,
                                    "[1]\0"s,
                                    "[1,]"s,
                                    "{\"a\":1,}"s,
                                    "[1] // one"s,
                                    "/* one */ [1]"s,
                                    "007"s,
                                    "+1"s,
                                    "[1.]"s,
                                    "['a']"s,
                                    "\"a\tb\""s,
                                    "\"a\0b\""s,
                                    "nan"s}) {
        EXPECT_FALSE(fromString(value, text)) << text.substr(0, 20);
    }
    EXPECT_TRUE(fromString(value, std::string(1000, '[') + std::string(1000, ']')));
    EXPECT_FALSE(fromString(value, std::string(1001, '[') + std::string(1001, ']')));
    const std::string text = "{\"path\":\"/a\xff\xfe b\"}";
    EXPECT_EQ(toString(Parse(text)), text);
    EXPECT_EQ(Parse(R"("a\u0000b")").asString(), std::string("a\0b", 3));
}

TEST(JsonFileTest, AFailedSaveLeavesTheOldFileAndNothingElse) {
    const std::string directory = "/tmp/json_test";
    const std::string path = directory + "/file";
    std::filesystem::create_directories(directory);
    ASSERT_TRUE(toFile(Parse("[1]"), path));
    chmod(path.c_str(), 0640);
    ASSERT_TRUE(toFile(Parse("[2]"), path));
    EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms(0640));

    struct rlimit old_limit {};
    getrlimit(RLIMIT_FSIZE, &old_limit);
    const struct rlimit tiny { 8, old_limit.rlim_max };
    const auto old_handler = std::signal(SIGXFSZ, SIG_IGN);
    setrlimit(RLIMIT_FSIZE, &tiny);
    const bool saved = toFile(Parse(R"(["longer than eight bytes"])"), path);
    setrlimit(RLIMIT_FSIZE, &old_limit);
    std::signal(SIGXFSZ, old_handler);

    EXPECT_FALSE(saved);
    Json::Value value;
    ASSERT_TRUE(fromFile(value, path));
    EXPECT_EQ(toString(value), "[2]");
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(directory), {}), 1);
    EXPECT_FALSE(toFile(value, directory + "/missing/file"));
    EXPECT_FALSE(fromFile(value, directory));

    const int lowest = dup(0);
    close(lowest);
    getrlimit(RLIMIT_NOFILE, &old_limit);
    const struct rlimit one_left { static_cast<rlim_t>(lowest) + 1, old_limit.rlim_max };
    setrlimit(RLIMIT_NOFILE, &one_left);
    EXPECT_FALSE(toFile(Parse("[3]"), path));
    setrlimit(RLIMIT_NOFILE, &old_limit);
    ASSERT_TRUE(fromFile(value, path));
    EXPECT_EQ(toString(value), "[2]");

    // Replaced is replaced, even if it is not safe from a power failure; and what a killed process
    // left is used up.
    std::ofstream(path + ".new") << "junk of a longer text";
    failing_sync = true;
    EXPECT_TRUE(toFile(Parse("[4]"), path));
    failing_sync = false;
    EXPECT_EQ(fake::LogLinesWith("may be lost in a power failure").size(), 1U);
    ASSERT_TRUE(fromFile(value, path));
    EXPECT_EQ(toString(value), "[4]");
    EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms(0640));
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(directory), {}), 1);
    std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace quivra
