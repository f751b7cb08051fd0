#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string_view>
#include <vector>

#include "backends/HVReportingUtilityVEKStateManager.h"
#include "driver/HVReportingDriverUtility.h"
#include "platform/connection.h"
#include "platform/notify.h"
#include "platform/process.h"
#include "platform/value.h"
#include "service/HVReportingServiceDelegateProtocol.h"
#include "service/SessionIndex.h"

namespace halvox {

// The notification by which somebody announces that the service's own settings have changed.
inline constexpr std::string_view gReportingNotifydNotificationName = "com.tarno.halvox.reporting";

// The centre of the service: accepts every connection, keeps the list of clients, and answers what
// client objects ask of the whole. One a process; making it makes the reporting queue,
// reads the defaults and registers for changes of the watched settings.
//
// Connections come on their own threads, everything about clients runs on the reporting queue. Held
// by whoever made it, always by a shared pointer, for the life of the process; clients refer to it
// weakly. No connection is ever refused and nothing here fails.
class HVReportingServiceDelegate final
    : public platform::NSXPCListenerDelegate,
      public HVReportingServiceDelegateProtocol,
      public std::enable_shared_from_this<HVReportingServiceDelegate> {
 public:
  // One dictionary a watched setting: where it is, and which notification tells of its changes.
  using Features = std::vector<platform::Dictionary>;

  HVReportingServiceDelegate();
  HVReportingServiceDelegate(const HVReportingServiceDelegate&) = delete;
  HVReportingServiceDelegate& operator=(const HVReportingServiceDelegate&) = delete;
  ~HVReportingServiceDelegate() override = default;

  // Exports a new client object on the connection and queues its registration, so that it comes
  // before all of the client's requests. Always true.
  bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<platform::NSXPCConnection>& connection) override;

  // The master switch. On from the beginning; nothing in the service turns it off.
  void setReportingEnabled(bool enabled);

  // The descriptors of the watched settings.
  [[nodiscard]] const Features& features() const { return features_; }

  [[nodiscard]] const platform::Dictionary& getDefaults() const override { return defaults_; }
  [[nodiscard]] platform::Message getFeaturesState() const override;
  [[nodiscard]] const Clients& getAllClients() const override { return clients_; }
  [[nodiscard]] bool isReportingEnabled() const override;
  [[nodiscard]] Sessions getAllActiveReportingSessions() const override;
  [[nodiscard]] std::shared_ptr<HVReportingSession> findReportingSessionForID(
      ReporterID reporterID) const override;
  void removeClient(const HVReportingClientServerInstance& client) override;
  [[nodiscard]] std::int64_t activeSessionCount() const override;
  void setActiveSessionCount(std::int64_t count) override;
  void noteSessionChange(const HVReportingClientServerInstance& client,
                         const std::shared_ptr<HVReportingSession>& session,
                         SessionChange change) override;
  [[nodiscard]] DriverSnapShot getSnapShot() const override;
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& session) override;
  void handleEventForVEK(const platform::Message& message, AudioEventCategory category,
                         AudioEventType type, const std::shared_ptr<HVReportingSession>& session,
                         std::optional<std::string_view> processName) override;

  // Null on builds that are not internal.
  [[nodiscard]] HVReportingUtilityVEKStateManager* vekStateManager() const {
    return vekStateManager_.get();
  }

 private:
  using Client = std::shared_ptr<HVReportingClientServerInstance>;

  // Lets captures of diagnostics ask for what describeState() gives.
  void offerState();
  // All clients and their sessions, as far as there are not too many. On the reporting queue.
  [[nodiscard]] platform::Dictionary describeState() const;
  Client exportClient(platform::NSXPCConnection& connection);
  void registerClient(const Client& client);

  // The settings that are read once, at the start. Reads files.
  static platform::Dictionary HVReportingDefaults();
  static Features makeFeatures();
  // Registers for each feature and notes its token. A registration that fails is logged only.
  void listenForFeatureStateChanges();
  // Sends the state of the features to every session of every client. On the reporting queue.
  void handleFeatureChange(platform::NotifyToken token);

  // Taken while a connection is prepared and while a session is looked up across clients.
  mutable std::recursive_mutex lock_;
  Clients clients_;     // reporting queue only
  SessionIndex index_;  // reporting queue only
  // Single values that order with nothing.
  std::atomic<bool> reportingEnabled_{true};
  std::atomic<std::int64_t> activeSessionCount_{0};
  const platform::Dictionary defaults_;
  Features features_;  // never changes once made
  std::unique_ptr<const HVReportingDriverUtility> driverUtility_;
  // Takes events on the reporting queue only.
  std::unique_ptr<HVReportingUtilityVEKStateManager> vekStateManager_;
  // Ends with this object; those whom it gave handlers that refer to it look here first.
  const std::shared_ptr<const bool> alive_ = std::make_shared<bool>(true);
};

}  // namespace halvox
