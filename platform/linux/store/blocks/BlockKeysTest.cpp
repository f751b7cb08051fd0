#include "platform/linux/store/blocks/BlockKeys.h"

#include <string>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(BlockKeysTest, HasTheKeysThatWereAdded) {
  BlockKeys keys;
  for (std::int64_t session = 0; session < 300; ++session) keys.add(sessionKey(session));
  const std::string bytes(keys.bytes());

  for (std::int64_t session = 0; session < 300; ++session) {
    EXPECT_TRUE(mayHave(bytes, sessionKey(session))) << session;
  }
}

TEST(BlockKeysTest, HasFewOthers) {
  BlockKeys keys;
  for (std::int64_t session = 0; session < 300; ++session) keys.add(sessionKey(session));
  const std::string bytes(keys.bytes());

  int found = 0;
  for (std::int64_t session = 300; session < 10'300; ++session) {
    if (mayHave(bytes, sessionKey(session))) ++found;
  }
  // 46 are expected.
  EXPECT_LT(found, 150);
}

TEST(BlockKeysTest, StoresAKeyOnce) {
  BlockKeys keys;
  for (int round = 0; round < 100; ++round) {
    keys.add(blockKey(BlockKeyKind::kName, "a"));
    keys.add(blockKey(BlockKeyKind::kName, "b"));
  }
  EXPECT_EQ(keys.bytes().size(), 4U);
}

TEST(BlockKeysTest, TheSameTextOfAnotherKindIsAnotherKey) {
  BlockKeys keys;
  keys.add(blockKey(BlockKeyKind::kName, "a"));
  EXPECT_TRUE(mayHave(keys.bytes(), blockKey(BlockKeyKind::kName, "a")));
  EXPECT_FALSE(mayHave(keys.bytes(), blockKey(BlockKeyKind::kApplication, "a")));
}

TEST(BlockKeysTest, DamagedOrMissingKeysHideNothing) {
  EXPECT_TRUE(mayHave("", sessionKey(1)));
  EXPECT_TRUE(mayHave("abc", sessionKey(1)));
}

// Databases hold these keys. Another program, or this one after a change, must compute the same
// ones.
TEST(BlockKeysTest, KeysDoNotChange) {
  EXPECT_EQ(sessionKey(-7), 55835U);
  EXPECT_EQ(blockKey(BlockKeyKind::kApplication, "com.example.player"), 63955U);
  EXPECT_EQ(blockKey(BlockKeyKind::kName, "com.tarno.test"), 57164U);
}

}  // namespace
}  // namespace halvox::platform::linux_
