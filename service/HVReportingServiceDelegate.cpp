#include "service/HVReportingServiceDelegate.h"

#include <algorithm>
#include <cmath>
#include <string>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "backends/PrivacyFilter.h"
#include "platform/analytics.h"
#include "platform/clock.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceProtocol.h"
#include "service/ReportingQueue.h"
#include "service/ServiceLog.h"
#include "session/SessionLog.h"

namespace halvox {
namespace {

using WeakClient = std::weak_ptr<HVReportingClientServerInstance>;

constexpr std::string_view kUptimeEvent = "com.tarno.halvox.hvreportingclientuptime";
// Reported for a client that was never registered. An integer, while known uptimes are doubles;
// this is required.
constexpr std::int64_t kUnknownUptime = -1;

void handleConnectionError(const WeakClient& weakClient) {
  if (const auto client = weakClient.lock()) client->handleConnectionError();
}

// How long a client was registered, in seconds, or kUnknownUptime. Never negative, although the
// wall clock may have been set back meanwhile.
platform::Value clientUptime(const std::optional<platform::Date>& start, platform::ProcessID pid,
                             const std::string& shownName) {
  const platform::Date now = platform::clock().currentDate();
  if (!start.has_value()) {
    kServiceLog.notice("clientStartDate is nil. clientpid=", pid, " clientprocessname=", shownName);
    return kUnknownUptime;
  }
  if (start->secondsSince1970 > now.secondsSince1970) {
    // The date lies in the future, although the line says the opposite. The wording is part of the
    // interface: tools match it.
    kServiceLog.notice("clientStartDate is in the past. clientpid=", pid,
                       " clientprocessname=", shownName);
  }
  return std::abs(now.secondsSince1970 - start->secondsSince1970);
}

void sendUptimeEvent(const std::string& processName, const platform::Value& uptime) {
  platform::analytics().sendAnalyticsEventLazy(kUptimeEvent, [processName, uptime] {
    platform::Dictionary event{{"processName", processName}, {"seconds", uptime}};
    applyPrivacy(event);
    return event;
  });
}

// The connection has ended and will not return. Runs on the connection's thread, and therefore
// reads only the thread-safe properties of the client.
void handleInvalidation(const WeakClient& weakClient, platform::ProcessID pid) {
  handleConnectionError(weakClient);
  const auto client = weakClient.lock();
  const auto start = client == nullptr ? std::nullopt : client->clientStartDate();
  const auto name = client == nullptr ? std::nullopt : client->clientProcessName();
  const std::string shownName = name.value_or("unknown");
  const platform::Value uptime = clientUptime(start, pid, shownName);
  // The line has whole seconds, the event below has fractions.
  kServiceLog.notice("invalidationHandler: connection exited process=", shownName,
                     " uptime_sec=", uptime.toInt64());
  if (name.has_value()) {
    sendUptimeEvent(*name, uptime);
  } else {
    kServiceLog.notice("clientProcessName is nil. clientpid=", pid);
  }
}

void handleInterruption(const WeakClient& weakClient) {
  kServiceLog.notice("interruptionHandler: connection exited");
  handleConnectionError(weakClient);
}

std::vector<std::shared_ptr<HVReportingSession>> sessionsOf(
    const HVReportingClientServerInstance& client) {
  std::vector<std::shared_ptr<HVReportingSession>> sessions;
  sessions.reserve(client.clientReportingSessionMap().size());
  for (const auto& [id, session] : client.clientReportingSessionMap()) sessions.push_back(session);
  return sessions;
}

}  // namespace

// This order is required. The queue exists first, because notifications are delivered on it. The
// drivers are subscribed to here, before any client can connect, and never again.
HVReportingServiceDelegate::HVReportingServiceDelegate()
    : counters_(ServiceCounters::make(platform::statistics())),
      defaults_((createReportingQueue(), HVReportingDefaults())),
      features_(makeFeatures()) {
  listenForFeatureStateChanges();
  driverUtility_ = std::make_unique<HVReportingDriverUtility>();
  offerState();
  if (HVReportingUtilityIsInternalBuild()) {
    vekStateManager_ = std::make_unique<HVReportingUtilityVEKStateManager>(platform::statistics());
  }
}

bool HVReportingServiceDelegate::listenerShouldAcceptNewConnection(
    const std::shared_ptr<platform::NSXPCConnection>& connection) {
  const platform::ProcessID pid = connection->processIdentifier();
  kServiceLog.notice("newConnection: ", connection->description());
  // The registration is queued before the connection is resumed. The queue is serial, and therefore
  // the client's first request finds the client registered. Everything here holds the client
  // weakly, so that the connection alone keeps it until the registration.
  const WeakClient weakClient = exportClient(*connection);
  reportingQueue()->async(platform::JobWeight::kBrief, [delegate = shared_from_this(), weakClient] {
    if (const Client client = weakClient.lock()) {
      delegate->registerClient(client);
    }
  });
  connection->setInterruptionHandler([weakClient] { handleInterruption(weakClient); });
  connection->setInvalidationHandler([weakClient, pid] { handleInvalidation(weakClient, pid); });
  connection->resume();
  return true;
}

HVReportingServiceDelegate::Client HVReportingServiceDelegate::exportClient(
    platform::NSXPCConnection& connection) {
  const std::lock_guard held(lock_);
  connection.setExportedInterface(HVReportingServiceInterface());
  auto client = std::make_shared<HVReportingClientServerInstance>(connection.processIdentifier(),
                                                                  weak_from_this(), counters_);
  connection.setExportedObject(client);
  return client;
}

void HVReportingServiceDelegate::registerClient(const Client& client) {
  clients_.push_back(client);
  index_.addClient(*client);
  client->setClientStartDate(platform::clock().currentDate());
  client->setClientProcessName(HVReportingUtilityProcessNameForPID(client->processIdentifier()));
}

DriverSnapShot HVReportingServiceDelegate::getSnapShot() const {
  return driverUtility_->getSnapShot();
}

void HVReportingServiceDelegate::sendDriverLogsForSession(
    const std::shared_ptr<HVReportingSession>& session) {
  driverUtility_->sendDriverLogsForSession(session);
}

void HVReportingServiceDelegate::setReportingEnabled(bool enabled) {
  reportingEnabled_.store(enabled, std::memory_order_relaxed);
}

bool HVReportingServiceDelegate::isReportingEnabled() const {
  return reportingEnabled_.load(std::memory_order_relaxed);
}

HVReportingServiceDelegateProtocol::Sessions
HVReportingServiceDelegate::getAllActiveReportingSessions() const {
  // The walk over all clients serves only the log lines. The index has the same sessions in the
  // same order.
  if (!HVReportingServiceDelegateCategory().isEnabled(platform::LogLevel::kDefault)) {
    return index_.activeSessions();
  }
  Sessions active;
  for (const Client& client : clients_) {
    const Sessions all = sessionsOf(*client);
    kServiceLog.notice("sessions for client ", client->processIdentifier(), " : ",
                       sessionsDescription(all));
    index_.appendActiveSessions(*client, active);
  }
  return active;
}

std::shared_ptr<HVReportingSession> HVReportingServiceDelegate::findReportingSessionForID(
    ReporterID reporterID) const {
  const std::lock_guard held(lock_);
  if (reporterID == kNoReporterID || !isReportingEnabled()) return nullptr;
  const SessionIndex::Found found = index_.find(reporterID);
  if (found.session == nullptr) {
    kServiceLog.error("failed to find reporting session ", number(reporterID));
    return nullptr;
  }
  kServiceLog.info("found reporting session ", number(reporterID), " for client ",
                   found.client->processIdentifier());
  return found.session;
}

void HVReportingServiceDelegate::removeClient(const HVReportingClientServerInstance& client) {
  // The index is updated first, because erasing the client from the list may release it.
  index_.removeClient(client, sessionsOf(client));
  std::erase_if(clients_, [&client](const Client& one) { return one.get() == &client; });
}

std::int64_t HVReportingServiceDelegate::activeSessionCount() const {
  return activeSessionCount_.load(std::memory_order_relaxed);
}

void HVReportingServiceDelegate::setActiveSessionCount(std::int64_t count) {
  activeSessionCount_.store(count, std::memory_order_relaxed);
}

void HVReportingServiceDelegate::noteSessionChange(
    const HVReportingClientServerInstance& client,
    const std::shared_ptr<HVReportingSession>& session, SessionChange change) {
  index_.noteChange(client, session, change);
}

void HVReportingServiceDelegate::handleEventForVEK(
    const platform::Message& message, AudioEventCategory category, AudioEventType type,
    const std::shared_ptr<HVReportingSession>& session,
    std::optional<std::string_view> processName) {
  if (!HVReportingUtilityIsInternalBuild()) return;
  // `vekStateManager_` is not null here, because the answer about internal builds never changes
  // within a process.
  vekStateManager_->handleEvent(message, category, type, session, processName);
}

}  // namespace halvox
