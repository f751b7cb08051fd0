#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegateProtocol.h"
#include "service/ReportingQueue.h"

namespace halvox {
namespace {

using platform::Dictionary;
using testing::ElementsAre;

// A service without sessions that keeps what it is handed for the bug capture. The session of a
// message that belongs to none is seen here and nowhere else.
class KeepingDelegate final : public HVReportingServiceDelegateProtocol {
 public:
  [[nodiscard]] const Dictionary& getDefaults() const override { return defaults_; }
  [[nodiscard]] platform::Message getFeaturesState() const override { return std::nullopt; }
  [[nodiscard]] const Clients& getAllClients() const override { return clients_; }
  [[nodiscard]] bool isReportingEnabled() const override { return true; }
  [[nodiscard]] Sessions getAllActiveReportingSessions() const override { return {}; }
  [[nodiscard]] std::shared_ptr<HVReportingSession> findReportingSessionForID(
      ReporterID /*reporterID*/) const override {
    return nullptr;
  }
  void removeClient(const HVReportingClientServerInstance& /*client*/) override {}
  [[nodiscard]] std::int64_t activeSessionCount() const override { return 0; }
  void setActiveSessionCount(std::int64_t /*count*/) override {}
  [[nodiscard]] DriverSnapShot getSnapShot() const override { return {}; }
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& /*session*/) override {}
  void handleEventForVEK(const platform::Message& /*message*/, AudioEventCategory /*category*/,
                         AudioEventType /*type*/,
                         const std::shared_ptr<HVReportingSession>& session,
                         std::string_view /*processName*/) override {
    sessions.push_back(session);
  }
  void noteSessionChange(const HVReportingClientServerInstance& /*client*/,
                         const std::shared_ptr<HVReportingSession>& /*session*/,
                         SessionChange /*change*/) override {}

  Sessions sessions;

 private:
  const Dictionary defaults_;
  const Clients clients_;
};

class HVReportingStandaloneSessionTest : public testing::Test {
 protected:
  HVReportingStandaloneSessionTest() { createReportingQueue(); }
  ~HVReportingStandaloneSessionTest() override { platform_.dispatch.clear(); }

  void sendToNobody() {
    client_->sendMessage(Dictionary{{"a", 1}}, AudioEventCategory::kPlayback,
                         AudioEventType::kStart, std::nullopt, [](const auto& /*error*/) {});
    platform_.dispatch.runUntilIdle();
  }

  platform::FakePlatform platform_;
  std::shared_ptr<KeepingDelegate> delegate_ = std::make_shared<KeepingDelegate>();
  std::shared_ptr<HVReportingClientServerInstance> client_ =
      std::make_shared<HVReportingClientServerInstance>(100, delegate_);
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
