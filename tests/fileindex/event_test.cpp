#include "fileindex/event.h"

#include <gtest/gtest.h>

#include "tests/fileindex/queue_support.h"

namespace quivra::fileindex {
namespace {

std::string Shown(const Event& event) {
    return std::to_string(event.event) + (event.is_dir ? "d" : "f") + event.path + "\n" +
           event.path_old + "\n" + toString(event.data);
}

/// What the JSON library alone makes of a line.
std::string Reference(const std::string& line) {
    Json::Value json;
    if (!fromString(json, line)) {
        return "906 Malformed event_raw: " + line;
    }
    Event event(R"({"event":0,"path":""})");
    const auto [code, reason] = ErrorOf([&] {
        GetJsonValue(event.event, json, "event", true);
        GetJsonValue(event.is_dir, json, "is_dir", false);
        GetJsonValue(event.path, json, "path", true);
        GetJsonValue(event.path_old, json, "path_old", false);
        GetJsonValue(event.data, json, "data", false);
    });
    return code == 0 ? Shown(event) : std::to_string(code) + " " + reason;
}

std::string Read(const std::string& line) {
    std::string shown;
    const auto [code, reason] = ErrorOf([&] { shown = Shown(Event(line)); });
    return code == 0 ? shown : std::to_string(code) + " " + reason;
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
    for (const std::string& line : seeds) {
        for (std::size_t length = 0; length <= line.size(); ++length) {
            lines.push_back(line.substr(0, length));
        }
    }
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
