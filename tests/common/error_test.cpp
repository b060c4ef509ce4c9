#include "common/error.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "common/log.h"
#include "tests/fake/fake_libc.h"

namespace quivra {
namespace {

TEST(LogTest, FailureLineShowsErrnoOnceAndNoTextIsAFormat) {
    fake::ResetLibc();
    errno = ENOENT;
    EXPECT_THROW(Fail({"unit", 12}, "a < b", Error(502, "%n%m")), Error);
    EXPECT_EQ(errno, 0);
    LogFailure({"unit", 13}, "%s", "why");

    const std::string ids = "(" + std::to_string(getpid()) + ", " + std::to_string(geteuid()) + ")";
    EXPECT_EQ(
        fake::LogLines(),
        (std::vector<std::string>{
            "unit:12 " + ids + " Failed [a < b], reason: %n%m [err: No such file or directory]",
            "unit:13 " + ids + " Failed [%s], reason: why"}));
    fake::ResetLibc();
    LogError({"unit", 14}, "%s", "a\nunit:15 (1, 0) forged\r\x1b[2J\xff\u00e9\u202e\\n");
    EXPECT_EQ(fake::LogLines().at(0),
              "unit:14 " + ids + " a\\nunit:15 (1, 0) forged\\r\\x1b[2J\\xff\u00e9\\u202e\\n");
    EXPECT_STREQ(Error(506, "why").what(), "Quivra error, code=506, reason=[why]");
    EXPECT_STREQ(Error(-7).what(), "Quivra error, code=-7");
}

TEST(LogTest, ACompiledMarkIsTheLineItself) {
    constexpr LogUnit kUnit{"known", 3000};
    fake::ResetLibc();
    LogError(LogSite::Here(), "here");
    const int line = __LINE__ - 1;
    EXPECT_THROW(QUIVRA_FAIL_IF(kUnit, 1 + 1 == 2, Error(120, "why")), Error);
    QUIVRA_FAIL_IF(kUnit, false, Error(120, "not this"));
    EXPECT_EQ(fake::LogLinesWith("error_test.cpp:" + std::to_string(line) + " ").size(), 1U);
    EXPECT_EQ(fake::LogLinesWith("known:" + std::to_string(3000 + line + 2)).size(), 1U);
    EXPECT_EQ(fake::LogLinesWith("Failed [1 + 1 == 2], reason: why").size(), 1U);
    EXPECT_EQ(fake::LogLines().size(), 2U);
}

}  // namespace
}  // namespace quivra
