#include "platform/linux/base/Hexadecimal.h"

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using namespace std::string_view_literals;

TEST(HexadecimalTest, HasTwoLowerCaseDigitsForEachByte) {
  EXPECT_EQ(hexadecimal("\x00\x0a\x7f\x80\xff"sv), "000a7f80ff");
}

TEST(HexadecimalTest, NoBytesGiveNoDigits) { EXPECT_EQ(hexadecimal({}), ""); }

}  // namespace
}  // namespace halvox::platform::linux_
