#include "tools/Vacuum.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(VacuumTest, SizesHaveUnitsOfPowersOf1024) {
  EXPECT_EQ(*parseBytes("1"), 1U);
  EXPECT_EQ(*parseBytes("2K"), 2048U);
  EXPECT_EQ(*parseBytes("100M"), 100U << 20U);
  EXPECT_EQ(*parseBytes("3G"), std::uint64_t{3} << 30U);
}

TEST(VacuumTest, OtherSizesAreRefusedWithWhatWasExpected) {
  for (const char* text : {"", "M", "0", "-1", "1.5M", "1T", "1MB", "20000000000G"}) {
    const auto parsed = parseBytes(text);
    ASSERT_FALSE(parsed) << text;
    EXPECT_THAT(parsed.error().message, ::testing::HasSubstr("100M"));
  }
}

}  // namespace
}  // namespace halvox::tools
