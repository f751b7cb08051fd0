#include "tools/export/ApplicationFilter.h"

#include <string>

#include <gtest/gtest.h>

#include "tools/export/testing/RecordItems.h"

namespace halvox::tools {
namespace {

std::string stamped(double stamp) {
  return "{\"hvreporting_timestamp\":" + std::to_string(stamp) + "}";
}

TEST(ApplicationFilterTest, WithoutPatternsEverythingIsAccepted) {
  ApplicationFilter filter({});
  EXPECT_TRUE(filter.accepts(eventItem("{}")));
  EXPECT_TRUE(filter.accepts(snapshotItem("{}")));
}

TEST(ApplicationFilterTest, EventsHaveTheirApplicationBesideTheirPayloadOrInIt) {
  ApplicationFilter filter({"org.*", "mine"});
  EXPECT_TRUE(filter.accepts(eventItem("{}", "org.player")));
  EXPECT_TRUE(filter.accepts(eventItem("{\"HostApplicationDisplayID\":\"mine\"}")));
  EXPECT_FALSE(filter.accepts(eventItem("{\"HostApplicationDisplayID\":\"yours\"}")));
  EXPECT_FALSE(filter.accepts(eventItem("{}")));
}

TEST(ApplicationFilterTest, ALinkMessageHasTheApplicationOfItsEvent) {
  ApplicationFilter filter({"org.*"});
  EXPECT_TRUE(filter.accepts(eventItem(stamped(1.5), "org.player")));
  EXPECT_FALSE(filter.accepts(eventItem(stamped(2.5), "com.player")));
  EXPECT_FALSE(filter.accepts(linkItem(stamped(2.5), 8)));
  EXPECT_TRUE(filter.accepts(linkItem(stamped(1.5), 7)));
}

TEST(ApplicationFilterTest, ALinkMessageWithoutAnEventHasTheApplicationOfItsSession) {
  ApplicationFilter filter({"org.*"});
  EXPECT_FALSE(filter.accepts(linkItem("{}", 7)));
  EXPECT_TRUE(filter.accepts(eventItem(stamped(1.5), "org.player")));
  EXPECT_TRUE(filter.accepts(linkItem(stamped(1.5), 7)));
  EXPECT_TRUE(filter.accepts(linkItem(stamped(3.5), 7)));
  EXPECT_TRUE(filter.accepts(linkItem("{}", 7)));
  EXPECT_FALSE(filter.accepts(linkItem("{}", 8)));
}

TEST(ApplicationFilterTest, WhatItRemembersIsBounded) {
  ApplicationFilter filter({"org.*"});
  EXPECT_TRUE(filter.accepts(eventItem(stamped(0.5), "org.player")));
  for (std::size_t number = 0; number < ApplicationFilter::kMostStamps; ++number) {
    const std::string payload = stamped(static_cast<double>(number) + 1);
    EXPECT_TRUE(filter.accepts(eventItem(payload, "org.player")));
  }
  EXPECT_FALSE(filter.accepts(linkItem(stamped(0.5), 7)));
  EXPECT_TRUE(filter.accepts(linkItem(stamped(1), 7)));
}

TEST(ApplicationFilterTest, OtherRecordsNameTheirApplicationOrHaveNone) {
  ApplicationFilter filter({"org.*"});
  EXPECT_TRUE(filter.accepts(powerItem("{\"ApplicationName\":\"org.player\"}")));
  EXPECT_FALSE(filter.accepts(powerItem("{\"ApplicationName\":\"com.player\"}")));
  // The fifth field is the client.
  EXPECT_TRUE(filter.accepts(metricItem("\x2A\x05org.a")));
  EXPECT_FALSE(
      filter.accepts(metricItem("\x2A\x05"
                                "com.a")));
  EXPECT_FALSE(filter.accepts(metricItem("\xFF")));
  EXPECT_FALSE(filter.accepts(snapshotItem("{}")));
  EXPECT_FALSE(filter.accepts(lossItem("dropped: disk full")));
}

}  // namespace
}  // namespace halvox::tools
