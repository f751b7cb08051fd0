#include "backends/AudioIssueDetected.h"
#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalEntry;
using platform::JournalKind;
using testing::ElementsAre;
using testing::IsEmpty;

// Which messages reach which back-ends, on a build that is not internal.
class HVReportingBackEndsTest : public ServiceFixture {
 protected:
  HVReportingBackEndsTest() {
    createAndStart(client_, 7);
    forgetSteps();
  }
  ~HVReportingBackEndsTest() override { platform_.dispatch.clear(); }

  void sendOf(AudioEventType type, const platform::Value& ids, const Dictionary& message) {
    call(client_, "sendMessage",
         {message, kCategory, static_cast<std::uint16_t>(type), ids.array()});
  }
  void sendToSeven(AudioEventType type, const Dictionary& message) {
    const std::vector<platform::Value> lists{platform::Array{7}};
    sendOf(type, platform::Array(lists), message);
  }
  void sendToActive(AudioEventType type, const Dictionary& message) {
    sendOf(type, platform::Array{}, message);
  }
  // What reached the back-ends and the session, in order. The session's trace point stands for the
  // session.
  std::vector<std::string> deliveries() const {
    std::vector<std::string> texts;
    for (const JournalEntry& entry : platform_.journal.entries(
             {JournalKind::kAnalyticsEvent, JournalKind::kPowerEvent, JournalKind::kMetric,
              JournalKind::kSnapshotRequest, JournalKind::kTracePoint})) {
      texts.push_back(entry.text);
    }
    return texts;
  }

  Connection client_ = connect(100);
  const Dictionary issue_{{"issue_type", "glitch"},
                          {"rtaid_client", "x"},
                          {"node", "mixer"},
                          {"any_channel_silence_seconds", 12}};
  const Dictionary engine_{{"EngineOnTime", 4.5}};
  const Dictionary leak_{{"Haptic_Active_Hardware_Time_Seconds", 30}};
};

constexpr const char* kRequest = "0x21044824";
constexpr const char* kSessionMessage = "0x21044838";
constexpr const char* kMetric = "5963779";

TEST_F(HVReportingBackEndsTest, AnIssueForANamedSessionIsPostedAfterAnalyticsBeforeTheSession) {
  sendToSeven(AudioEventType::kIssueDetector, issue_);

  EXPECT_THAT(deliveries(),
              ElementsAre(kRequest, "com.tarno.halvox.Playback.IssueDetector",
                          "com.tarno.unknown.Playback.IssueDetector", kMetric, kSessionMessage));
}

TEST_F(HVReportingBackEndsTest, AnIssueForActiveSessionsIsPostedAfterTheSessionAndAnalytics) {
  sendToActive(AudioEventType::kIssueDetector, issue_);

  EXPECT_THAT(deliveries(),
              ElementsAre(kRequest, kSessionMessage, "com.tarno.halvox.Playback.IssueDetector",
                          "com.tarno.unknown.Playback.IssueDetector", kMetric));
}

TEST_F(HVReportingBackEndsTest, AnEngineReportForANamedSessionIsLoggedBeforeTheSession) {
  sendToSeven(AudioEventType::kJoulebook, engine_);

  EXPECT_THAT(deliveries(), ElementsAre(kRequest, "com.tarno.halvox.Playback.Joulebook",
                                        "com.tarno.unknown.Playback.Joulebook", "Oxbow_Haptics",
                                        kSessionMessage));
}

TEST_F(HVReportingBackEndsTest, AnEngineReportForActiveSessionsIsLoggedAfterTheSession) {
  sendToActive(AudioEventType::kJoulebook, engine_);

  EXPECT_THAT(deliveries(),
              ElementsAre(kRequest, kSessionMessage, "com.tarno.halvox.Playback.Joulebook",
                          "com.tarno.unknown.Playback.Joulebook", "Oxbow_Haptics"));
}

TEST_F(HVReportingBackEndsTest, EachNamedSessionIsPassedSeparately) {
  createAndStart(client_, 8);
  const std::vector<platform::Value> lists{platform::Array{7, 8, 7, 99}};

  sendOf(AudioEventType::kIssueDetector, platform::Array(lists), issue_);
  sendOf(AudioEventType::kJoulebook, platform::Array(lists), leak_);

  EXPECT_EQ(platform_.metrics.metrics().size(), 3U);
  EXPECT_EQ(platform_.powerLog.events().size(), 3U);
}

TEST_F(HVReportingBackEndsTest, TheEngineReportHasTheStampOfItsArrival) {
  platform_.clock.setCurrentDate({1000.25});

  sendToSeven(AudioEventType::kJoulebook, engine_);

  ASSERT_EQ(platform_.powerLog.events().size(), 1U);
  EXPECT_EQ(*platform_.powerLog.events()[0].payload.find("TimestampEnd"), platform::Value(1000.25));
}

TEST_F(HVReportingBackEndsTest, AStandaloneIssueIsPostedOnceWithWhatTheClientSent) {
  stop(client_, 7);
  forgetSteps();

  sendToActive(AudioEventType::kIssueDetector, issue_);

  const auto metrics = platform_.metrics.metrics();
  ASSERT_EQ(metrics.size(), 1U);
  platform::ProtoReader reader(metrics[0].bytes);
  zubmetrics::AudioIssueDetected posted;
  ASSERT_TRUE(posted.readFrom(reader));
  EXPECT_EQ(posted.issueType() + posted.node() + posted.rtaidClient(), "glitchmixerx");
  EXPECT_EQ(posted.duration(), 12);
  EXPECT_EQ(platform_.analytics.sentNames().size(), 2U);
}

TEST_F(HVReportingBackEndsTest, AStandaloneEngineReportIsLoggedOnceForAnUnknownApplication) {
  stop(client_, 7);
  forgetSteps();

  sendToActive(AudioEventType::kJoulebook, engine_);

  ASSERT_EQ(platform_.powerLog.events().size(), 1U);
  EXPECT_EQ(*platform_.powerLog.events()[0].payload.find("ApplicationName"),
            platform::Value("Unknown"));
}

TEST_F(HVReportingBackEndsTest, OrdinaryMessagesReachAnalyticsAndTheSessionOnly) {
  sendToSeven(AudioEventType::kStart, issue_);

  EXPECT_THAT(deliveries(), ElementsAre(kRequest, "com.tarno.halvox.Playback.Start",
                                        "com.tarno.unknown.Playback.Start", kSessionMessage));
}

TEST_F(HVReportingBackEndsTest, WhileDisabledNothingReachesABackEnd) {
  delegate_->setReportingEnabled(false);

  sendToSeven(AudioEventType::kIssueDetector, issue_);
  sendToActive(AudioEventType::kJoulebook, engine_);

  EXPECT_THAT(deliveries(), ElementsAre(kRequest, kRequest));
}

TEST_F(HVReportingBackEndsTest, OnAnOrdinaryBuildLeaksBringNoSnapshot) {
  for (int seconds = 0; seconds < 10; ++seconds) {
    sendToSeven(AudioEventType::kJoulebook, {{"Haptic_Active_Hardware_Time_Seconds", seconds}});
  }

  EXPECT_EQ(delegate_->vekStateManager(), nullptr);
  EXPECT_EQ(platform_.diagnosticReporters.reportersMade(), 0U);
  EXPECT_EQ(platform_.powerLog.events().size(), 10U);
}

}  // namespace
}  // namespace halvox
