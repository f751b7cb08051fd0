#include "backends/HVReportingZUBBridge.h"

#include <limits>
#include <type_traits>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backends/AudioIssueDetected.h"
#include "backends/BackEndCounters.h"
#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::IsEmpty;
using zubmetrics::AudioIssueDetected;

class HVReportingZUBBridgeTest : public testing::Test {
 protected:
  void handle(const platform::Message& message,
              AudioEventType type = AudioEventType::kIssueDetector) {
    HVReportingZUBBridge::handleEvent(message, AudioEventCategory::kPlayback, type, nullptr,
                                      IssueMetricCounters(platform_.statistics));
  }
  // Returns the newest metric as text.
  AudioIssueDetected posted() {
    const auto metrics = platform_.metrics.metrics();
    EXPECT_EQ(metrics.back().metricID, 5963779U);
    platform::ProtoReader reader(metrics.back().bytes);
    AudioIssueDetected issue;
    EXPECT_TRUE(issue.readFrom(reader));
    return issue;
  }
  std::int32_t durationOf(const Value& silence) {
    handle(Dictionary{{"any_channel_silence_seconds", silence}});
    return posted().duration();
  }
  std::string nodeOf(const Value& node) {
    handle(Dictionary{{"node", node}});
    return posted().node();
  }

  platform::FakePlatform platform_;
};

TEST_F(HVReportingZUBBridgeTest, AnIssueIsPostedWithAllItsFieldsAndNoTimestamp) {
  handle(Dictionary{{"issue_type", "glitch"},
                    {"rtaid_client", "x"},
                    {"node", "mixer"},
                    {"any_channel_silence_seconds", 12},
                    {"hvreporting_timestamp", 1000.5}});

  ASSERT_EQ(platform_.metrics.metrics().size(), 1U);
  const AudioIssueDetected issue = posted();
  EXPECT_EQ(issue.issueType(), "glitch");
  EXPECT_EQ(issue.rtaidClient(), "x");
  EXPECT_EQ(issue.node(), "mixer");
  EXPECT_EQ(issue.duration(), 12);
  EXPECT_EQ(issue.timestamp(), std::nullopt);
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingZUBBridgeTest, AnEmptyIssueIsLoggedFieldByFieldAndPosted) {
  handle(Dictionary{});

  EXPECT_THAT(
      platform_.log.texts(platform::LogLevel::kError),
      testing::ElementsAre("Failed to get issue_type for AudioIssueDetected",
                           "Failed to get rtaid_client for AudioIssueDetected",
                           "Failed to get node for AudioIssueDetected",
                           "Failed to get any_channel_silence_seconds for AudioIssueDetected"));
  EXPECT_EQ(platform_.log.lines().size(), 4U);
  EXPECT_EQ(platform_.log.lines().front().category, "hvra");
  EXPECT_THAT(platform_.log.lines().front().line,
              testing::StartsWith("     HVReportingZUBBridge:"));
  EXPECT_EQ(platform_.metrics.metrics().size(), 1U);
  EXPECT_EQ(posted(), AudioIssueDetected());
}

TEST_F(HVReportingZUBBridgeTest, OneMissingKeyIsOneLineAndTheRestIsPosted) {
  handle(Dictionary{{"issue_type", "glitch"}, {"rtaid_client", "x"}, {"node", "mixer"}});

  EXPECT_THAT(
      platform_.log.texts(),
      testing::ElementsAre("Failed to get any_channel_silence_seconds for AudioIssueDetected"));
  EXPECT_EQ(posted().issueType(), "glitch");
  EXPECT_EQ(posted().duration(), 0);
}

TEST_F(HVReportingZUBBridgeTest, MessagesOfAnyOtherTypeAreIgnored) {
  for (std::uint16_t type = 0; type < 20; ++type) {
    if (AudioEventType{type} != AudioEventType::kIssueDetector) {
      handle(Dictionary{{"issue_type", "glitch"}}, AudioEventType{type});
    }
  }
  handle(Dictionary{}, AudioEventType::kUnknown);

  EXPECT_THAT(platform_.metrics.metrics(), IsEmpty());
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingZUBBridgeTest, NoMessageIsIgnored) {
  handle(std::nullopt);

  EXPECT_THAT(platform_.metrics.metrics(), IsEmpty());
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingZUBBridgeTest, ValuesOtherThanTextsArePostedAsTheirDescriptions) {
  EXPECT_EQ(nodeOf(3), "3");
  EXPECT_EQ(nodeOf(0.5), "0.5");
  EXPECT_EQ(nodeOf("m\xC3\xA9langeur"), "m\xC3\xA9langeur");
  const Value list(platform::Array{"a", 1});
  EXPECT_EQ(nodeOf(list), describe(list));
}

TEST_F(HVReportingZUBBridgeTest, DurationsAreCutOffTo32Bits) {
  EXPECT_EQ(durationOf(12.9), 12);
  EXPECT_EQ(durationOf(-12.9), -12);
  EXPECT_EQ(durationOf(true), 1);
  EXPECT_EQ(durationOf(std::int64_t{0x1'0000'0005}), 5);
  EXPECT_EQ(durationOf(std::int64_t{0x8000'0000}), std::numeric_limits<std::int32_t>::min());
}

TEST_F(HVReportingZUBBridgeTest, DurationsInTextsAreTheIntegerThatTheyBeginWith) {
  EXPECT_EQ(durationOf("12"), 12);
  EXPECT_EQ(durationOf(" \t-12 seconds"), -12);
  EXPECT_EQ(durationOf("+7.9"), 7);
  EXPECT_EQ(durationOf("4294967301"), 5);
  EXPECT_EQ(durationOf("99999999999999999999"), -1);  // the low 32 bits of the largest integer
  EXPECT_EQ(durationOf("-99999999999999999999"), 0);  // the low 32 bits of the smallest integer
  for (const char* text : {"", "  ", "-", "+", "+-7", "- 7", "x7"}) {
    EXPECT_EQ(durationOf(text), 0) << text;
  }
}

TEST_F(HVReportingZUBBridgeTest, OnlyBlanksMayStandBeforeTheIntegerOfAText) {
  for (int code = 0x21; code < 0x7F; ++code) {
    const char letter = static_cast<char>(code);
    if (letter == '+' || letter == '-' || (letter >= '0' && letter <= '9')) continue;
    EXPECT_EQ(durationOf(std::string(1, letter) + "5"), 0) << letter;
  }
}

TEST_F(HVReportingZUBBridgeTest, ADurationThatIsNeitherNumberNorTextIsZero) {
  EXPECT_EQ(durationOf(platform::Array{12}), 0);
}

TEST_F(HVReportingZUBBridgeTest, IssuesAreCounted) {
  handle(Dictionary{});
  handle(Dictionary{{"node", 1}});
  handle(Dictionary{}, AudioEventType::kError);

  EXPECT_EQ(platform_.statistics.value("issue metrics bridge", "received"), 2U);
  EXPECT_EQ(platform_.statistics.value("issue metrics bridge", "delivered"), 2U);
}

TEST_F(HVReportingZUBBridgeTest, NoBridgeObjectCanBeMade) {
  EXPECT_FALSE(std::is_default_constructible_v<HVReportingZUBBridge>);
}

}  // namespace
}  // namespace halvox
