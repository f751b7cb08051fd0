#pragma once

#include <memory>
#include <string_view>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegateProtocol.h"
#include "service/ReportingQueue.h"

namespace halvox {

// A service without other clients. Tests override the operations that they observe.
class TestDelegate : public HVReportingServiceDelegateProtocol {
 public:
  [[nodiscard]] const platform::Dictionary& getDefaults() const override { return defaults_; }
  [[nodiscard]] platform::Message getFeaturesState() const override { return std::nullopt; }
  [[nodiscard]] const Clients& getAllClients() const override { return clients; }
  [[nodiscard]] bool isReportingEnabled() const override { return true; }
  [[nodiscard]] Sessions getAllActiveReportingSessions() const override { return {}; }
  [[nodiscard]] std::shared_ptr<HVReportingSession> findReportingSessionForID(
      ReporterID /*reporterID*/) const override {
    return nullptr;
  }
  void removeClient(const HVReportingClientServerInstance& /*client*/) override {}
  [[nodiscard]] std::int64_t activeSessionCount() const override { return count_; }
  void setActiveSessionCount(std::int64_t count) override { count_ = count; }
  [[nodiscard]] DriverSnapShot getSnapShot() const override { return {}; }
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& /*session*/) override {}
  void handleEventForVEK(const platform::Message& /*message*/, AudioEventCategory /*category*/,
                         AudioEventType /*type*/,
                         const std::shared_ptr<HVReportingSession>& /*session*/,
                         std::optional<std::string_view> /*processName*/) override {}
  void noteSessionChange(const HVReportingClientServerInstance& /*client*/,
                         const std::shared_ptr<HVReportingSession>& /*session*/,
                         SessionChange /*change*/) override {}

  Clients clients;

 private:
  const platform::Dictionary defaults_{};
  std::int64_t count_ = 0;
};

// A client object of a service on fakes. Jobs of the reporting queue run when run() is called.
template <typename Delegate>
class DelegateFixture : public testing::Test {
 protected:
  DelegateFixture() { createReportingQueue(); }
  ~DelegateFixture() override { platform_.dispatch.clear(); }

  void run() { platform_.dispatch.runUntilIdle(); }

  platform::FakePlatform platform_;
  std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
  std::shared_ptr<HVReportingClientServerInstance> client_ =
      std::make_shared<HVReportingClientServerInstance>(
          100, delegate_, ServiceCounters::make(platform_.statistics));
};

}  // namespace halvox
