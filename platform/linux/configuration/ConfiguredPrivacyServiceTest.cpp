#include "platform/linux/configuration/ConfiguredPrivacyService.h"

#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

ConfiguredPrivacyService dropping(std::vector<std::string> patterns) {
  Configuration::Privacy rules;
  rules.dropKeys = std::move(patterns);
  return ConfiguredPrivacyService(std::move(rules));
}

TEST(ConfiguredPrivacyServiceTest, WithoutPatternsThereAreNoRules) {
  EXPECT_FALSE(dropping({}).hasKeyRules());
  EXPECT_FALSE(dropping({}).dropsKey("user"));
}

TEST(ConfiguredPrivacyServiceTest, APatternMatchesTheWholeKey) {
  const ConfiguredPrivacyService service = dropping({"user_*", "name[0-9]"});

  EXPECT_TRUE(service.hasKeyRules());
  EXPECT_TRUE(service.dropsKey("user_name"));
  EXPECT_TRUE(service.dropsKey("name7"));
  EXPECT_FALSE(service.dropsKey("the_user_name"));
  EXPECT_FALSE(service.dropsKey("name77"));
  EXPECT_FALSE(service.dropsKey("User_name"));
}

TEST(ConfiguredPrivacyServiceTest, AKeyWithBlanksMatchesInTheFormInWhichItIsStored) {
  EXPECT_TRUE(dropping({"user_name"}).dropsKey("user name"));
  EXPECT_TRUE(dropping({"user name"}).dropsKey("user name"));
  EXPECT_FALSE(dropping({"user name"}).dropsKey("user_name"));
}

TEST(ConfiguredPrivacyServiceTest, ABackslashIsAnOrdinaryCharacter) {
  EXPECT_TRUE(dropping({"a\\*"}).dropsKey("a\\b"));
  EXPECT_FALSE(dropping({"a\\*"}).dropsKey("a*"));
}

}  // namespace
}  // namespace halvox::platform::linux_
