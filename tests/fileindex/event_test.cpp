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

}  // namespace
}  // namespace quivra::fileindex
