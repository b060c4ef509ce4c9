#include "common/error.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "common/log.h"
#include "tests/fake/fake_libc.h"

namespace quivra {
namespace {

TEST(ErrorTest, ComposesItsMessage) {
    EXPECT_STREQ(Error(506, "Exceed max retry").what(),
                 "Quivra error, code=506, reason=[Exceed max retry]");
    EXPECT_STREQ(Error(Error::kPathLookupFailed).what(), "Quivra error, code=9999");
    EXPECT_STREQ(Error(-7, " ").what(), "Quivra error, code=-7, reason=[ ]");
}

TEST(ErrorTest, CopyCarriesEverything) {
    const Error error(1234567, "from the daemon");
    const Error copy(error);
    EXPECT_EQ(copy.code, 1234567);
    EXPECT_EQ(copy.reason, "from the daemon");
    EXPECT_STREQ(copy.what(), error.what());
}

TEST(LogTest, FailureLineShowsErrnoOnceAndClearsIt) {
    fake::ResetLibc();
    errno = ENOENT;
    EXPECT_THROW(Fail({"unit", 12}, "a < b", Error(502, "why")), Error);
    EXPECT_EQ(errno, 0);
    LogFailure({"unit", 13}, "a < b", "why");

    const auto lines = fake::LogLines();
    ASSERT_EQ(lines.size(), 2U);
    const std::string ids = "(" + std::to_string(getpid()) + ", " + std::to_string(geteuid()) + ")";
    EXPECT_EQ(lines[0],
              "unit:12 " + ids + " Failed [a < b], reason: why [err: No such file or directory]");
    EXPECT_EQ(lines[1], "unit:13 " + ids + " Failed [a < b], reason: why");
}

TEST(LogTest, PercentSignsInTextsAreNoFormats) {
    fake::ResetLibc();
    errno = 0;
    LogFailure({"unit", 1}, "%s", "%n%m");
    EXPECT_EQ(fake::LogLinesWith("Failed [%s], reason: %n%m").size(), 1U);
}

}  // namespace
}  // namespace quivra
