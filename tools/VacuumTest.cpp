#include "tools/Vacuum.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(VacuumTest, SizesHaveUnitsOfPowersOf1024) {
  EXPECT_EQ(*parseBytes("1048576"), 1U << 20U);
  EXPECT_EQ(*parseBytes("2048K"), 2U << 20U);
  EXPECT_EQ(*parseBytes("100M"), 100U << 20U);
  EXPECT_EQ(*parseBytes("3G"), std::uint64_t{3} << 30U);
}

TEST(VacuumTest, OtherSizesAreRefusedWithWhatWasExpected) {
  for (const char* text : {"", "M", "-1", "1.5M", "1T", "1MB", "20000000000G"}) {
    const auto parsed = parseBytes(text);
    ASSERT_FALSE(parsed) << text;
    EXPECT_THAT(parsed.error().message, ::testing::HasSubstr("100M"));
  }
}

TEST(VacuumTest, SizesThatWouldDeleteNearlyEverythingAreRefused) {
  for (const char* text : {"0", "100", "1023K"}) {
    const auto parsed = parseBytes(text);
    ASSERT_FALSE(parsed) << text;
    EXPECT_THAT(parsed.error().message, ::testing::HasSubstr("at least 1M"));
  }
}

}  // namespace
}  // namespace halvox::tools
