#include "service/DelegateTest.h"

namespace halvox {
namespace {

using platform::Dictionary;
using testing::ElementsAre;

// Keeps the sessions whose messages it is handed for the bug capture. The session of a message that
// belongs to none is seen here and nowhere else.
class KeepingDelegate final : public TestDelegate {
 public:
  void handleEventForVEK(const platform::Message& /*message*/, AudioEventCategory /*category*/,
                         AudioEventType /*type*/,
                         const std::shared_ptr<HVReportingSession>& session,
                         std::string_view /*processName*/) override {
    sessions.push_back(session);
  }

  Sessions sessions;
};

class HVReportingStandaloneSessionTest : public DelegateTest<KeepingDelegate> {
 protected:
  void sendToNobody() {
    client_->sendMessage(Dictionary{{"a", 1}}, AudioEventCategory::kPlayback,
                         AudioEventType::kStart, std::nullopt, [](const auto& /*error*/) {});
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

TEST_F(HVReportingStandaloneSessionTest, IsMadeAnewForEachMessage) {
  sendToNobody();
  sendToNobody();

  ASSERT_EQ(delegate_->sessions.size(), 2U);
  EXPECT_NE(delegate_->sessions[0], delegate_->sessions[1]);
}

}  // namespace
}  // namespace halvox
