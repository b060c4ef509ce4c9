#include "programs/fileindexctl/text.h"

#include <gtest/gtest.h>

namespace quivra::ctl {
namespace {

TEST(ShownTest, NothingControlsTheTerminalOrDeceivesItsReader) {
    struct Row {
        std::string bytes;
        std::string text;
    };
    const Row rows[] = {
        {"Größe 日本 😀", "Größe 日本 😀"},
        {"a\nb\tc\rd", "a\\nb\\tc\\rd"},
        {"\x1b[2Jgone", "\\x1b[2Jgone"},
        {std::string("nul\0byte", 8), "nul\\x00byte"},
        {"\xc2\x9b"
         "31m",
         "\\u009b31m"},                               // the one-byte form of ESC [
        {"a\xe2\x80\xaegpj.exe", "a\\u202egpj.exe"},  // right-to-left override
        {"\xc0\xaf", "\\xc0\\xaf"},                   // overlong
        {"\xed\xa0\x80", "\\xed\\xa0\\x80"},          // surrogate
        {"\xf0\x9f\x98", "\\xf0\\x9f\\x98"},          // cut off
    };
    for (const Row& row : rows) {
        EXPECT_EQ(Shown(row.bytes), row.text);
    }
}

}  // namespace
}  // namespace quivra::ctl
