#include "platform/linux/settings/SettingNames.h"

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using namespace std::string_view_literals;

TEST(SettingNamesTest, OrdinaryNamesAreUsable) {
  for (const auto name : {"com.tarno.halvox"sv, "mobile"sv, "a"sv, "...a"sv, "ä b"sv}) {
    EXPECT_TRUE(isUsableName(name)) << name;
  }
  EXPECT_TRUE(isUsableName(std::string(200, 'a')));
}

TEST(SettingNamesTest, NamesThatLeaveTheDirectoryAreRefused) {
  for (const auto name : {""sv, "."sv, ".."sv, "../x"sv, "a/b"sv, "/etc/passwd"sv, "a/"sv}) {
    EXPECT_FALSE(isUsableName(name)) << name;
  }
}

TEST(SettingNamesTest, NamesThatNoFileCanHaveAreRefused) {
  EXPECT_FALSE(isUsableName("a\0b"sv));
  EXPECT_FALSE(isUsableName(std::string(201, 'a')));
}

TEST(SettingNamesTest, ShownNamesStayShortAndOnOneLine) {
  EXPECT_EQ(shownName("a\nb\x1b"), "\"a\\nb\\x1b\"");
  EXPECT_LT(shownName(std::string(100'000, 'a')).size(), 100U);
}

}  // namespace
}  // namespace halvox::platform::linux_
