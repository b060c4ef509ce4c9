#include "programs/fileindexctl/text.h"

#include <gtest/gtest.h>

namespace quivra::ctl {
namespace {

TEST(EscapeControlTest, NothingControlsTheTerminalOrDeceivesItsReader) {
    struct Row {
        std::string bytes;
        std::string text;
    };
    const Row rows[] = {
        {"", ""},
        {"plain name.txt", "plain name.txt"},
        {"Größe 日本 😀", "Größe 日本 😀"},
        {"a\nb\tc\rd", "a\\nb\\tc\\rd"},
        {"\x1b[2Jgone", "\\x1b[2Jgone"},
        {std::string("nul\0byte", 8), "nul\\x00byte"},
        {"\x7f", "\\x7f"},
        {"latin\xe9", "latin\\xe9"},
        {"\xc2\x9b"
         "31m",
         "\\u009b31m"},                                // the one-byte form of ESC [
        {"a\xe2\x80\xaegpj.exe", "a\\u202egpj.exe"},   // right-to-left override
        {"\xe2\x80\xa8", "\\u2028"},                   // line separator
        {"\xc0\xaf", "\\xc0\\xaf"},                    // overlong
        {"\xed\xa0\x80", "\\xed\\xa0\\x80"},           // surrogate
        {"\xf4\x90\x80\x80", "\\xf4\\x90\\x80\\x80"},  // beyond Unicode
        {"\xf0\x9f\x98", "\\xf0\\x9f\\x98"},           // cut off
        {"\xe6\x97X", "\\xe6\\x97X"},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(EscapeControl(row.bytes), row.text);
    }
}

TEST(ProgressBarTest, StaysWithinItsWidth) {
    EXPECT_EQ(ProgressBar(0, 12), "[----------]");
    EXPECT_EQ(ProgressBar(0.5, 12), "[#####-----]");
    EXPECT_EQ(ProgressBar(1, 12), "[##########]");
    EXPECT_EQ(ProgressBar(7, 12), ProgressBar(1, 12));
    EXPECT_EQ(ProgressBar(0.0 / 1.0 - 1, 12), ProgressBar(0, 12));
}

}  // namespace
}  // namespace quivra::ctl
