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
#include "service/ServiceCounters.h"
#include "service/SessionIndex.h"

namespace halvox {

// The notification that announces a change of the service's own settings.
inline constexpr std::string_view gReportingNotifydNotificationName = "com.tarno.halvox.reporting";

// The centre of the service: accepts every connection, owns the list of clients, and gives client
// objects access to what they share. There is one in a process. Its construction creates the
// reporting queue, reads the defaults and registers for changes of the watched settings.
//
// Connections are accepted on their own threads; everything about clients runs on the reporting
// queue. main.cpp owns it for the life of the process, always by a shared pointer; clients refer to
// it weakly. No connection is ever refused and no operation fails.
class HVReportingServiceDelegate final
    : public platform::NSXPCListenerDelegate,
      public HVReportingServiceDelegateProtocol,
      public std::enable_shared_from_this<HVReportingServiceDelegate> {
 public:
  // One descriptor for each watched setting: its domain, its key, and the notification that
  // announces its changes.
  using Features = std::vector<platform::Dictionary>;

  HVReportingServiceDelegate();
  HVReportingServiceDelegate(const HVReportingServiceDelegate&) = delete;
  HVReportingServiceDelegate& operator=(const HVReportingServiceDelegate&) = delete;
  ~HVReportingServiceDelegate() override = default;

  // Exports a new client object on the connection and queues its registration before the connection
  // can deliver a request. Always returns true.
  bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<platform::NSXPCConnection>& connection) override;

  // The master switch. Enabled from the beginning; only tests disable it.
  void setReportingEnabled(bool enabled);

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

  // Makes describeState() available to captures of diagnostics.
  void offerState();
  // Describes the clients and their sessions, up to a bound. Reporting queue only.
  [[nodiscard]] platform::Dictionary describeState() const;
  // Makes the client object of a connection, not registered yet.
  Client exportClient(platform::NSXPCConnection& connection);
  // Adds the client to the list, and stores the time and its process's name. Reporting queue only.
  void registerClient(const Client& client);

  // Reads the defaults. Called once, by the constructor. Reads files.
  static platform::Dictionary HVReportingDefaults();
  static Features makeFeatures();
  // Registers for each feature and stores its token. A failed registration is only logged.
  void listenForFeatureStateChanges();
  // Sends the state of the features to every session of every client. Reporting queue only.
  void handleFeatureChange(platform::NotifyToken token);

  // Held while a connection is prepared and while a session is looked up across clients, and
  // nowhere else. It guards no data, because the list of clients and the index belong to the
  // reporting queue. A recursive lock is required here nevertheless.
  mutable std::recursive_mutex lock_;
  Clients clients_;     // reporting queue only
  SessionIndex index_;  // reporting queue only
  // Each is read on its own; they order nothing else.
  std::atomic<bool> reportingEnabled_{true};
  std::atomic<std::int64_t> activeSessionCount_{0};
  const std::shared_ptr<const ServiceCounters> counters_;  // shared with the clients
  const platform::Dictionary defaults_;
  Features features_;  // does not change after construction
  std::unique_ptr<const HVReportingDriverUtility> driverUtility_;
  // Null on builds that are not internal. Reporting queue only.
  std::unique_ptr<HVReportingUtilityVEKStateManager> vekStateManager_;
  // Expires with this object. Handlers that refer to this object stay registered for the life of
  // the process, and check first whether this pointer has expired.
  const std::shared_ptr<const bool> alive_ = std::make_shared<bool>(true);
};

}  // namespace halvox
