#include <gtest/gtest.h>

#include "platform/analytics.h"

namespace halvox::platform {
namespace {

TEST(AnalyticsPayloadTest, AddedEntryComesAfterTheOthers) {
  const Dictionary message{{"a", 1}, {"b", 2}};
  const AnalyticsPayload payload(message, {Key("c"), Value(3)});

  EXPECT_TRUE(payload.entries().isIdenticalTo(message));
  EXPECT_EQ(describe(payload.dictionary()), describe(Dictionary{{"a", 1}, {"b", 2}, {"c", 3}}));
  EXPECT_EQ(message.size(), 2U);
}

TEST(AnalyticsPayloadTest, FindsTheAddedEntryAndTheOthers) {
  const AnalyticsPayload payload(Dictionary{{"a", 1}}, {Key("c"), Value(3)});

  ASSERT_NE(payload.find(Key("a")), nullptr);
  EXPECT_EQ(*payload.find(Key("a")), Value(1));
  ASSERT_NE(payload.find(Key("c")), nullptr);
  EXPECT_EQ(*payload.find(Key("c")), Value(3));
  EXPECT_EQ(payload.find(Key("d")), nullptr);
}

TEST(AnalyticsPayloadTest, NeedsNoAddedEntry) {
  const AnalyticsPayload payload = Dictionary{{"a", 1}};

  EXPECT_EQ(payload.added(), nullptr);
  EXPECT_EQ(payload.dictionary(), (Dictionary{{"a", 1}}));
  EXPECT_TRUE(AnalyticsPayload().dictionary().empty());
}

}  // namespace
}  // namespace halvox::platform
