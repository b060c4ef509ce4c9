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
    EXPECT_STREQ(Error(506, "why").what(), "Quivra error, code=506, reason=[why]");
    EXPECT_STREQ(Error(-7).what(), "Quivra error, code=-7");
}

}  // namespace
}  // namespace quivra
