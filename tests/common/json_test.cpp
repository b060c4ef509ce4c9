#include "common/json.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>
#include <fstream>

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
}

TEST(JsonTest, HostileTextIsRefusedAndBytesSurvive) {
    Json::Value value;
    for (const std::string& text :
         {std::string(), std::string("{"), std::string("{} x"), std::string(5000, '['),
          std::string(1000000, '{'), std::string("\0", 1), std::string("{\"a\":}")}) {
        EXPECT_FALSE(fromString(value, text)) << text.substr(0, 20);
    }
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
    std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace quivra
