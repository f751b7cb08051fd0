#include "backends/PrivacyFilter.h"

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
