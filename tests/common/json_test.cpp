#include "common/json.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>

namespace quivra {
namespace {

Json::Value Parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(value, text)) << text;
    return value;
}

std::string ReasonOf(const std::function<void()>& call) {
    try {
        call();
    } catch (const Error& error) {
        EXPECT_EQ(error.code, 120);
        return error.reason;
    }
    return "no error";
}

TEST(JsonTest, GetterSaysWhatIsWrong) {
    int number = 5;
    const Json::Value object = Parse(R"({"text": "x", "big": 1e300, "huge": 99999999999})");
    EXPECT_EQ(ReasonOf([&] { GetJsonValue(number, Parse("[1]"), "a", true); }),
              "Not an object, data=[1]");
    EXPECT_EQ(ReasonOf([&] { GetJsonValue(number, object, "a", true); }).substr(0, 26),
              "Missing property: a, data=");
    for (const char* key : {"text", "big", "huge"}) {
        EXPECT_EQ(ReasonOf([&] { GetJsonValue(number, object, key, true); }).substr(0, 18),
                  "Not a string, data")
            << key;
        EXPECT_NO_THROW(GetJsonValue(number, object, key, false));
    }
    EXPECT_NO_THROW(GetJsonValue(number, Parse("null"), "a", false));
    EXPECT_EQ(number, 5);
}

TEST(JsonTest, GetterConvertsAsTheTypeAllows) {
    const Json::Value object = Parse(
        R"({"real": 1.5, "one": 1.0, "yes": true, "max": 9223372036854775807,
            "over": 18446744073709551615, "negative": -1})");
    long long wide = 0;
    for (const char* key : {"real", "yes", "over"}) {
        EXPECT_THROW(GetJsonValue(wide, object, key, true), Error) << key;
    }
    GetJsonValue(wide, object, "max", true);
    EXPECT_EQ(wide, 9223372036854775807LL);
    int number = 0;
    GetJsonValue(number, object, "one", true);
    EXPECT_EQ(number, 1);
    unsigned int positive = 0;
    EXPECT_THROW(GetJsonValue(positive, object, "negative", true), Error);
    std::string text;
    GetJsonValue(text, object, "negative", true);
    EXPECT_EQ(text, "-1");
}

TEST(JsonTest, GetterMayReadADocumentIntoItself) {
    Json::Value value = Parse(R"({"a": {"b": 1}})");
    GetJsonValue(value, value, "a", true);
    EXPECT_EQ(toString(value), R"({"b":1})");
}

TEST(JsonTest, MergesChanges) {
    const struct {
        const char* target;
        const char* changes;
        const char* merged;
    } rows[] = {
        {R"({"a":1,"b":2})", R"({"a":null})", R"({"b":2})"},
        {R"({"a":{"c":2}})", R"({"a":{"b":1}})", R"({"a":{"b":1,"c":2}})"},
        {R"({"a":[1,2]})", R"({"a":[1]})", R"({"a":[1]})"},
        {R"({"a":"text"})", R"({"a":{"b":1,"c":null}})", R"({"a":{"b":1}})"},
        {R"([1])", R"({"a":1})", R"({"a":1})"},
        {R"({"a":1})", R"([1])", R"({"a":1})"},
    };
    for (const auto& row : rows) {
        Json::Value target = Parse(row.target);
        JsonApplyChanges(target, Parse(row.changes));
        EXPECT_EQ(toString(target), row.merged);
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

class JsonFileTest : public testing::Test {
  protected:
    void SetUp() override { ASSERT_NE(mkdtemp(directory_.data()), nullptr); }
    void TearDown() override { std::filesystem::remove_all(directory_); }

    std::string directory_ = "/tmp/json_test.XXXXXX";
};

TEST_F(JsonFileTest, SavesAndLoads) {
    const std::string path = directory_ + "/file";
    ASSERT_TRUE(toFile(Parse("[1]"), path));
    chmod(path.c_str(), 0640);
    ASSERT_TRUE(toFile(Parse("[2]"), path));
    Json::Value value;
    ASSERT_TRUE(fromFile(value, path));
    EXPECT_EQ(toString(value), "[2]");
    EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms(0640));
    EXPECT_FALSE(fromFile(value, directory_ + "/missing"));
    EXPECT_FALSE(fromFile(value, directory_));
}

TEST_F(JsonFileTest, FailedSaveLeavesTheOldFileAndNothingElse) {
    const std::string path = directory_ + "/file";
    ASSERT_TRUE(toFile(Parse("[1]"), path));

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
    EXPECT_EQ(toString(value), "[1]");
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(directory_), {}), 1);
    EXPECT_FALSE(toFile(value, directory_ + "/missing/file"));
}

}  // namespace
}  // namespace quivra
