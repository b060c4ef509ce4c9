#include "programs/kestoelasticd/terms.h"

#include <gtest/gtest.h>

#include <algorithm>

#include "programs/kestoelasticd/record.h"
#include "tests/programs/kestoelasticd/client.h"

namespace elasticd {
namespace {

TEST(Terms, LongTermsAreCutAndStayDifferent) {
    const std::string base(kMaxTermSize, 'x');
    EXPECT_EQ(FitTerm(base), base);
    for (const std::string& tail : {std::string("1"), std::string("2"), std::string(99, '\0')}) {
        const std::string term = FitTerm(base + tail);
        const auto zeros = std::count(term.begin(), term.end(), '\0');
        EXPECT_LE(term.size() + static_cast<std::size_t>(zeros), kMaxTermSize);
        EXPECT_TRUE(term.starts_with(base.substr(0, kKeptOfTerm)));
    }
    EXPECT_NE(FitTerm(base + "1"), FitTerm(base + "2"));
    EXPECT_LE(FitTerm(std::string(200, '\0')).size(), kMaxTermSize);
}

TEST(Record, DamagedRecordsAndTextsEndEarly) {
    const Record record{{1, "\"a\""}, {300, std::string(500, 'x')}};
    const std::string encoded = EncodeRecord(record);
    EXPECT_EQ(DecodeRecord(encoded), record);
    for (std::size_t size = 0; size < encoded.size(); ++size) {
        EXPECT_LT(DecodeRecord(encoded.substr(0, size)).size(), 2U);
    }
    const std::string packed = PackText("some text");
    EXPECT_EQ(UnpackText(packed), "some text");
    for (std::size_t size = 0; size < packed.size(); ++size) {
        EXPECT_EQ(UnpackText(packed.substr(0, size)), "") << size;
    }
}

}  // namespace
}  // namespace elasticd
