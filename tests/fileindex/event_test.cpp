#include "fileindex/event.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

TEST(EventTest, ReadsALine) {
    const Event event(R"({"event":256,"is_dir":true,"path":"/n","path_old":"/o","data":[1]})");
    EXPECT_EQ(event.event, EVENT_RENAME);
    EXPECT_TRUE(event.is_dir);
    EXPECT_EQ(event.path, "/n");
    EXPECT_EQ(event.path_old, "/o");
    EXPECT_EQ(toString(event.data), "[1]");

    const Event bare(R"({"event":4294967295,"path":"/a","path_old":{},"is_dir":"no"})");
    EXPECT_EQ(bare.event, 0xffffffffU);
    EXPECT_FALSE(bare.is_dir);
    EXPECT_TRUE(bare.path_old.empty() && bare.data.isNull());
}

TEST(EventTest, MalformedLineIsLogged) {
    fake::ResetLibc();
    errno = ENOENT;
    EXPECT_EQ(ErrorOf([] { Event event("{oops\r"); }),
              std::make_pair(906, std::string("Malformed event_raw: {oops\r")));
    EXPECT_EQ(errno, 0);
    const auto lines = fake::LogLinesWith(
        "Failed [!data.fromString(event_raw)], reason: Malformed event_raw: {oops\r [err: No such");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_TRUE(lines[0].starts_with("optree:50 (")) << lines[0];
}

TEST(EventTest, WrongMembersFailInTheAccessor) {
    const struct {
        const char* line;
        const char* reason;
    } rows[] = {
        {"7", "Not an object, data="},
        {R"({"path":"/a"})", "Missing property: event, data="},
        {R"({"event":64})", "Missing property: path, data="},
        {R"({"event":-1,"path":"/a"})", "Not a string, data="},
        {R"({"event":"64","path":"/a"})", "Not a string, data="},
        {R"({"event":4294967296,"path":"/a"})", "Not a string, data="},
        {R"({"event":64,"path":[]})", "Not a string, data="},
    };
    for (const auto& row : rows) {
        const auto [code, reason] = ErrorOf([&] { Event event(row.line); });
        EXPECT_EQ(code, 120) << row.line;
        EXPECT_TRUE(reason.starts_with(row.reason)) << reason;
    }
}

TEST(EventTest, NoCutLinePassesForALine) {
    const std::string line =
        Line(EVENT_UPDATE_CFG, "/n", "/o", true, R"({"audio":true,"list":[1,{"a":null}]})");
    for (std::size_t length = 0; length < line.size(); ++length) {
        EXPECT_EQ(ErrorOf([&] { Event event(line.substr(0, length)); }).first, 906) << length;
    }
}

/// What the JSON library alone makes of a line.
std::string Reference(const std::string& line) {
    Json::Value json;
    if (!fromString(json, line)) {
        return "906";
    }
    try {
        unsigned int bits = 0;
        bool is_dir = false;
        std::string path;
        std::string path_old;
        Json::Value data;
        GetJsonValue(bits, json, "event", true);
        GetJsonValue(is_dir, json, "is_dir", false);
        GetJsonValue(path, json, "path", true);
        GetJsonValue(path_old, json, "path_old", false);
        GetJsonValue(data, json, "data", false);
        return std::to_string(bits) + (is_dir ? "d" : "f") + path + "\n" + path_old + "\n" +
               toString(data);
    } catch (const Error& error) {
        return error.reason;
    }
}

std::string Read(const std::string& line) {
    try {
        const Event event(line);
        return std::to_string(event.event) + (event.is_dir ? "d" : "f") + event.path + "\n" +
               event.path_old + "\n" + toString(event.data);
    } catch (const Error& error) {
        return error.code == 906 ? "906" : error.reason;
    }
}

TEST(EventTest, AgreesWithTheJsonLibraryOnEveryLine) {
    fake::ResetLibc();
    const std::string nul(1, '\0');
    std::vector<std::string> lines = {
        R"({"event":64,"path":"/a","path":"/b"})",
        R"({"event":64,"event":"x","path":"/a"})",
        R"({"event":64,"path":"/a","path_old":null,"is_dir":1})",
        R"({"event":64,"path":"\ud83d\ude00\u0000\/"})",
        R"({"event":64,"path":"/a",})",
        R"({"event":064,"path":"/a"})",
        R"( {"event":-0,"path":"/a"} // note)",
        R"({"event":64.0,"path":5})",
        R"({"event":{"event":64,"path":"/a"},"path":"/b"})",
        R"([{"event":64,"path":"/a"}])",
        "{\"event\":64,\"path\":\"/a\"}" + nul,
        "{\"event\":64,\"path\":\"/a" + nul + "b\"}",
        "{\"event\":64,\"path\":\"/\x01\xff\"}\r",
    };
    const std::vector<std::string> seeds = {
        Line(EVENT_RENAME, "/new/name", "/old/name", true), Line(EVENT_MODIFY, "/v/\xc3\xa4"),
        Line(EVENT_UPDATE_CFG, "/d", "", false, R"({"audio":true})")};
    const std::string bytes = std::string("\"{}[],:\\/019e.-tfnu \t\r") + nul + "\xff\x01";
    std::mt19937 random(Seed());
    for (unsigned int run = 0; run < kRandomRuns; ++run) {
        std::string line = seeds[run % seeds.size()];
        for (std::size_t changes = 1 + random() % 3; changes > 0; --changes) {
            const std::size_t place = random() % line.size();
            line.replace(place, random() % 2, random() % 2, bytes[random() % bytes.size()]);
        }
        lines.push_back(line);
    }
    for (const std::string& line : lines) {
        ASSERT_EQ(Read(line), Reference(line)) << line;
    }
}

}  // namespace
}  // namespace quivra::fileindex
