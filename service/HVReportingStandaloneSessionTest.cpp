#include "service/DelegateFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalKind;
using testing::ElementsAre;

// Keeps the sessions whose messages are passed to the bug capture. This is the only place where a
// test can see the temporary session of a standalone message.
class KeepingDelegate final : public TestDelegate {
 public:
  void handleEventForVEK(const platform::Message& message, AudioEventCategory /*category*/,
                         AudioEventType /*type*/,
                         const std::shared_ptr<HVReportingSession>& session,
                         std::optional<std::string_view> /*processName*/) override {
    if (journal != nullptr) journal->note("bug capture");
    messages.push_back(message);
    sessions.push_back(session);
  }

  platform::Journal* journal = nullptr;  // the test's
  std::vector<platform::Message> messages;
  Sessions sessions;
};

class HVReportingStandaloneSessionTest : public DelegateFixture<KeepingDelegate> {
 protected:
  void sendToNobody(const platform::Message& message = Dictionary{{"a", 1}},
                    AudioEventType type = AudioEventType::kStart) {
    client_->sendMessage(message, AudioEventCategory::kPlayback, type, std::nullopt,
                         [](const auto& /*error*/) {}, {});
    run();
  }
};

TEST_F(HVReportingStandaloneSessionTest, IsOwnedByTheServiceAndOfAnUnknownApplication) {
  sendToNobody();

  ASSERT_EQ(delegate_->sessions.size(), 1U);
  const HVReportingSession& session = *delegate_->sessions[0];
  EXPECT_EQ(session.reporterID(), ReporterID{1});
  EXPECT_THAT(session.processIdentifiers(), ElementsAre(platform::FakeProcessService::kOwnPID));
  EXPECT_EQ(session.serviceType(), AudioServiceType::kStandalone);
  EXPECT_EQ(session.configuration(), (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
  EXPECT_FALSE(session.started());
  EXPECT_FALSE(session.tlmReportingEnabled());
}

TEST_F(HVReportingStandaloneSessionTest, BackEndsComeInTheirOrderTheBugCaptureLast) {
  delegate_->journal = &platform_.journal;
  const auto steps = [this](const Dictionary& message, AudioEventType type) {
    platform_.journal.clear();
    sendToNobody(message, type);
    std::vector<std::string> texts;
    for (const auto& entry :
         platform_.journal.entries({JournalKind::kAnalyticsEvent, JournalKind::kPowerEvent,
                                    JournalKind::kMetric, JournalKind::kNote})) {
      texts.push_back(entry.text);
    }
    return texts;
  };

  EXPECT_THAT(
      steps({{"EngineOnTime", 1}}, AudioEventType::kJoulebook),
      ElementsAre("com.tarno.halvox.Playback.Joulebook", "com.tarno.standalone.Playback.Joulebook",
                  "Oxbow_Haptics", "bug capture"));
  EXPECT_THAT(steps({{"node", "mixer"}}, AudioEventType::kIssueDetector),
              ElementsAre("com.tarno.halvox.Playback.IssueDetector",
                          "com.tarno.standalone.Playback.IssueDetector", "5963779", "bug capture"));
}

TEST_F(HVReportingStandaloneSessionTest, ANullMessageGetsNoStamps) {
  sendToNobody(std::nullopt);

  EXPECT_THAT(delegate_->messages, ElementsAre(std::nullopt));
}

TEST_F(HVReportingStandaloneSessionTest, IsCreatedForEachMessage) {
  sendToNobody();
  sendToNobody();

  ASSERT_EQ(delegate_->sessions.size(), 2U);
  EXPECT_NE(delegate_->sessions[0], delegate_->sessions[1]);
}

}  // namespace
}  // namespace halvox
