#include "backends/PrivacyFilter.h"

#include <memory>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Message;

class PrivacyFilterTest : public testing::Test {
 protected:
  platform::FakePlatform platform_;
};

TEST_F(PrivacyFilterTest, WithoutRulesTheDictionaryStaysTheSameObject) {
  const Dictionary original{{"user", "Ada"}, {"value", 1}};
  Dictionary filtered = original;

  applyPrivacy(filtered);

  EXPECT_TRUE(filtered.isIdenticalTo(original));
}

TEST_F(PrivacyFilterTest, TheFlagFollowsTheRulesOfTheServicesThatExist) {
  using platform::FakePrivacyService;
  using platform::PrivacyService;
  EXPECT_FALSE(PrivacyService::anyKeyRules());

  auto other = std::make_unique<FakePrivacyService>();
  EXPECT_FALSE(PrivacyService::anyKeyRules());
  other->drop("user");
  EXPECT_TRUE(PrivacyService::anyKeyRules());
  platform_.privacy.drop("user");
  platform_.privacy.drop("name");
  other.reset();
  EXPECT_TRUE(PrivacyService::anyKeyRules());
  EXPECT_TRUE(isDropped("user"));
  EXPECT_FALSE(isDropped("other"));
}

TEST_F(PrivacyFilterTest, RulesOfAServiceThatIsNotInstalledDropNothing) {
  platform::FakePrivacyService other;
  other.drop("user");
  Dictionary dictionary{{"user", "Ada"}};

  applyPrivacy(dictionary);

  EXPECT_TRUE(dictionary.contains("user"));
  EXPECT_FALSE(isDropped("user"));
}

TEST_F(PrivacyFilterTest, DroppedKeysAreMissingAndTheOthersKeepTheirOrder) {
  platform_.privacy.drop("user");
  Dictionary dictionary{{"b", 1}, {"user", "Ada"}, {"a", "x"}};

  applyPrivacy(dictionary);

  EXPECT_EQ(platform::describe(dictionary), platform::describe(Dictionary{{"b", 1}, {"a", "x"}}));
}

TEST_F(PrivacyFilterTest, KeysAreDroppedAtEveryDepth) {
  platform_.privacy.drop("user");
  Dictionary dictionary{
      {"outer", Dictionary{{"user", "Ada"}, {"list", Array{Dictionary{{"user", "Ada"}}, 7}}}}};

  applyPrivacy(dictionary);

  EXPECT_EQ(dictionary, (Dictionary{{"outer", Dictionary{{"list", Array{Dictionary{}, 7}}}}}));
}

TEST_F(PrivacyFilterTest, OtherHoldersOfTheDictionaryKeepTheirEntries) {
  platform_.privacy.drop("user");
  const Dictionary held{{"user", "Ada"}};
  Dictionary filtered = held;

  applyPrivacy(filtered);

  EXPECT_TRUE(filtered.empty());
  EXPECT_TRUE(held.contains("user"));
}

TEST_F(PrivacyFilterTest, AMessageThatLosesAllEntriesIsStillAMessage) {
  platform_.privacy.drop("user");
  Message message = Dictionary{{"user", "Ada"}};
  Message none;

  applyPrivacy(message);
  applyPrivacy(none);

  EXPECT_EQ(message, Message(Dictionary{}));
  EXPECT_EQ(none, std::nullopt);
}

}  // namespace
}  // namespace halvox
