#include "tools/Erase.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using ::testing::HasSubstr;

TEST(EraseTest, AnApplicationHasOneName) {
  EXPECT_EQ(*parseErasedApplication("org.example.player"), "org.example.player");
  EXPECT_THAT(parseErasedApplication("").error().message, HasSubstr("empty"));
  for (const char* pattern : {"org.*", "pl?yer", "[a]"}) {
    EXPECT_THAT(parseErasedApplication(pattern).error().message, HasSubstr("is a pattern"));
  }
}

TEST(EraseTest, ASessionIsANumberOtherThan0) {
  EXPECT_EQ(*parseErasedSession("7"), 7);
  EXPECT_EQ(*parseErasedSession("-1"), -1);
  for (const char* text : {"", "0", "7x", "seven", "99999999999999999999"}) {
    EXPECT_FALSE(parseErasedSession(text)) << text;
  }
}

}  // namespace
}  // namespace halvox::tools
